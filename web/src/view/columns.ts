// The columns of the table: which there are, which are shown, and how wide they are.
import type { SortColumn } from '../model/address.ts';

export interface Column {
  column: SortColumn;
  title: string;
  width: string; // in the grid
  least: number; // pixels that it needs
  mostFirst?: boolean; // sizes and times sort with the most first when first asked for
}

// In the order they are shown.
export const COLUMNS: readonly Column[] = [
  { column: 'name', title: 'Name', width: 'minmax(11rem, 5fr)', least: 170 },
  { column: 'path', title: 'Folder', width: 'minmax(7rem, 4fr)', least: 110 },
  { column: 'type', title: 'Type', width: '4.4rem', least: 62 },
  { column: 'size', title: 'Size', width: '5.2rem', least: 73, mostFirst: true },
  { column: 'mtime', title: 'Modified', width: '10.4rem', least: 146, mostFirst: true },
  { column: 'crtime', title: 'Created', width: '10.4rem', least: 146, mostFirst: true },
  { column: 'user', title: 'Owner', width: '7rem', least: 98 },
];
export const USUAL: readonly SortColumn[] = ['name', 'path', 'type', 'size', 'mtime'];
// These go first where there is no room for all.
const DISPENSABLE: readonly SortColumn[] = ['type', 'user', 'crtime', 'path', 'mtime'];

// Of what was remembered; the name is always shown.
export function parseColumns(text: string): readonly SortColumn[] {
  const words = text.split(',');
  return text === '' ? USUAL : COLUMNS.map(({ column }) => column).filter((one) => one === 'name' || words.includes(one));
}

// Two lines a row, on a narrow screen, have room for these.
export const STACKED = '(max-width: 700px)';
const IN_STACK: readonly SortColumn[] = ['name', 'path', 'size', 'mtime'];

// What of it fits.
export function fittingColumns(chosen: readonly SortColumn[], width: number): readonly Column[] {
  if (matchMedia(STACKED).matches) return COLUMNS.filter(({ column }) => IN_STACK.includes(column));
  let shown = COLUMNS.filter(({ column }) => chosen.includes(column));
  for (const spare of DISPENSABLE) {
    if (shown.reduce((sum, { least }) => sum + least, 0) <= width) break;
    shown = shown.filter(({ column }) => column !== spare);
  }
  return shown;
}
