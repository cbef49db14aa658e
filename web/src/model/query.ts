// A query as the server has cut it into spans (docs/http.md, "What was typed"), and what can be done
// with those without knowing the language: carry them over to a text that is typed on, paint them,
// take a term out, put another in its place.

export interface Word {
  text: string;
  as: 'literal' | 'start' | 'glob' | 'regex';
  exact?: boolean; // letter case counts
  in?: 'name' | 'contents'; // that alone
}

export interface Span {
  kind: 'text' | 'phrase' | 'regex' | 'prefix' | 'operator' | 'group';
  begin: number;
  end: number;
  prefix?: string;
  value?: number; // where it begins behind the prefix
  values?: string[]; // of a list, without quotes
  alone?: boolean; // has to hold by itself
  open?: boolean; // whatever were written behind it would be part of it
  says?: string;
  wrong?: string;
  words?: Word[];
}

export interface Query {
  text: string;
  spans: Span[];
}

export const NO_QUERY: Query = { text: '', spans: [] };

export const wordsOf = (spans: Span[]): Word[] => spans.flatMap(({ words }) => words ?? []);

// The term that a place lies in or touches; a sign only where there is no term.
export function spanAt({ spans }: Query, place: number): Span | undefined {
  const near = spans.filter(({ begin, end }) => begin <= place && place <= end);
  return near.find(({ kind }) => kind !== 'operator' && kind !== 'group') ?? near[0];
}

// The spans as far as they hold for a text that came of this one by one change, until it is known
// what they are: before and behind it they are what they were, and what is written at the end of a
// term belongs to it up to the next blank.
export function movedTo({ text: old, spans }: Query, text: string): Query {
  const most = Math.min(old.length, text.length);
  let first = 0;
  while (first < most && old[first] === text[first]) ++first;
  let last = 0;
  while (last < most - first && old.at(-1 - last) === text.at(-1 - last)) ++last;
  const behind = old.length - last; // the change, of the old text
  const delta = text.length - old.length;
  const put = text.slice(first, text.length - last);
  const joined = first + /^[^\s|]*/.exec(put)![0].length;
  const place = (at: number) => (at <= first ? at : at >= behind ? at + delta : first);
  const moved = spans.flatMap((span) => {
    if (span.end < first || (span.end === first && joined === first)) return [span];
    if (span.begin >= behind) return [shifted(span, delta)];
    if (span.begin >= first && span.end <= behind) return [];
    const begin = Math.min(span.begin, first);
    const end = span.end >= behind && span.end > first ? span.end + delta : joined;
    const value = span.value === undefined ? {} : { value: Math.min(place(span.value), end) };
    return [{ ...span, begin, end, ...value }];
  });
  return { text, spans: moved };
}

function shifted(span: Span, delta: number): Span {
  const moved = { ...span, begin: span.begin + delta, end: span.end + delta };
  return span.value === undefined ? moved : { ...moved, value: span.value + delta };
}

export interface Paint {
  text: string;
  look: string; // "" for what is plain
  wrong: boolean;
}

// The text in pieces of one look each. `forgiven`: a span that is not shown to be wrong.
export function painted({ text, spans }: Query, forgiven?: Span): Paint[] {
  const pieces: Paint[] = [];
  let at = 0;
  const add = (end: number, look: string, wrong = false) => {
    const until = Math.min(end, text.length);
    if (until > at) pieces.push({ text: text.slice(at, until), look, wrong });
    at = Math.max(at, until);
  };
  for (const span of spans) {
    const wrong = span.wrong !== undefined && span !== forgiven;
    add(span.begin, '');
    if (span.value !== undefined) add(span.value, 'prefix', wrong);
    add(span.end, span.kind === 'text' ? '' : span.value === undefined || span.kind === 'regex' ? span.kind : 'value', wrong);
  }
  add(text.length, '');
  return pieces;
}

// What stands behind a term's prefix, without quotes.
export function valueOf({ text }: Query, { value, begin, end }: Span): string {
  return text.slice(value ?? begin, end).replaceAll('"', '');
}

export function quoted(value: string): string {
  return /[\s|"]|>$/.test(value) ? `"${value.replaceAll('"', '')}"` : value;
}

// With this value behind the prefix of `old`, without that term where it is empty, or with a term
// more. The value is written as it has to stand in a query.
export function withTerm(query: Query, old: Span | undefined, prefix: string, value: string): Query {
  if (!old) return value === '' ? query : added(query, prefix, value);
  if (value === '') return without(query, old);
  const from = old.value ?? old.begin;
  const delta = value.length - (old.end - from);
  const spans = query.spans.map((span) => {
    if (span !== old) return span.begin >= old.end ? shifted(span, delta) : span;
    const { wrong: _wrong, says: _says, ...rest } = old;
    return { ...rest, end: old.end + delta };
  });
  return { text: query.text.slice(0, from) + value + query.text.slice(old.end), spans };
}

export function without({ text, spans }: Query, old: Span): Query {
  const before = text.slice(0, old.begin).replace(/\s+$/, '');
  const behind = text.slice(old.end).replace(/^\s+/, '');
  const between = before && behind ? ' ' : '';
  const delta = before.length + between.length - (text.length - behind.length);
  const left = spans.filter((span) => span !== old);
  const next = left.map((span) => (span.begin >= old.end ? shifted(span, delta) : span));
  return { text: before + between + behind, spans: next };
}

// At the end, or where that would become part of something else, at the beginning.
function added({ text, spans }: Query, prefix: string, value: string): Query {
  const last = spans.at(-1);
  const term = `${prefix}:${value}`;
  const span = { kind: 'prefix', prefix, alone: true } as const;
  const placed = (begin: number): Span => ({ ...span, begin, value: begin + prefix.length + 1, end: begin + term.length });
  if (last?.open || last?.kind === 'operator') {
    const rest = text.trimStart();
    const delta = term.length + 1 - (text.length - rest.length);
    return { text: `${term} ${rest}`, spans: [placed(0), ...spans.map((one) => shifted(one, delta))] };
  }
  const before = text.trimEnd();
  const begin = before === '' ? 0 : before.length + 1;
  return { text: before === '' ? term : `${before} ${term}`, spans: [...spans, placed(begin)] };
}

// The value of `exclude:` that stands for these names.
export function nameList(names: string[]): string {
  return names.map((name) => (/[\s|]/.test(name) ? `"${name.replaceAll('"', '\\"')}"` : name.replaceAll('"', '\\"'))).join();
}
