// Names as they are shown. A file name may hold anything but "/" and NUL: line breaks, escape codes,
// marks that turn the direction of what follows. Those are replaced by signs that can be seen, so
// that a name never looks like another one; the rest is left to the browser.
export interface Piece {
  text: string;
  marked: boolean; // part of what was searched for
  sign: boolean; // stands for a character that cannot be seen
}

export type Range = [start: number, end: number];

// Controls, direction marks, invisible spaces and separators. Joiners (U+200C, U+200D) are left:
// scripts and emoji need them.
const UNSEEN =
  /[\u0000-\u001f\u007f-\u009f\u00ad\u061c\u180e\u200b\u200e\u200f\u2028-\u202e\u2060-\u206f\ufeff\ufff9-\ufffb]/g;
const ESCAPES: Record<string, string> = { '\n': '\\n', '\r': '\\r', '\t': '\\t' };

function signFor(character: string): string {
  const code = character.charCodeAt(0);
  const hex = code.toString(16).toUpperCase();
  return ESCAPES[character] ?? (code < 0x80 ? `\\x${hex.padStart(2, '0')}` : `U+${hex.padStart(4, '0')}`);
}

// `ranges` are ordered and do not overlap.
export function pieces(text: string, ranges: Range[] = []): Piece[] {
  const out: Piece[] = [];
  let at = 0;
  for (const [start, end] of ranges) {
    addPlain(out, text.slice(at, start), false);
    addPlain(out, text.slice(start, end), true);
    at = end;
  }
  addPlain(out, text.slice(at), false);
  return out;
}

function addPlain(out: Piece[], text: string, marked: boolean): void {
  let at = 0;
  for (const match of text.matchAll(UNSEEN)) {
    if (match.index > at) out.push({ text: text.slice(at, match.index), marked, sign: false });
    out.push({ text: signFor(match[0]), marked, sign: true });
    at = match.index + match[0].length;
  }
  if (at < text.length) out.push({ text: text.slice(at), marked, sign: false });
}

// For titles and sentences, where there is only text.
export function visible(text: string): string {
  return text.replace(UNSEEN, signFor);
}

// A path to paste elsewhere: as it is, or where that would be no text, or would do more than stand
// there, as a word for a shell.
export function copied({ path, path_encoded }: { path: string; path_encoded?: string }): string {
  if (!path_encoded && !/[\u0000-\u001f\u007f]/.test(path)) return path;
  const bytes = path_encoded
    ? path_encoded.replace(/%(..)/g, (_, hex: string) => String.fromCharCode(parseInt(hex, 16)))
    : path;
  const escape = (c: string) =>
    /['\\]/.test(c) ? '\\' + c : `\\x${c.charCodeAt(0).toString(16).padStart(2, '0')}`;
  const unseen = path_encoded ? /[^ -~]|['\\]/g : /[\u0000-\u001f\u007f'\\]/g;
  return `$'${bytes.replace(unseen, escape)}'`;
}

const counts = new Intl.NumberFormat('en');
export function count(n: number): string {
  return counts.format(n);
}

export function plural(n: number, one: string, many = one + 's'): string {
  return `${count(n)} ${n === 1 ? one : many}`;
}

// With `exact`, hundredths where they say something; a running clock shows none.
export function elapsed(milliseconds: number, exact: boolean): string {
  const seconds = milliseconds / 1000;
  if (seconds < 59.95) return `${seconds.toFixed(exact && seconds < 9.995 ? 2 : 1)} s`;
  const whole = Math.round(seconds);
  return `${Math.floor(whole / 60)} min ${whole % 60} s`;
}

// The folder of "/share/a/b.txt" is "/share/a".
export function folderOf(path: string): string {
  const cut = path.lastIndexOf('/');
  return cut > 0 ? path.slice(0, cut) : path;
}

export function extensionOf(name: string): string {
  const dot = name.lastIndexOf('.');
  return dot > 0 && dot + 1 < name.length ? name.slice(dot + 1).toLowerCase() : '';
}
