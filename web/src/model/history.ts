// Remembered searches: what the server keeps about them, turned back into criteria.
import type { HistoryKind, HistoryRecord } from '../api/types.ts';
import { criterion, FIELDS, hasCriteria, NO_CRITERIA, OTHER_PARAMS, type Criteria } from './criteria.ts';

const KNOWN = new Set([...OTHER_PARAMS, ...FIELDS.flatMap((field) => criterion(field).params)]);

// Null for a record that cannot be repeated as it was: one that does not tell all that was asked
// for, or holds what this page does not know, would silently find something else.
//
// The server does not remember that contents were asked for. A search of the advanced history that
// shows no criterion had that one; of others `inside` tells, from what this browser has searched.
export function fromRecord(
  record: HistoryRecord,
  kind: HistoryKind,
  everywhere: string[],
  inside: (pattern: string) => boolean,
): Criteria | null {
  if (typeof record.pattern !== 'string' || record.pattern === '') return null;
  if (Object.keys(record).some((name) => !KNOWN.has(name))) return null;
  const folders = foldersOf(record.folder_path);
  const all = folders.length > 0 && everywhere.length > 0 && sameSet(folders, everywhere);
  const criteria: Criteria = { ...NO_CRITERIA, pattern: record.pattern, folders: all ? [] : folders };
  for (const field of FIELDS) {
    const { params, recall } = criterion(field);
    const value = recall(params.map((name) => record[name]));
    if (value === null) return null;
    Object.assign(criteria, { [field]: value });
  }
  if (kind === 'advance' && (!hasCriteria(criteria) || inside(record.pattern))) criteria.contents = true;
  return criteria;
}

// The patterns whose last search with criteria looked inside files, one a line, the newest first: as
// many as the server remembers such searches.
const MOST_INSIDE = 10;

export function lookedInside(patterns: string, pattern: string): boolean {
  return patterns.split('\n').includes(pattern);
}

export function withInside(patterns: string, c: Criteria): string {
  if (!hasCriteria(c) || c.pattern.includes('\n')) return patterns;
  const others = patterns.split('\n').filter((one) => one && one !== c.pattern);
  return (c.contents ? [c.pattern, ...others] : others).slice(0, MOST_INSIDE).join('\n');
}

function foldersOf(value: unknown): string[] {
  const list = Array.isArray(value) ? value : typeof value === 'string' ? value.split(',') : [];
  return list.filter((folder): folder is string => typeof folder === 'string' && folder !== '');
}

function sameSet(a: string[], b: string[]): boolean {
  return a.length === b.length && a.every((one) => b.includes(one));
}
