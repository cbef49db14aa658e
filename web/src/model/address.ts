// The search in the address bar. It stands behind the "#", which is never sent to the server, so
// that what people look for does not end up in the logs of a proxy.
import type { Criteria } from './criteria.ts';
import { fromFields } from './terms.ts';

export const SORT_COLUMNS = ['name', 'path', 'type', 'size', 'mtime', 'crtime', 'user'] as const;
export type SortColumn = (typeof SORT_COLUMNS)[number];

// No sort: as found, which is the order that never moves a row while the search runs.
export interface Sort {
  column: SortColumn;
  descending: boolean;
}

export interface Address {
  criteria: Criteria;
  sort: Sort | null;
}

export function toHash({ criteria, sort }: Address): string {
  const query = new URLSearchParams();
  query.set('q', criteria.pattern);
  for (const folder of criteria.folders) query.append('in', folder);
  if (criteria.contents) query.set('contents', '1');
  if (!criteria.subfolders) query.set('subfolders', '0');
  if (sort) query.set('sort', sortText(sort));
  return '#' + query.toString();
}

// Null when the address holds no search. Parts that cannot be right are left out: an address is
// anyone's to write.
export function fromHash(hash: string): Address | null {
  const query = new URLSearchParams(hash.replace(/^#/, ''));
  if (!query.has('q')) return null;
  const criteria: Criteria = {
    pattern: fromFields(query.get('q') ?? '', (key) => query.get(key) ?? ''),
    folders: query.getAll('in').filter((folder) => /^\/[^/]/.test(folder)),
    contents: query.get('contents') === '1',
    subfolders: query.get('subfolders') !== '0',
  };
  return { criteria, sort: parseSort(query.get('sort')) };
}

export function sortText(sort: Sort | null): string {
  return sort ? (sort.descending ? '-' : '') + sort.column : '';
}

export function parseSort(text: string | null): Sort | null {
  const descending = text?.startsWith('-') ?? false;
  const column = SORT_COLUMNS.find((name) => name === text?.replace(/^-/, ''));
  return column ? { column, descending } : null;
}
