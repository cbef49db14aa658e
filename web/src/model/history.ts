// The searches made before, as the server keeps them for the page: each by its address, which says
// all that was asked for.
import type { PastSearch } from '../api/types.ts';
import { fromHash, toHash } from './address.ts';
import { browses, describe, hasCriteria, type Criteria } from './criteria.ts';

export interface Remembered {
  search: string; // the address
  criteria: Criteria;
  name: string; // of a pinned one; otherwise empty
}

// Under which a search is remembered; empty for what says nothing, such as a folder that was opened.
export function addressOf(criteria: Criteria): string {
  const blank = criteria.pattern.trim() === '' && (browses(criteria) || !hasCriteria(criteria));
  return blank ? '' : toHash({ criteria, sort: null }).slice(1);
}

// The pinned first, then by time. `everywhere`: searches of folders outside these find nothing.
export function offered(past: PastSearch[], everywhere: string[]): Remembered[] {
  const inside = (folder: string) => everywhere.some((top) => folder === top || folder.startsWith(top + '/'));
  const known = past.flatMap(({ search, name = '' }) => {
    const criteria = fromHash('#' + search)?.criteria;
    return criteria?.folders.every(inside) ? [{ search, criteria, name }] : [];
  });
  return [...known.filter(({ name }) => name), ...known.filter(({ name }) => !name)];
}

// What a search is called: by its name, its words, or its criteria.
export function titleOf({ name, criteria }: Remembered): string {
  return name || criteria.pattern.trim() || describe(criteria).join(', ');
}
