// Answers while one types: the best of what an index knows, asked for a short pause after the last
// change. The newest question wins; until it is answered the rows before stay, so that nothing
// flickers. Where no index answers there is nothing to show, and the page waits for Enter.
import * as client from '../api/client.ts';
import { ApiError } from '../api/errors.ts';
import type { FileRow, InstantAnswer } from '../api/types.ts';
import { Choice } from '../model/choice.ts';
import { typed, type Criteria } from '../model/criteria.ts';
import { ScrollModel } from '../model/scroll.ts';

const PAUSE_MS = 60;
// An index that does not answer is not asked again with every letter.
const REST_MS = 5000;

// As listings have it.
function typeOf({ name, is_dir }: { name: string; is_dir: boolean }): string {
  const dot = name.lastIndexOf('.');
  return is_dir || dot <= 0 ? '' : name.slice(dot + 1).toUpperCase();
}

export class Instant {
  criteria: Criteria | null = null; // of the rows; null: there is no answer to show
  rows: FileRow[] = [];
  known = 0; // matches, of which the rows are the best
  complete = true; // whether these are all
  readonly sort = null;
  readonly over = true;
  readonly scroll = new ScrollModel();
  readonly choice = new Choice(() => this.answers);
  private answers = 0;
  readonly pages = { row: (index: number) => this.rows[index], show: () => {} };
  private timer = 0;
  private abort = new AbortController();
  private restingUntil = 0;

  constructor(
    private readonly changed: () => void,
    private readonly signedOut: () => void,
  ) {}

  get found(): number {
    return this.rows.length;
  }

  ask(criteria: Criteria, folders: string[]): void {
    this.cancel();
    if (performance.now() < this.restingUntil) return;
    this.timer = window.setTimeout(() => void this.fetch(criteria, folders), PAUSE_MS);
  }

  // Forgets what was asked and answered.
  drop(): void {
    this.cancel();
    this.criteria = null;
  }

  // The rows stay.
  cancel(): void {
    clearTimeout(this.timer);
    this.abort.abort();
  }

  private take(criteria: Criteria, answer: InstantAnswer): void {
    // What is half typed can be wrong for a moment; Enter tells of it.
    if (answer.wrong) return;
    const current = answer.index === 'current';
    if (!current) this.restingUntil = performance.now() + REST_MS;
    this.criteria = current ? criteria : null;
    ++this.answers;
    this.rows = answer.rows.map(({ mtime, ...row }) => ({
      ...row,
      type: typeOf(row),
      time: { mtime, atime: 0, ctime: 0, crtime: 0 },
    }));
    this.known = answer.found;
    this.complete = !answer.more;
  }

  private async fetch(criteria: Criteria, folders: string[]): Promise<void> {
    this.abort = new AbortController();
    const { signal } = this.abort;
    try {
      const answer = await client.instant({ ...typed(criteria), folder_path: folders }, signal);
      if (signal.aborted) return;
      this.take(criteria, answer);
    } catch (error) {
      if (signal.aborted) return;
      if (error instanceof ApiError && error.signedOut) this.signedOut();
      this.restingUntil = performance.now() + REST_MS;
      this.criteria = null;
    }
    this.changed();
  }
}
