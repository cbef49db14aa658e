// Rows as the table shows them, wherever they come from.
import type { FileRow } from '../api/types.ts';
import type { Sort } from '../model/address.ts';
import type { Choice } from '../model/choice.ts';
import type { Criteria } from '../model/criteria.ts';
import type { Lines } from './lines.ts';
import type { ScrollModel } from '../model/scroll.ts';

export interface Shown {
  readonly criteria: Criteria | null;
  readonly found: number;
  readonly sort: Sort | null;
  readonly over: boolean;
  readonly choice: Choice;
  readonly scroll: ScrollModel; // where its table stands
  readonly lines?: Lines; // of a search inside files
  readonly pages: {
    row(index: number): FileRow | undefined;
    // Which rows are seen.
    show(first: number, last: number): void;
  };
}
