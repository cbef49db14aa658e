// The words that a pattern looks for, in names or in contents: the part of the server's language that
// shows in a result. What is excluded, and what is asked of a file beside its name, is left out.

export interface Word {
  text: string; // of a glob with its braces and backslashes
  kind: 'literal' | 'glob' | 'regex' | 'content' | 'first'; // 'first': only where a name begins
  exact: boolean; // letter case counts
}

const MOST_ALTERNATIVES = 256;
const PREFIX =
  /(ext|type|size|modified|created|opened|owner|group|depth|empty|content|case|regex|exclude|hidden|ignored|mounts|letters):/iy;
// Words that go on with a size or a time.
const MORE =
  /(?: +(?:\d+|ago|[kmgtp]i?b|bytes|(?:sec(?:ond)?|min(?:ute)?|hr|hour|day|week|month|year)s?)(?:\.\.[^ |>]*)?(?=[ |>]|$))*/iy;

export function wordsOf(pattern: string): Word[] {
  // Where not every group is closed there are none.
  const words = scan(pattern, true) ?? scan(pattern, false) ?? [];
  const letters = [...pattern.matchAll(LETTERS)].at(-1)?.[1]!.toLowerCase();
  if (letters !== 'exact' && letters !== 'smart') return words;
  return words.map((word) => {
    const counts = letters === 'exact' || hasCapital(word);
    return word.kind !== 'content' && counts ? { ...word, exact: true } : word;
  });
}

const LETTERS = /(?<=^|[ |])letters:(exact|smart|any)(?=[ |]|$)/gi;
// What an expression spells with letters that it does not look for.
const SPELLED = /\\[pP]\{[^}]*\}|\\.|\(\?P?[<'][^>']*/gs;

function hasCapital(word: Word): boolean {
  return /\p{Lu}/u.test(word.kind === 'regex' ? word.text.replace(SPELLED, '') : word.text);
}

function scan(pattern: string, groups: boolean): Word[] | undefined {
  const words: Word[] = [];
  const negated: boolean[] = []; // of the groups that are open
  let at = 0;

  // Takes what the expression matches here.
  const take = (expression: RegExp) => {
    expression.lastIndex = at;
    const match = expression.exec(pattern);
    if (match) at = expression.lastIndex;
    return match;
  };
  const close = (word: string) => {
    while (negated.length > 0 && word.endsWith('>')) {
      word = word.slice(0, -1);
      negated.pop();
    }
    return word;
  };
  while (at < pattern.length) {
    if (take(/[ |]+/y)) continue;
    const not = take(/!(?=[^ |])/y) !== null;
    if (groups && take(/<(?=[^>])/y)) {
      negated.push(not || negated.includes(true));
      continue;
    }
    const hidden = not || negated.includes(true);
    const word = takeWord(take, close, negated.length > 0);
    if (word?.text && !hidden) words.push(word);
  }
  return negated.length > 0 ? undefined : words;
}

type Take = (expression: RegExp) => RegExpExecArray | null;

// Undefined for what is not about texts.
function takeWord(take: Take, close: (word: string) => string, grouped: boolean): Word | undefined {
  let exact = false;
  let content = false;
  let prefix = take(PREFIX)?.[1]!.toLowerCase();
  if (prefix === 'case' || prefix === 'content') {
    exact = prefix === 'case';
    content = !exact;
    prefix = take(/regex:/iy) ? 'regex' : undefined;
  }
  const plain = () => close(take(/[^ |]*/y)![0]);
  if (prefix === 'regex') {
    const quoted = take(grouped ? /"(.*?)"(?=[ |>]|$)/sy : /"(.*?)"(?=[ |]|$)/sy);
    const rest = () => take(/.*/sy)![0].replace(/((?:^|[^\\])(?:\\\\)*\\ )? *$/, '$1');
    const text = quoted ? quoted[1]! : grouped ? plain() : rest();
    return { text, kind: 'regex', exact };
  }
  if (prefix !== undefined) {
    const value = take(/(?:"[^"]*"?|[^ |"])*/y)![0];
    if (close(value) === value && !value.includes('"')) close(take(MORE)![0]);
    return undefined;
  }
  const quoted = take(/"([^"]*)"?/y);
  const text = quoted ? quoted[1]! : plain();
  if (content) return { text, kind: 'content', exact };
  const speaks = !quoted && (isWild(text) || /\{.*,.*\}/s.test(text));
  if (!speaks) return { text, kind: 'literal', exact };
  const live = expand(text).length > 1 || isWild(translate(text).replace(/\[[*?[]\]/g, ''));
  return live ? { text, kind: 'glob', exact } : { text: text.replace(ESCAPE, '$1'), kind: 'literal', exact };
}

const ESCAPE = /\\([*?[\]{},\\])/g;
const SET = '\\[(?:[!^]|(?![!^]))[^][^\\]]*\\]';
const UNIT = new RegExp(`\\\\[*?[\\]{},\\\\]|${SET}|.`, 'gsu');

export function isWild(text: string): boolean {
  return new RegExp(`[*?]|${SET}`, 's').test(text);
}

// The globs that one with braces stands for, without backslashes; none where there are too many.
export function expand(text: string): string[] {
  const done: string[] = [];
  const open = [text];
  while (open.length > 0) {
    const one = open.pop()!;
    const list = firstList(one);
    if (!list) {
      done.push(translate(one));
    } else {
      for (let i = list.length - 2; i >= 0; --i) {
        open.push(one.slice(0, list[0]) + one.slice(list[i]! + 1, list[i + 1]) + one.slice(list.at(-1)! + 1));
      }
    }
    if (done.length + open.length > MOST_ALTERNATIVES) return [];
  }
  return done;
}

// The places of "{", "," ... "}" of the first list that is not inside another.
function firstList(text: string): number[] | undefined {
  const open: number[][] = [];
  let first: number[] | undefined;
  for (const { 0: unit, index } of text.matchAll(UNIT)) {
    if (unit === '{') open.push([index]);
    else if (unit === ',') open.at(-1)?.push(index);
    else if (unit === '}') {
      const list = open.pop();
      if (list && list.length > 1 && (!first || list[0]! < first[0]!)) first = [...list, index];
      if (first && open.length === 0) break;
    }
  }
  return first;
}

// A set of one stands for a character that is meant.
function translate(text: string): string {
  return text.replace(UNIT, (unit) => {
    if (unit.length !== 2 || unit[0] !== '\\') return unit;
    return '*?['.includes(unit[1]!) ? `[${unit[1]}]` : unit[1]!;
  });
}
