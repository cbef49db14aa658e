import type { SortColumn } from '../model/address.ts';

// In the order they are shown. Sizes and times sort with the most first when first asked for.
export const COLUMNS: { column: SortColumn; title: string; mostFirst?: boolean }[] = [
  { column: 'name', title: 'Name' },
  { column: 'path', title: 'Folder' },
  { column: 'type', title: 'Type' },
  { column: 'size', title: 'Size', mostFirst: true },
  { column: 'mtime', title: 'Modified', mostFirst: true },
];
