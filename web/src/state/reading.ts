// What the server makes of queries: of the one that is typed, asked a short pause after each change,
// and of those that were searched for. The newest question wins; until it is answered what was known
// is carried over, so that nothing flickers.
import * as client from '../api/client.ts';
import { asSentence } from '../api/errors.ts';
import type { Completion, Read } from '../api/types.ts';
import { movedTo, NO_QUERY, wordsOf, type Query, type Span, type Word } from '../model/query.ts';

const PAUSE_MS = 40;
// A search that begins tells of its query by itself.
const SEARCH_MS = 1500;
const KEPT = 50;

const NO_WORDS: Word[] = [];

// What was offered, as far as it fits what has been typed on; null where something else was done.
function carriedOn(offered: Completion, old: string, oldCaret: number, text: string, caret: number): Completion | null {
  const { begin, end, of, items } = offered;
  const same = old.slice(0, begin) === text.slice(0, begin) && old.slice(oldCaret) === text.slice(caret);
  const typed = text.slice(begin, caret).toLowerCase();
  if (!same || caret < begin || /[\s|:,/]/.test(typed)) return null;
  const left = items.filter((item) => item.text.length > typed.length && item.text.toLowerCase().startsWith(typed));
  return { of, begin, end: end + text.length - old.length, items: left };
}

export class Reading {
  query: Query = NO_QUERY; // of what is typed
  sure = true; // whether it is what the server says, or follows from that
  wrong = ''; // why the query as a whole is refused, where no span says it
  completion: Completion | null = null;
  caret = -1; // where the completion is for
  private readonly known = new Map<string, { spans: Span[]; words: Word[]; wrong: string }>();
  private waiting: (() => void)[] = [];
  private timer = 0;
  private abort = new AbortController();

  constructor(private readonly changed: () => void) {}

  // The words of a query that has been read; always the same list.
  wordsOf(pattern: string): Word[] {
    return this.known.get(pattern)?.words ?? NO_WORDS;
  }
  of(pattern: string): Query | null {
    const spans = this.known.get(pattern)?.spans;
    return spans ? { text: pattern, spans } : null;
  }

  // What is typed has become `text`. With the place of the caret, what can be written there is asked
  // for; `query` where it is known what the text is made of.
  follow(text: string, caret = -1, query?: Query): void {
    this.completion = this.completion && carriedOn(this.completion, this.query.text, this.caret, text, caret);
    this.caret = caret;
    const known = this.known.get(text);
    if (known) this.show(text, known);
    else if (text !== this.query.text) {
      this.query = query ?? movedTo(this.query, text);
      this.sure = query !== undefined;
    }
    this.ask(known && caret < 0 ? -1 : PAUSE_MS);
  }

  // The same of a query that is searched for, whose search will tell.
  expect(text: string): void {
    this.follow(text);
    if (!this.known.has(text)) this.ask(SEARCH_MS);
  }

  complete(caret: number): void {
    this.caret = caret;
    this.ask(0);
  }

  // What is done to the query is done once it is known what it is made of.
  whenSure(act: () => void): void {
    if (this.sure) act();
    else this.waiting.push(act);
  }

  get pending(): boolean {
    return this.waiting.length > 0;
  }

  learn(pattern: string, { spans, wrong }: Pick<Read, 'spans' | 'wrong'>): void {
    const told = spans.some((span) => span.wrong !== undefined);
    const known = { spans, words: wordsOf(spans), wrong: wrong && !told ? asSentence(wrong.sentence) : '' };
    this.known.delete(pattern);
    this.known.set(pattern, known);
    for (const old of this.known.keys()) {
      if (this.known.size <= KEPT) break;
      this.known.delete(old);
    }
    if (pattern === this.query.text) this.show(pattern, known);
    this.changed();
  }

  private show(text: string, { spans, wrong }: { spans: Span[]; wrong: string }): void {
    this.query = { text, spans };
    this.wrong = wrong;
    this.settle();
  }

  private settle(): void {
    this.sure = true;
    this.waiting.splice(0).forEach((act) => act());
  }

  private ask(pause: number): void {
    clearTimeout(this.timer);
    this.abort.abort();
    if (this.query.text.trim() === '' && this.caret < 0) this.settle();
    else if (pause >= 0) this.timer = window.setTimeout(() => void this.fetch(), pause);
  }

  private async fetch(): Promise<void> {
    this.abort = new AbortController();
    const { signal } = this.abort;
    const { caret } = this;
    const { text } = this.query;
    try {
      // A half of a pair is no character to the server.
      const read = await client.readQuery({ pattern: text.toWellFormed(), ...(caret >= 0 && { caret }) }, signal);
      if (signal.aborted) return;
      this.completion = caret >= 0 ? (read.completion ?? null) : null;
      this.learn(text, read);
    } catch {
      if (signal.aborted) return;
      // Without it there are no colours; what is amiss the search will tell, once one has typed.
      this.settle();
      this.changed();
    }
  }
}
