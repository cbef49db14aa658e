// The search in the address bar. It stands behind the "#", which is never sent to the server, so
// that what people look for does not end up in the logs of a proxy.
import { CRITERIA, criterion, FIELDS, NO_CRITERIA, type Criteria } from './criteria.ts';

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
  for (const field of FIELDS) {
    const value = criteria[field];
    if (value !== NO_CRITERIA[field]) query.set(CRITERIA[field].key, textOf(value));
  }
  if (sort) query.set('sort', sortText(sort));
  return '#' + query.toString();
}

// Null when the address holds no search. Parts that cannot be right are left out: an address is
// anyone's to write.
export function fromHash(hash: string): Address | null {
  const query = new URLSearchParams(hash.replace(/^#/, ''));
  if (!query.has('q')) return null;
  const criteria: Criteria = { ...NO_CRITERIA, pattern: query.get('q') ?? '' };
  criteria.folders = query.getAll('in').filter((folder) => /^\/[^/]/.test(folder));
  for (const field of FIELDS) {
    const { key, none, fits } = criterion(field);
    const value = valueOf(query.get(key) ?? '', none);
    if (fits?.(value as string) ?? true) Object.assign(criteria, { [field]: value });
  }
  return { criteria, sort: parseSort(query.get('sort')) };
}

const textOf = (value: string | boolean) => (typeof value === 'string' ? value : value ? '1' : '0');
// A choice is told only by the value that it does not have by itself.
function valueOf(text: string, none: string | boolean): string | boolean {
  if (typeof none === 'string') return text;
  return text === textOf(!none) ? !none : none;
}

export function sortText(sort: Sort | null): string {
  return sort ? (sort.descending ? '-' : '') + sort.column : '';
}

export function parseSort(text: string | null): Sort | null {
  const descending = text?.startsWith('-') ?? false;
  const column = SORT_COLUMNS.find((name) => name === text?.replace(/^-/, ''));
  return column ? { column, descending } : null;
}
