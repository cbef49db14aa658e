// One search, from its start to the moment it is cleaned up: asks how it goes, keeps the pages that
// are seen up to date, and tells when anything changed.
import * as client from '../api/client.ts';
import { ApiError, walkFailure } from '../api/errors.ts';
import type { Begun, Misses, Page, Progress, Walk } from '../api/types.ts';
import type { Sort } from '../model/address.ts';
import { Choice, spansText, type Spans } from '../model/choice.ts';
import type { Criteria } from '../model/criteria.ts';
import { ScrollModel } from '../model/scroll.ts';
import { Lines } from './lines.ts';
import { PAGE_ROWS, Pages } from './pages.ts';

export type Status = 'starting' | 'running' | 'done' | 'stopped' | 'failed';

// How often a running search is asked: soon at first, as most end within moments, then ever less.
const SOONEST_MS = 30;
const PART_OF_ELAPSED = 4;
const STEADY_MS = 400;
const HIDDEN_MS = 2000;
// So many unanswered questions in a row, and the search is given up.
const MISSES = 5;
const NOT_LISTED = 600;

// What the listing is asked for beside its place.
function ordered(sort: Sort | null) {
  if (!sort) return {};
  return { sort_by: sort.column, sort_direction: sort.descending ? ('DESC' as const) : ('ASC' as const) };
}
export const firstPage = (sort: Sort | null) => ({ limit: PAGE_ROWS, ...ordered(sort) });

const wait = (ms: number) => new Promise((done) => setTimeout(done, ms));

export class Search {
  status: Status = 'starting';
  error = ''; // why it failed, or ended early
  trouble = ''; // why rows that are wanted are not there, for as long as that is so
  walk: Walk = {
    phase: 'names',
    folders: 0,
    entries: 0,
    matches: 0,
    skipped: { permission: 0, vanished: 0, other: 0 },
    files: { unreadable: 0, not_text: 0 },
  };
  misses: Misses | null = null; // once it is known why nothing was found
  readonly pages: Pages;
  readonly scroll = new ScrollModel();
  readonly choice = new Choice(() => this.pages.order);
  filter = ''; // what the rows that are shown fit beside what was asked for
  filterWrong = false;
  lines?: Lines;
  private taskid = '';
  private closed = false;
  private stopAsked = false;
  private readonly startedAt = performance.now();
  private endedAt = 0;

  constructor(
    readonly criteria: Criteria,
    private readonly begun: Promise<Begun & { page?: Page }>,
    public sort: Sort | null,
    private readonly changed: () => void,
    private readonly signedOut: () => void,
  ) {
    this.pages = new Pages(
      async (offset, limit, signal) => {
        const page = await this.list(offset, limit, signal);
        this.trouble = '';
        return page;
      },
      changed,
      (error) => this.pageFailed(error),
    );
  }

  get over(): boolean {
    return this.status !== 'starting' && this.status !== 'running';
  }

  get elapsed(): number {
    return (this.over ? this.endedAt : performance.now()) - this.startedAt;
  }

  // What is known to have been found, of which `found` rows are shown.
  get matches(): number {
    return this.filter !== '' || !this.over ? Math.max(this.walk.matches, this.found) : this.pages.total;
  }
  get found(): number {
    const all = this.over || this.filter !== '';
    return all ? this.pages.total : Math.max(this.pages.total, this.walk.matches);
  }

  async run(): Promise<void> {
    const { sort } = this;
    let page: Page | undefined;
    try {
      const begun = await this.begun;
      ({ taskid: this.taskid, page } = begun);
      const { contents, pattern } = this.criteria;
      const inside = begun.spans.some(({ prefix }) => prefix === 'content');
      if (contents || inside) this.lines = new Lines(pattern, this.changed);
    } catch (error) {
      this.fail(error);
      return;
    }
    if (this.closed) {
      this.clean();
      return;
    }
    this.status = 'running';
    this.pages.open(this.sort === sort ? page : undefined);
    this.changed();
    await this.follow();
  }

  private async follow(): Promise<void> {
    for (let misses = 0; !this.closed; ) {
      try {
        const progress = await client.searchProgress(this.taskid);
        misses = 0;
        if (this.closed) return;
        this.learn(progress);
        if (progress.finished) return this.finish(progress);
      } catch (error) {
        const final = error instanceof ApiError && (error.signedOut || error.gone);
        if (final || ++misses >= MISSES) return this.fail(error);
      }
      const pause = Math.max(SOONEST_MS, this.elapsed / PART_OF_ELAPSED);
      await wait(document.hidden ? HIDDEN_MS : Math.min(pause, STEADY_MS));
    }
  }

  private learn(progress: Progress): void {
    const walk = progress.walk;
    if (!walk) return;
    const grew = (walk.matches ?? 0) > this.walk.matches;
    this.walk = {
      ...this.walk,
      ...walk,
      skipped: { ...this.walk.skipped, ...walk.skipped },
      files: { ...this.walk.files, ...walk.files },
    };
    if (grew) this.pages.grown(this.filter === '' ? this.walk.matches : 0, this.sort === null);
    this.changed();
  }

  private finish(progress: Progress): void {
    this.endedAt = performance.now();
    if (progress.progress === -1) {
      this.status = 'failed';
      this.error = walkFailure(progress.errno ?? 0);
    } else if (progress.progress === 1) {
      this.status = 'done';
      if (this.walk.matches === 0) void this.learnWhy();
    } else {
      this.status = 'stopped';
      if (!this.stopAsked) {
        this.error = 'The search ended early on the server. Search again to see everything.';
      }
    }
    // The walk's count may run ahead of what is listed; the last pages say how it is.
    if (this.status !== 'failed') this.pages.end();
    this.changed();
  }

  // Saying why is a convenience; that nothing was found has been said.
  private async learnWhy(): Promise<void> {
    try {
      this.misses = await client.nearMisses(this.taskid, (await this.begun).params);
      this.changed();
    } catch {
      return;
    }
  }

  private fail(error: unknown): void {
    this.endedAt = performance.now();
    this.status = 'failed';
    if (error instanceof ApiError) {
      if (error.signedOut) this.signedOut();
      this.error = error.gone
        ? 'The server no longer has this search. Search again to see the results.'
        : error.message;
    } else {
      this.error = String(error);
    }
    this.changed();
  }

  private pageFailed(error: unknown): void {
    if (this.closed) return;
    if (error instanceof ApiError && error.signedOut) this.signedOut();
    // Half typed it can be wrong for a moment; the rows before stay.
    if (this.filter !== '' && error instanceof ApiError && error.code === NOT_LISTED) {
      this.filterWrong = true;
      return this.changed();
    }
    if (this.status !== 'failed') this.trouble = error instanceof Error ? error.message : String(error);
    this.changed();
  }

  list(offset: number, limit: number, signal?: AbortSignal): Promise<Page> {
    return client.listResults({ taskid: this.taskid, offset, limit, ...this.order }, signal);
  }

  private get order(): client.ListOrder {
    return { ...(this.filter && { pattern: this.filter }), ...ordered(this.sort) };
  }

  // The rows as one archive.
  zipAddress(spans: Spans): string {
    return client.zipAddress(this.taskid, spansText(spans), this.order);
  }

  setSort(sort: Sort | null): void {
    this.sort = sort;
    ++this.pages.order;
    this.scroll.toTop();
    if (this.taskid) this.pages.renew();
    this.changed();
  }

  narrow(text: string): void {
    if (text.trim() === this.filter) return;
    this.filter = text.trim();
    this.filterWrong = false;
    ++this.pages.order;
    this.scroll.toTop();
    this.pages.show(0, 0);
    if (this.taskid) this.pages.renew();
    this.changed();
  }

  async stop(): Promise<void> {
    if (!this.taskid || this.over) return;
    this.stopAsked = true;
    try {
      await client.stopSearch(this.taskid);
    } catch (error) {
      this.pageFailed(error);
    }
  }

  // Leaves nothing behind on the server.
  close(): void {
    if (this.closed) return;
    this.closed = true;
    this.pages.close();
    this.lines?.close();
    this.clean();
  }

  private clean(): void {
    // A search that cannot be cleaned now is removed by the server when it is a day old.
    if (this.taskid) client.cleanSearch(this.taskid).catch(() => {});
  }
}
