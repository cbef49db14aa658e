// Which part of a name a pattern matched. The server decides what matches, and by which words; this
// only finds where (the cases of tests/patterns.json are asked of both). What it cannot find is simply
// not highlighted. Takes at most name length x pattern length steps, save for regular expressions,
// where only those are tried that cannot run away.
import type { Word } from './query.ts';
import type { Range } from './text.ts';

// A repeated group, or a back reference, is what makes a backtracking engine run away; a named class
// is none to the browser.
const NOT_TRIED = /\)[*+?{]|\\[1-9]|\\k|\[[:=.]/;

export class Highlighter {
  private readonly words: Word[];
  private readonly regexes: RegExp[];

  // As the server does, a name is taken as one text, and contents line by line.
  constructor(all: Word[], where: 'name' | 'contents' = 'name') {
    const words = all.filter((word) => (word.in ?? where) === where);
    this.regexes = words.flatMap((word) => (word.as === 'regex' ? compile(word, where) : []));
    const changed = (word: Word) => (word.exact ? compose : fold)(word.text).text;
    this.words = words
      .filter((word) => word.as !== 'regex')
      .map((word) => ({ ...word, text: changed(word) }));
  }

  // Ordered, not overlapping.
  ranges(name: string): Range[] {
    if (this.words.length === 0 && this.regexes.length === 0) return [];
    const folded = fold(name);
    const composed = compose(name);
    const plain = form(name, (letter) => withoutAccents(folding(letter)));
    const found: Range[] = [];
    for (const word of this.words) {
      // Whoever types no accent finds any.
      const bare = !word.exact && withoutAccents(word.text) === word.text;
      for (const formed of word.exact ? [composed] : bare ? [folded, plain] : [folded]) {
        found.push(...placesOf(formed.text, word).map((place) => original(formed, place)));
      }
    }
    for (const regex of this.regexes) {
      for (const match of composed.text.matchAll(regex)) {
        if (match[0]) found.push(original(composed, [match.index, match.index + match[0].length]));
      }
    }
    return merge(found);
  }
}

function placesOf(text: string, word: Word): Range[] {
  if (word.as === 'glob') return globPlaces(text, word.text);
  if (word.as === 'start') return text.startsWith(word.text) ? [[0, word.text.length]] : [];
  return literalPlaces(text, word.text);
}

function compile({ text, exact }: Word, where: 'name' | 'contents'): RegExp[] {
  if (NOT_TRIED.test(text)) return [];
  const flags = (where === 'name' ? 'gsu' : 'gmu') + (exact ? '' : 'i');
  try {
    return [new RegExp(text.normalize('NFC'), flags)];
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
const folding = (letter: string) => letter.normalize('NFC').toUpperCase().toLowerCase();
const fold = (text: string) => form(text, folding);
// The marks on Latin, Greek and Cyrillic letters; in other scripts they are vowels.
const ACCENTS = /([\p{Script=Latin}\p{Script=Greek}\p{Script=Cyrillic}])[\u0300-\u036f\u0483-\u0487\u1ab0-\u1aff\u1dc0-\u1dff\ufe20-\ufe2f]+/gu;
const withoutAccents = (text: string) => text.normalize('NFD').replace(ACCENTS, '$1').normalize('NFC');

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

