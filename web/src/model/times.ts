// Times as words and as pairs of days. A time criterion is '' (any time), a word, or "FROM..TO" with
// days as YYYY-MM-DD, either of which may be missing. Everything counts in whole days of the
// browser's time zone, so that a criterion that comes back from the history as seconds can be shown
// as the days it was made of.
export const TIME_WORDS = [
  ['today', 'Today'],
  ['yesterday', 'Yesterday'],
  ['last-7-days', 'Last 7 days'],
  ['last-30-days', 'Last 30 days'],
  ['last-12-months', 'Last 12 months'],
  ['this-year', 'This year'],
  ['last-year', 'Last year'],
  ['before-last-year', 'Before last year'],
] as const;

export interface Bounds {
  from?: number; // seconds since the epoch, inclusive
  to?: number;
}

// What a search can compare is held in 32 bits.
export const LATEST_SECOND = 2 ** 31 - 1;
const EARLIEST_SECOND = -(2 ** 31);

// Undefined for what is neither a word nor a pair of days.
export function timeBounds(value: string, now: Date): Bounds | undefined {
  if (value === '') return {};
  const days = wordDays(value, now) ?? customDays(value);
  if (!days) return undefined;
  const bounds: Bounds = {};
  if (days.from) bounds.from = clamp(days.from.getTime() / 1000);
  if (days.to) {
    // The second before the next day; days are not all of the same length.
    const next = new Date(days.to);
    next.setDate(next.getDate() + 1);
    bounds.to = clamp(next.getTime() / 1000 - 1);
  }
  return bounds;
}

interface Days {
  from?: Date;
  to?: Date;
}

function wordDays(word: string, now: Date): Days | undefined {
  const y = now.getFullYear();
  const m = now.getMonth();
  const d = now.getDate();
  switch (word) {
    case 'today':
      return { from: new Date(y, m, d) };
    case 'yesterday':
      return { from: new Date(y, m, d - 1), to: new Date(y, m, d - 1) };
    case 'last-7-days':
      return { from: new Date(y, m, d - 6) };
    case 'last-30-days':
      return { from: new Date(y, m, d - 29) };
    case 'last-12-months':
      return { from: new Date(y - 1, m, d) };
    case 'this-year':
      return { from: new Date(y, 0, 1) };
    case 'last-year':
      return { from: new Date(y - 1, 0, 1), to: new Date(y - 1, 11, 31) };
    case 'before-last-year':
      return { to: new Date(y - 2, 11, 31) };
    default:
      return undefined;
  }
}

function customDays(value: string): Days | undefined {
  const match = /^(\d{4}-\d\d-\d\d)?\.\.(\d{4}-\d\d-\d\d)?$/.exec(value);
  if (!match) return undefined;
  const from = parseDay(match[1]);
  const to = parseDay(match[2]);
  if ((match[1] && !from) || (match[2] && !to)) return undefined;
  return { from, to };
}

function parseDay(text: string | undefined): Date | undefined {
  if (!text) return undefined;
  const [y, m, d] = text.split('-').map(Number) as [number, number, number];
  const day = new Date(y, m - 1, d);
  day.setFullYear(y); // a year below 100 would be taken for 19xx
  return day.getMonth() === m - 1 && day.getDate() === d ? day : undefined;
}

function clamp(second: number): number {
  return Math.min(Math.max(Math.floor(second), EARLIEST_SECOND), LATEST_SECOND);
}

export function dayOf(second: number): string {
  const day = new Date(second * 1000);
  return `${String(day.getFullYear()).padStart(4, '0')}-${two(day.getMonth() + 1)}-${two(day.getDate())}`;
}

// The pair of days that holds these seconds.
export function customValue(from: number | undefined, to: number | undefined): string {
  if (from === undefined && to === undefined) return '';
  return `${from === undefined ? '' : dayOf(from)}..${to === undefined ? '' : dayOf(to)}`;
}

// The two days of a "FROM..TO"; both empty for a word.
export function splitCustom(value: string): [string, string] {
  const parts = value.split('..');
  return parts.length === 2 ? [parts[0]!, parts[1]!] : ['', ''];
}

export function describeTime(value: string): string {
  const word = TIME_WORDS.find(([key]) => key === value);
  if (word) return word[1].toLowerCase();
  const [from, to] = splitCustom(value);
  if (from && to) return from === to ? `on ${from}` : `${from} to ${to}`;
  if (from) return `since ${from}`;
  return to ? `until ${to}` : 'any time';
}

export function formatTime(second: number): string {
  const time = new Date(second * 1000);
  return `${dayOf(second)} ${two(time.getHours())}:${two(time.getMinutes())}`;
}

function two(n: number): string {
  return String(n).padStart(2, '0');
}
