// Which part of a name a pattern matched. The server decides what matches; this only finds where, by
// the same language: terms separated by spaces, "a|b", "!a", "quoted text", globs and "regex:". What
// it cannot find is simply not highlighted. Takes at most name length x pattern length steps, save
// for regular expressions, where only those are tried that cannot run away.
import type { Range } from './text.ts';

interface Term {
  text: string;
  kind: 'literal' | 'glob' | 'regex';
}

// A repeated group, or a back reference, is what makes a backtracking engine run away.
const MAY_RUN_AWAY = /\)[*+?{]|\\[1-9]|\\k/;

export class Highlighter {
  private readonly terms: Term[];
  private readonly regexes: RegExp[];

  constructor(pattern: string) {
    const terms = parse(pattern);
    this.terms = terms
      .filter((term) => term.kind !== 'regex')
      .map((term) => ({ ...term, text: fold(term.text).text }));
    this.regexes = terms.flatMap((term) => (term.kind === 'regex' ? compile(term.text) : []));
  }

  // Ordered, not overlapping.
  ranges(name: string): Range[] {
    if (this.terms.length === 0 && this.regexes.length === 0) return [];
    const folded = fold(name);
    const found: Range[] = [];
    for (const term of this.terms) {
      const places =
        term.kind === 'glob' ? globPlaces(folded.text, term.text) : literalPlaces(folded.text, term.text);
      for (const [start, end] of places) found.push([folded.at[start]!, folded.at[end]!]);
    }
    for (const regex of this.regexes) {
      for (const match of name.matchAll(regex)) {
        if (match[0]) found.push([match.index, match.index + match[0].length]);
      }
    }
    return merge(found);
  }
}

function parse(pattern: string): Term[] {
  const terms: Term[] = [];
  const piece = /(!?)(?:regex:(.*)$|"([^"]*)"?|([^ |"!][^ |]*|!(?=[ |]|$)))|[ |]/gsy;
  for (let match = piece.exec(pattern); match; match = piece.exec(pattern)) {
    const [, negated, regex, quoted, plain] = match;
    if (negated) continue;
    if (regex !== undefined) terms.push({ text: regex, kind: 'regex' });
    const text = quoted ?? plain ?? '';
    if (text) {
      const glob = quoted === undefined && /[*?]|\[.+\]/.test(text);
      terms.push({ text, kind: glob ? 'glob' : 'literal' });
    }
  }
  return terms;
}

function compile(source: string): RegExp[] {
  if (MAY_RUN_AWAY.test(source)) return [];
  try {
    return [new RegExp(source, 'giu')];
  } catch {
    return [];
  }
}

// Text as names are compared, composed and folded, with the place in the original of every unit.
function fold(text: string): { text: string; at: number[] } {
  let folded = '';
  const at: number[] = [];
  // A letter and the marks on it are one unit: composed and decomposed forms fold to the same.
  for (const match of text.matchAll(/\P{M}\p{M}*|\p{M}+/gsu)) {
    const unit = match[0].normalize('NFC').toUpperCase().toLowerCase();
    for (let i = 0; i < unit.length; ++i) at.push(match.index);
    folded += unit;
  }
  at.push(text.length);
  return { text: folded, at };
}

function literalPlaces(text: string, term: string): Range[] {
  const found: Range[] = [];
  for (let at = text.indexOf(term); at >= 0; at = text.indexOf(term, at + term.length)) {
    found.push([at, at + term.length]);
  }
  return found;
}

// The plain runs of a glob: between stars the leftmost place is always as good as any, and the last
// run stands at the end.
function globPlaces(text: string, glob: string): Range[] {
  const runs = glob.split('*').map(unitsOf);
  const found: Range[] = [];
  let at = 0;
  for (const [index, units] of runs.entries()) {
    const last = index === runs.length - 1;
    const most = text.length - units.length;
    let start = last ? Math.max(most, at) : at;
    while (start <= most && !units.every((unit, i) => unit.accepts(text[start + i]!))) ++start;
    if (start > most) return found;
    units.forEach((unit, i) => {
      if (unit.plain) found.push([start + i, start + i + 1]);
    });
    at = start + units.length;
  }
  return found;
}

interface Unit {
  plain: boolean;
  accepts(c: string): boolean;
}

function unitsOf(run: string): Unit[] {
  return [...run.matchAll(/\[(!?)(.[^\]]*)\]|\?|./gs)].map(([whole, negated, set]) => {
    if (whole === '?') return { plain: false, accepts: () => true };
    if (set === undefined) return { plain: true, accepts: (c: string) => c === whole };
    return { plain: false, accepts: (c: string) => inSet(c, set) !== Boolean(negated) };
  });
}

function inSet(c: string, set: string): boolean {
  return [...set.matchAll(/(.)-(.)|(.)/gs)].some(([, low, high, one]) =>
    one !== undefined ? c === one : c >= low! && c <= high!,
  );
}

function merge(found: Range[]): Range[] {
  found.sort((a, b) => a[0] - b[0]);
  const out: Range[] = [];
  for (const [start, end] of found) {
    const last = out[out.length - 1];
    if (last && start <= last[1]) {
      last[1] = Math.max(last[1], end);
    } else if (end > start) {
      out.push([start, end]);
    }
  }
  return out;
}

