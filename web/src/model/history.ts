// Remembered searches: what the server keeps about them, turned back into criteria.
import type { HistoryRecord } from '../api/types.ts';
import { describeTime, customValue } from './times.ts';
import { formatSize } from './size.ts';
import { KINDS, NO_CRITERIA, type Criteria } from './criteria.ts';

// Null for a record that cannot be repeated. Owner and group are kept by the server as ids, which a
// search does not take: such a search would silently find more than it did.
export function fromRecord(record: HistoryRecord, everywhere: string[]): Criteria | null {
  if (typeof record.pattern !== 'string' || record.pattern === '') return null;
  if (record.owner !== undefined || record.group !== undefined) return null;
  const folders = foldersOf(record.folder_path);
  const all = folders.length > 0 && everywhere.length > 0 && sameSet(folders, everywhere);
  return {
    ...NO_CRITERIA,
    pattern: record.pattern,
    folders: all ? [] : folders,
    kind: KINDS.some(([kind]) => kind === record.filetype) ? String(record.filetype) : '',
    extension: typeof record.extension === 'string' ? record.extension : '',
    sizeFrom: sizeText(record.size_from),
    sizeTo: sizeText(record.size_to),
    modified: customValue(number(record.mtime_from), number(record.mtime_to)),
    created: customValue(number(record.crtime_from), number(record.crtime_to)),
    accessed: customValue(number(record.atime_from), number(record.atime_to)),
    contents: record.search_content === true,
    subfolders: record.recursive !== false,
  };
}

function foldersOf(value: unknown): string[] {
  const list = Array.isArray(value) ? value : typeof value === 'string' ? value.split(',') : [];
  return list.filter((folder): folder is string => typeof folder === 'string' && folder !== '');
}

function sameSet(a: string[], b: string[]): boolean {
  return a.length === b.length && a.every((one) => b.includes(one));
}

function number(value: unknown): number | undefined {
  return typeof value === 'number' ? value : undefined;
}

function sizeText(value: unknown): string {
  return typeof value === 'number' && value >= 0 ? exactSize(value) : '';
}

// The shortest text that reads back as exactly these bytes.
function exactSize(bytes: number): string {
  const units = ['', ' KB', ' MB', ' GB', ' TB'];
  let power = 0;
  while (power + 1 < units.length && bytes > 0 && bytes % 1024 ** (power + 1) === 0) ++power;
  return bytes / 1024 ** power + units[power]!;
}

// "pictures, over 1 MB, last 7 days" : everything but the pattern and the folders.
export function describe(c: Criteria): string[] {
  const parts: string[] = [];
  const kind = KINDS.find(([key]) => key === c.kind);
  if (kind?.[0]) parts.push(kind[1].toLowerCase());
  if (c.extension) parts.push('.' + c.extension.replace(/^[*.]+/, ''));
  if (c.sizeFrom && c.sizeTo) parts.push(`${tidy(c.sizeFrom)} to ${tidy(c.sizeTo)}`);
  else if (c.sizeFrom) parts.push(`at least ${tidy(c.sizeFrom)}`);
  else if (c.sizeTo) parts.push(`at most ${tidy(c.sizeTo)}`);
  if (c.modified) parts.push(`modified ${describeTime(c.modified)}`);
  if (c.created) parts.push(`created ${describeTime(c.created)}`);
  if (c.accessed) parts.push(`opened ${describeTime(c.accessed)}`);
  if (c.owner) parts.push(`owner ${c.owner}`);
  if (c.group) parts.push(`group ${c.group}`);
  if (c.contents) parts.push('also inside files');
  if (!c.subfolders) parts.push('not in subfolders');
  return parts;
}

function tidy(size: string): string {
  return /^\d+$/.test(size.trim()) ? formatSize(Number(size)) : size.trim();
}
