// The lines that a search inside files has found, fetched for the rows that are seen, a few at a time:
// each costs the server a child that reads the file.
import * as client from '../api/client.ts';
import type { FileRow, FoundLine } from '../api/types.ts';

const REQUESTS = 2;
const KEPT = 2000;
// A wheel that turns passes many rows; what it stops at is asked for.
const PAUSE_MS = 120;

export class Lines {
  private readonly known = new Map<string, FoundLine | null>(); // null: asked for
  private wanted: FileRow[] = [];
  private flying = 0;
  private timer = 0;
  private readonly abort = new AbortController();

  constructor(
    private readonly pattern: string,
    private readonly changed: () => void,
  ) {}

  of(row: FileRow | undefined): FoundLine | undefined {
    const line = row && this.known.get(row.path);
    return line && line.line !== null ? line : undefined;
  }

  // The newest rows count.
  want(rows: (FileRow | undefined)[]): void {
    this.wanted = rows.filter((row) => row !== undefined && !row.is_dir && !this.known.has(row.path)) as FileRow[];
    clearTimeout(this.timer);
    if (this.wanted.length > 0) this.timer = setTimeout(() => this.pump(), PAUSE_MS) as unknown as number;
  }

  close(): void {
    clearTimeout(this.timer);
    this.abort.abort();
    this.wanted = [];
  }

  private pump(): void {
    while (this.flying < REQUESTS) {
      const row = this.wanted.shift();
      if (!row) return;
      if (!this.known.has(row.path)) void this.fetch(row);
    }
  }

  private async fetch(row: FileRow): Promise<void> {
    const { signal } = this.abort;
    ++this.flying;
    this.known.set(row.path, null);
    try {
      this.known.set(row.path, await client.foundLine(row, this.pattern, false, signal));
      for (const path of this.known.keys()) {
        if (this.known.size <= KEPT) break;
        this.known.delete(path);
      }
      this.changed();
    } catch {
      // The row says as much without it.
    }
    --this.flying;
    if (!signal.aborted) this.pump();
  }
}
