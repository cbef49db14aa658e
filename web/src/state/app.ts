// What the page knows: who is signed in, which folders there are, what is typed, and the search that
// is shown. Views read it and call it; it tells them when to draw again.
import * as client from '../api/client.ts';
import { ApiError } from '../api/errors.ts';
import type { FileRow, Session, Share } from '../api/types.ts';
import { fromHash, parseSort, sortText, toHash, type Address, type Sort, type SortColumn } from '../model/address.ts';
import {
  browses,
  contentsOf,
  CriterionError,
  hasCriteria,
  NO_CRITERIA,
  sameCriteria,
  begun as begin,
  type Criteria,
} from '../model/criteria.ts';
import type { Query } from '../model/query.ts';
import { parseColumns } from '../view/columns.ts';
import { Instant } from './instant.ts';
import { recall, remember } from './memory.ts';
import { Past } from './past.ts';
import { Reading } from './reading.ts';
import { firstPage, Search } from './search.ts';
import type { Shown } from './shown.ts';
import { Thumbnails } from './thumbnails.ts';
import { Trail, type Step } from './trail.ts';

export type Gate = 'loading' | 'sign-in' | 'open-address' | 'unreachable' | 'ready';

const NOTICE_MS = 4000;
const READING_MS = 80; // a letter of a longer one
const PLACED_MS = 250;
// As folders are looked through.
const FOLDER_SORT: Sort = { column: 'name', descending: false };
// What was asked for when the session ended, for the page that the next address opens.
const RESUMED = 'resumed';
// Where the server leads whoever opens a used address.
const USED = '?used';
// Asked again whether the server answers.
const RETRY_MS = 5000;

export class App {
  gate: Gate = 'loading';
  session: Session | null = null;
  shares: Share[] = [];
  homes = false;
  draft: Criteria = NO_CRITERIA;
  draftError: CriterionError | null = null;
  search: Search | null = null;
  readonly instant: Instant;
  readonly past: Past;
  readonly reading: Reading;
  caret = -1; // in the query, while it is typed
  unfolded = false;
  columns = parseColumns(recall('columns'));
  pictures = recall('pictures') === 'shown';
  readonly thumbnails: Thumbnails;
  choosing = false; // a tap chooses a row and does not open it
  active = -1; // the row the keyboard is at
  detailed: FileRow | null = null; // the row shown beside the table
  notice = '';
  problem = ''; // why the page cannot work, when it cannot
  ended = false; // the session, while the page was in use
  readonly used = location.search === USED; // it was reached by an address that had been used
  // The search before, while the server reads what the present one asks for.
  private standing: Search | null | undefined;
  private readonly trail = new Trail();
  private noticeTimer = 0;
  private placing = 0;
  private drawing = 0;

  constructor(private readonly draw: () => void) {
    this.instant = new Instant(this.changed, this.signedOut);
    this.reading = new Reading(this.changed);
    this.thumbnails = new Thumbnails(this.changed);
    this.past = new Past(() => this.everywhere, this.changed, this.failed);
    addEventListener('popstate', () => this.followAddress());
    addEventListener('pagehide', () => this.closeSearches());
    addEventListener('pageshow', (event) => {
      if (event.persisted) this.followAddress();
    });
  }

  // Draws at most once a frame.
  changed = (): void => {
    if (this.drawing) return;
    this.drawing = requestAnimationFrame(() => {
      this.drawing = 0;
      this.draw();
    });
  };

  set(values: Partial<App>): void {
    Object.assign(this, values);
    this.changed();
  }

  async open(): Promise<void> {
    try {
      const [session, { shares, homes }] = await Promise.all([client.getSession(), client.getShares()]);
      const same = this.ended && this.session?.user === session.user ? this.draft : null;
      Object.assign(this, { session, shares, homes, gate: 'ready', problem: '', ended: false });
      this.resume();
      this.followAddress();
      if (same && !sameCriteria(same, this.draft)) this.edit(same);
      void this.past.load();
    } catch (error) {
      this.closeGate(error);
    }
    this.changed();
  }

  // The address of what was asked for in a session that ended, or as it is.
  private resume(): void {
    const hash = recall(RESUMED);
    remember(RESUMED, '');
    if (hash && !location.hash) history.replaceState(null, '', location.pathname + hash);
    else if (location.search) history.replaceState(null, '', location.pathname + location.hash);
  }

  private closeGate(error: unknown): void {
    this.closeSearches();
    if (error instanceof ApiError && error.signedOut) {
      const { session, draft } = this;
      this.ended ||= session !== null;
      this.gate = error.mode === 'single' ? 'open-address' : 'sign-in';
      // The same person's in any case; where others may sign in, it stays in this tab.
      const kept = this.ended && session?.mode === 'single' && !sameCriteria(draft, NO_CRITERIA);
      if (kept) remember(RESUMED, toHash({ criteria: draft, sort: parseSort(recall('sort')) }));
    } else {
      setTimeout(() => this.gate === 'unreachable' && void this.open(), RETRY_MS);
      this.gate = 'unreachable';
      this.problem = error instanceof Error ? error.message : String(error);
    }
  }

  signedOut = (): void => {
    // Asks the server how to sign in here, and shows that.
    void this.open();
  };

  async signIn(user: string, password: string): Promise<void> {
    await client.logIn(user, password);
    await this.open();
  }

  async signOut(): Promise<void> {
    this.closeSearches();
    try {
      await client.logOut();
    } catch {
      // The session may have ended by itself.
    }
    location.hash = '';
    location.reload();
  }

  showColumn(column: SortColumn, shown: boolean): void {
    const words = shown ? [...this.columns, column] : this.columns.filter((one) => one !== column);
    remember('columns', words.join());
    this.set({ columns: parseColumns(words.join()) });
  }

  showPictures(shown: boolean): void {
    remember('pictures', shown ? 'shown' : '');
    this.set({ pictures: shown });
  }

  // The table that is shown.
  get shown(): Shown | null {
    return this.showsInstant ? this.instant : this.search;
  }

  // Has a tap choose rows from now on; null: nothing is chosen any more.
  choose(taps: true | null): void {
    if (!taps) this.shown?.choice.clear();
    this.set({ choosing: taps === true });
  }

  get everywhere(): string[] {
    const folders = this.shares.map((share) => '/' + share.name);
    return this.homes ? [...folders, '/home'] : folders;
  }

  // `caret`: where in the pattern one types; `query`: what it is made of, where that is known.
  edit(change: Partial<Criteria>, caret?: number, query?: Query): void {
    this.draftError = null;
    // Who types a name while a folder lies open looks for it below that.
    const below = change.pattern && browses(this.draft) ? { subfolders: true } : {};
    this.draft = { ...this.draft, ...below, ...change };
    this.reading.follow(this.draft.pattern, caret, query);
    this.askAtOnce();
    this.changed();
  }

  // Has terms of the query that is typed taken out, or others put in their place; `and` does something
  // with what has come of it.
  rewrite(change: (query: Query) => Query, and?: () => void): void {
    this.reading.whenSure(() => {
      const query = change(this.reading.query);
      this.edit({ pattern: query.text }, undefined, query);
      and?.();
    });
  }

  // What is typed and not yet searched for is shown as far as an index knows it.
  private askAtOnce(): void {
    const { draft, search } = this;
    const folders = draft.folders.length > 0 ? draft.folders : this.everywhere;
    const empty = draft.pattern.trim() === '' && !hasCriteria(draft);
    const indexed = this.shares.some((share) => share.indexed);
    if (!indexed || empty || (search && sameCriteria(draft, search.criteria))) this.instant.drop();
    else this.instant.ask(draft, folders);
  }

  // Whether the instant answer stands in the place of a search: until the search of the same words
  // has something to show.
  get showsInstant(): boolean {
    const { criteria } = this.instant;
    const { search } = this;
    if (!criteria) return false;
    if (!search || !sameCriteria(criteria, search.criteria)) return true;
    return !search.over && search.found === 0;
  }

  // Searches for what is typed, and puts it into the address bar.
  submit(change: Partial<Criteria> = {}): void {
    if (this.reading.pending) return this.reading.whenSure(() => this.submit(change));
    this.edit(change);
    this.reading.expect(this.draft.pattern);
    this.instant.cancel();
    const sort = this.nextSort();
    const hash = toHash({ criteria: this.draft, sort });
    void this.start(this.draft, sort).then((started) => {
      if (!started) return;
      if (hash === location.hash) history.replaceState(this.trail.begin(), '', hash);
      else history.pushState(this.trail.begin(), '', hash);
    });
  }

  // That of the search before, in this tab or the last one; folders are looked through by name.
  private nextSort(): Sort | null {
    const shown = this.search;
    const folder = shown !== null && browses(shown.criteria);
    if (browses(this.draft)) return folder ? shown.sort : FOLDER_SORT;
    return shown && !folder ? shown.sort : parseSort(recall('sort'));
  }

  // Shows what the folder holds.
  browse(folder: string): void {
    this.submit(contentsOf(folder));
  }

  // Details are a step of their own: the way back closes them.
  showDetails(row: FileRow): void {
    const { step } = this.trail;
    if (!this.detailed && !step?.details) {
      history.pushState({ entry: this.trail.entry, details: true } satisfies Step, '', location.hash);
    }
    this.set({ detailed: row });
  }

  hideDetails(): void {
    if (!this.detailed) return;
    this.set({ detailed: null });
    if (this.trail.step?.details) history.back();
  }

  private followAddress(): void {
    const { step } = this.trail;
    if (step && step.entry === this.trail.entry) return this.followDetails(step);
    this.leaveSearch();
    const address = fromHash(location.hash);
    if (!address) {
      this.reset();
      history.replaceState({ entry: 0 } satisfies Step, '');
      return;
    }
    const seen = step && this.trail.back(step.entry);
    if (seen) {
      this.instant.drop();
      Object.assign(this, seen, { draft: seen.search.criteria, draftError: null });
      this.reading.follow(this.draft.pattern);
      this.setTitle();
      this.followDetails(step);
    } else {
      this.repeat(address, step);
    }
  }

  private repeat({ criteria, sort }: Address, step: Step | null): void {
    if (step) this.trail.entry = step.entry;
    else this.trail.begin();
    history.replaceState({ entry: this.trail.entry } satisfies Step, '');
    this.draft = criteria;
    this.reading.expect(criteria.pattern);
    void this.start(criteria, sort).then((started) => {
      if (!started || !this.search) return;
      this.search.scroll.restore(step?.above ?? 0);
      this.set({ active: step?.active ?? -1 });
    });
  }

  // The search stays; its details come or go, and its order is the one it has by now.
  private followDetails(step: Step): void {
    const { search } = this;
    const row = step.details ? (search?.pages.row(this.active) ?? this.detailed) : null;
    if (search) history.replaceState(step, '', toHash(search));
    this.set({ detailed: row });
    this.placed();
  }

  // Keeps what is left for the way back: a search that has ended, or that goes on while one of the
  // folders that it has found is looked into.
  private leaveSearch(whileRunning = false): void {
    this.abandon();
    const { search, active, detailed } = this;
    this.search = null;
    if (search?.status === 'done' || search?.status === 'stopped' || (search && whileRunning)) {
      this.trail.leave({ search, active, detailed });
    } else {
      search?.close();
    }
  }

  // Of a search that the server has not understood yet nothing is left; the one before is shown.
  private abandon(): void {
    if (this.standing === undefined) return;
    this.search?.close();
    this.search = this.standing;
    this.standing = undefined;
  }

  // Told of the table's place once it rests, for a page that is loaded anew.
  placed = (): void => {
    clearTimeout(this.placing);
    this.placing = window.setTimeout(() => {
      const { search, active } = this;
      const { entry, step } = this.trail;
      if (!search || step?.entry !== entry) return;
      history.replaceState({ ...step, active, above: search.scroll.above } satisfies Step, '');
    }, PLACED_MS);
  };

  // The start page, a step of its own.
  home(): void {
    this.reset();
    history.pushState({ entry: 0 } satisfies Step, '', location.pathname);
  }

  private reset(): void {
    this.leaveSearch();
    this.trail.entry = 0;
    this.instant.drop();
    Object.assign(this, { detailed: null, active: -1, draft: NO_CRITERIA });
    this.draftError = null;
    this.reading.follow('');
    this.setTitle();
    this.changed();
  }

  // The search before stays until the server has understood what this one asks for: where it does
  // not, that one is shown again. False then, and where another was begun meanwhile.
  private async start(criteria: Criteria, sort: Sort | null): Promise<boolean> {
    this.draftError = null;
    if (this.standing === undefined) this.standing = this.search;
    else this.search?.close();
    const list = firstPage(sort);
    const begun = begin(criteria, this.everywhere, async (asked) => {
      const reply = await client.beginSearch(asked, list);
      if (reply.spans) this.reading.learn(criteria.pattern, { ...reply, spans: reply.spans });
      return reply;
    });
    const search = new Search(criteria, begun, sort, this.changed, this.signedOut);
    this.search = search;
    const ended = search.run();
    this.changed();
    // What else may fail, the search itself tells.
    const error: unknown = await begun.then(() => null, (reason: unknown) => reason);
    if (this.search !== search) return false;
    if (error instanceof CriterionError) {
      this.abandon();
      this.draftError = error;
      if (error.field === 'contents') this.unfolded = true;
      this.changed();
      return false;
    }
    const { standing } = this;
    Object.assign(this, { search: standing, standing: undefined });
    this.leaveSearch(browses(criteria));
    Object.assign(this, { search, detailed: null, active: -1 });
    if (this.instant.criteria && !sameCriteria(this.instant.criteria, criteria)) this.instant.drop();
    this.setTitle();
    void ended.then(() => {
      if (search.status !== 'failed') void this.past.add(criteria);
    });
    this.changed();
    return true;
  }

  private closeSearches(): void {
    this.search?.close();
    this.standing?.close();
    this.standing = undefined;
    this.search = null;
    this.trail.close();
  }

  private setTitle(): void {
    const criteria = this.search?.criteria;
    const shown = criteria && browses(criteria) ? criteria.folders[0] : criteria?.pattern.trim();
    document.title = shown ? `${shown} · Arbory Search` : 'Arbory Search';
  }

  setSort(sort: Sort | null): void {
    if (this.showsInstant) {
      // The best of them cannot be sorted: all are.
      remember('sort', sortText(sort));
      if (this.search) this.search.sort = sort;
      this.submit();
      return;
    }
    if (!this.search) return;
    this.active = -1;
    this.search.setSort(sort);
    remember('sort', sortText(sort));
    history.replaceState(this.trail.step, '', toHash({ criteria: this.search.criteria, sort }));
    this.changed();
  }

  async forgetHistory(): Promise<void> {
    if (await this.past.clear()) this.tell('The history is cleared.');
  }

  // Of something that a person asked for beside a search.
  private failed = (error: unknown): void => {
    if (error instanceof ApiError && error.signedOut) this.signedOut();
    else this.tell(error instanceof Error ? error.message : String(error));
  };

  // A short word at the edge of the page.
  tell(notice: string): void {
    clearTimeout(this.noticeTimer);
    const pause = Math.max(NOTICE_MS, notice.length * READING_MS);
    this.noticeTimer = window.setTimeout(() => this.set({ notice: '' }), pause);
    this.set({ notice });
  }
}
