// Which part of a name a pattern matched. The server decides what matches; this only finds where, by
// the same language: terms separated by spaces, "a|b", "!a", "quoted text", globs and "regex:". The
// cases of tests/patterns.json are asked of both. What it cannot find is simply not highlighted.
// Takes at most name length x pattern length steps, save for regular expressions, where only those
// are tried that cannot run away.
import type { Range } from './text.ts';

interface Term {
  text: string;
  kind: 'literal' | 'glob' | 'regex';
}

// A repeated group, or a back reference, is what makes a backtracking engine run away; a named class
// is none to the browser.
const NOT_TRIED = /\)[*+?{]|\\[1-9]|\\k|\[[:=.]/;

export class Highlighter {
  private readonly terms: Term[];
  private readonly regexes: RegExp[];

  // As the server does, a name is taken as one text, and contents line by line.
  constructor(pattern: string, where: 'name' | 'contents' = 'name') {
    const terms = parse(pattern);
    this.terms = terms
      .filter((term) => term.kind !== 'regex')
      .map((term) => ({ ...term, text: fold(term.text).text }));
    this.regexes = terms.flatMap((term) => (term.kind === 'regex' ? compile(term.text, where) : []));
  }

  // Ordered, not overlapping.
  ranges(name: string): Range[] {
    if (this.terms.length === 0 && this.regexes.length === 0) return [];
    const folded = fold(name);
    const found: Range[] = [];
    for (const term of this.terms) {
      const places =
        term.kind === 'glob' ? globPlaces(folded.text, term.text) : literalPlaces(folded.text, term.text);
      found.push(...places.map((place) => original(folded, place)));
    }
    const composed = this.regexes.length > 0 ? compose(name) : folded;
    for (const regex of this.regexes) {
      for (const match of composed.text.matchAll(regex)) {
        if (match[0]) found.push(original(composed, [match.index, match.index + match[0].length]));
      }
    }
    return merge(found);
  }
}

function parse(pattern: string): Term[] {
  const terms: Term[] = [];
  const piece = /(!(?=[^ |]))?(?:regex:(.*)$|"([^"]*)"?|([^ |]+))|[ |]/gsy;
  for (const [, negated, regex, quoted, plain] of pattern.matchAll(piece)) {
    const text = regex ?? quoted ?? plain;
    if (negated || !text) continue;
    const kind = regex !== undefined ? 'regex' : plain && unitsOf(plain).some((u) => !u.plain) ? 'glob' : 'literal';
    terms.push({ text, kind });
  }
  return terms;
}

function compile(source: string, where: 'name' | 'contents'): RegExp[] {
  if (NOT_TRIED.test(source)) return [];
  try {
    return [new RegExp(source.normalize('NFC'), where === 'name' ? 'gisu' : 'gimu')];
  } catch {
    return [];
  }
}

// A text in another form, and for each of its code units the place in the original of the letter
// that it comes from, and the place behind that letter.
interface Formed {
  text: string;
  from: number[];
  to: number[];
}

// A letter and the marks on it, and the parts of a Korean syllable, are one to whoever composes.
const LETTER = /[\u1100-\u1112][\u1161-\u1175][\u11a8-\u11c2]?|\P{M}\p{M}*|\p{M}+/gsu;

function form(original: string, change: (letter: string) => string): Formed {
  const formed: Formed = { text: '', from: [], to: [] };
  for (const { 0: letter, index } of original.matchAll(LETTER)) {
    const changed = change(letter);
    for (let i = 0; i < changed.length; ++i) {
      formed.from.push(index);
      formed.to.push(index + letter.length);
    }
    formed.text += changed;
  }
  return formed;
}

const compose = (text: string) => form(text, (letter) => letter.normalize('NFC'));
// As names are compared.
const fold = (text: string) => form(text, (letter) => letter.normalize('NFC').toUpperCase().toLowerCase());

function original({ from, to }: Formed, [start, end]: Range): Range {
  return [from[start]!, to[end - 1]!];
}

function literalPlaces(text: string, term: string): Range[] {
  const found: Range[] = [];
  for (let at = text.indexOf(term); at >= 0; at = text.indexOf(term, at + term.length)) {
    found.push([at, at + term.length]);
  }
  return found;
}

// The plain characters of a glob. It is about the whole name: its first run stands at the beginning
// and its last at the end, and between stars the leftmost place is always as good as any.
function globPlaces(text: string, glob: string): Range[] {
  const characters = [...text];
  const starts = [0];
  for (const c of characters) starts.push(starts.at(-1)! + c.length);
  const found: Range[] = [];
  const runs = runsOf(glob);
  let at = 0;
  for (const [index, units] of runs.entries()) {
    const most = characters.length - units.length;
    const fits = (start: number) => units.every((unit, i) => unit.accepts(characters[start + i]!));
    let start = index > 0 && index === runs.length - 1 ? Math.max(most, at) : at;
    while (index > 0 && start <= most && !fits(start)) ++start;
    if (start > most || !fits(start)) return [];
    units.forEach((unit, i) => {
      if (unit.plain) found.push([starts[start + i]!, starts[start + i + 1]!]);
    });
    at = start + units.length;
  }
  return runs.length > 1 || at === characters.length ? found : [];
}

interface Unit {
  plain: boolean;
  star: boolean;
  accepts(c: string): boolean;
}

function runsOf(glob: string): Unit[][] {
  const runs: Unit[][] = [[]];
  for (const unit of unitsOf(glob)) {
    if (unit.star) runs.push([]);
    else runs.at(-1)!.push(unit);
  }
  return runs;
}

function unitsOf(glob: string): Unit[] {
  return [...glob.matchAll(/\[([!^]|(?![!^]))([^][^\]]*)\]|./gsu)].map(([whole, negated, set]) => {
    const unit = { plain: false, star: whole === '*' };
    if (set !== undefined) return { ...unit, accepts: (c) => inSet(c, set) !== Boolean(negated) };
    if (whole === '*' || whole === '?') return { ...unit, accepts: () => true };
    return { ...unit, plain: true, accepts: (c) => c === whole };
  });
}

function inSet(c: string, set: string): boolean {
  const point = (text: string) => text.codePointAt(0)!;
  return [...set.matchAll(/(.)-(.)|(.)/gsu)].some(([, low, high, one]) =>
    one !== undefined ? c === one : point(c) >= point(low!) && point(c) <= point(high!),
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

