// The way through the browser's history: each of its entries belongs to a search, which may have a
// second one, with details beside the table. What was seen is kept for the way back, the search with
// it, so that the same rows stand at the same place at once; some searches back, and when the page
// is left, they are cleaned and the address alone tells what to repeat.
import type { FileRow } from '../api/types.ts';
import type { Search } from './search.ts';

// What an entry of the browser's history carries.
export interface Step {
  entry: number; // which search; 0: none
  details?: boolean;
  // Where the table last stood.
  active?: number;
  above?: number;
}

export interface Seen {
  search: Search;
  active: number;
  detailed: FileRow | null;
}

// Each keeps a result on the server.
const MOST_KEPT = 4;

export class Trail {
  entry = -1; // of what is shown; -1: of none yet
  private readonly kept = new Map<number, Seen>(); // the oldest first

  // The browser's present entry; null where it was made by hand or elsewhere.
  get step(): Step | null {
    return history.state as Step | null;
  }

  // For a search that begins; unlike those of a life of the page before this one.
  begin(): Step {
    this.entry = Math.max(this.entry + 1, Date.now());
    return { entry: this.entry };
  }

  leave(seen: Seen): void {
    this.kept.delete(this.entry);
    this.kept.set(this.entry, seen);
    for (const [entry, { search }] of this.kept) {
      if (this.kept.size <= MOST_KEPT) break;
      search.close();
      this.kept.delete(entry);
    }
  }

  // What was left at that entry, which is shown from now on.
  back(entry: number): Seen | undefined {
    this.entry = entry;
    const seen = this.kept.get(entry);
    this.kept.delete(entry);
    return seen;
  }

  // Keeps nothing; every entry is begun anew.
  close(): void {
    for (const { search } of this.kept.values()) search.close();
    this.kept.clear();
    this.entry = -1;
  }
}
