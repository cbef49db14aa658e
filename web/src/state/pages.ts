// The pages of a result that have been fetched, around what is seen. At most two requests are under
// way and the next one is chosen when one ends, so that dragging the scroll bar through a million
// rows fetches where it stands, not everything it passes.
import type { FileRow, Page } from '../api/types.ts';

export const PAGE_ROWS = 200;
// Some 100 bytes a row: a few megabytes, and enough to scroll back without waiting.
const KEPT_PAGES = 80;
const REQUESTS = 2;
// A page that could not be fetched is asked for again so much later.
const RETRY_MS = 2000;

type Fetch = (offset: number, limit: number, signal: AbortSignal) => Promise<Page>;

interface Kept {
  rows: FileRow[];
  stale: boolean;
  final: boolean; // listed when nothing more could come
}

export class Pages {
  total = 0;
  order = 0; // another number whenever the rows may stand at other places
  private kept = new Map<number, Kept>(); // least recently wanted first
  private before = new Map<number, Kept>(); // of the order before; shown until the first new page
  private flying = new Map<number, { outgrown: boolean }>();
  private counted = false; // since the rows were renewed
  private foundOrder = true;
  private first = 0;
  private last = 0;
  private abort = new AbortController();
  private opened = false;
  private closed = false;
  private resting = false;

  constructor(
    private readonly fetchPage: Fetch,
    private readonly changed: () => void,
    private readonly failed: (error: unknown) => void,
  ) {}

  row(index: number): FileRow | undefined {
    const pages = this.kept.size > 0 ? this.kept : this.before;
    return pages.get(Math.floor(index / PAGE_ROWS))?.rows[index % PAGE_ROWS];
  }

  // Which rows are seen; fetches what is missing there, then one page beyond either end.
  show(first: number, last: number): void {
    this.first = first;
    this.last = Math.max(first, last);
    this.pump();
  }

  // More has been found. In found order full pages never change; in any other, all may.
  grown(total: number, foundOrder: boolean): void {
    if (!foundOrder && total > this.total) ++this.order;
    this.total = Math.max(total, this.total);
    this.foundOrder = foundOrder;
    for (const page of this.kept.values()) page.stale ||= !page.final && this.canGrow(page.rows);
    // Their replies may have been written before.
    for (const request of this.flying.values()) request.outgrown = true;
    this.pump();
  }

  private canGrow(rows: FileRow[]): boolean {
    return !this.foundOrder || rows.length < PAGE_ROWS;
  }

  // From now on there is something to fetch from; `page` is the first, where that has come by itself.
  open(page?: Page): void {
    this.opened = true;
    if (page) this.keep(0, page, false);
    this.pump();
  }

  // Nothing more is found; pages that were listed before that are fetched once more.
  end(): void {
    const final = this.kept.size > 0 && [...this.kept.values()].every((page) => page.final);
    if (!final || this.flying.size > 0) this.renew();
  }

  // Everything is fetched anew, in a new order or for the last time; the old is shown meanwhile.
  renew(): void {
    this.abort.abort();
    this.abort = new AbortController();
    this.flying.clear();
    if (this.kept.size > 0) this.before = this.kept;
    this.kept = new Map();
    this.counted = false;
    this.pump();
  }

  close(): void {
    this.closed = true;
    this.abort.abort();
  }

  private pump(): void {
    while (this.opened && !this.closed && !this.resting && this.flying.size < REQUESTS) {
      const page = this.wanted().find((number) => this.needs(number));
      if (page === undefined) return;
      void this.fetch(page);
    }
  }

  private wanted(): number[] {
    const first = Math.floor(this.first / PAGE_ROWS);
    const last = Math.floor(this.last / PAGE_ROWS);
    const seen = Array.from({ length: last - first + 1 }, (_, i) => first + i);
    const around = [last + 1, first - 1].filter((page) => page >= 0 && page * PAGE_ROWS < this.total);
    return [...seen, ...around];
  }

  private needs(page: number): boolean {
    const kept = this.kept.get(page);
    return !this.flying.has(page) && (!kept || kept.stale);
  }

  private async fetch(number: number): Promise<void> {
    const { signal } = this.abort;
    const request = { outgrown: false };
    this.flying.set(number, request);
    try {
      const page = await this.fetchPage(number * PAGE_ROWS, PAGE_ROWS, signal);
      if (signal.aborted) return;
      this.keep(number, page, request.outgrown);
      this.flying.delete(number);
      this.changed();
      this.pump();
    } catch (error) {
      if (signal.aborted) return;
      this.flying.delete(number);
      this.rest();
      this.failed(error);
    }
  }

  private rest(): void {
    this.resting = true;
    setTimeout(() => {
      this.resting = false;
      this.pump();
    }, RETRY_MS);
  }

  private keep(number: number, page: Page, outgrown: boolean): void {
    this.kept.delete(number);
    const stale = outgrown && !page.finished && this.canGrow(page.files);
    this.kept.set(number, { rows: page.files, stale, final: page.finished });
    this.before.clear();
    // While a search runs a page may have been counted before the newest matches were.
    const total = page.finished || !this.counted ? page.total : Math.max(this.total, page.total);
    this.counted = true;
    if (total < this.total) ++this.order; // files have vanished, and rows moved up
    this.total = total;
    for (const old of this.kept.keys()) {
      if (this.kept.size <= KEPT_PAGES) break;
      this.kept.delete(old);
    }
  }
}
