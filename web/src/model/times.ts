// Times as they are offered and told. What a time criterion holds is whatever the server reads as
// one (docs/query.md): the page only makes texts of what is chosen, and never reckons with them.
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

export function dayOf(second: number): string {
  const day = new Date(second * 1000);
  return `${String(day.getFullYear()).padStart(4, '0')}-${two(day.getMonth() + 1)}-${two(day.getDate())}`;
}

// What a search can compare is held in 32 bits; beyond them there is no bound.
const LATEST_SECOND = 2 ** 31 - 1;
const EARLIEST_SECOND = -(2 ** 31);
const FEWEST_DIGITS = 5; // of a second; fewer are a year

// What holds exactly these seconds: a pair of days where they are whole days here, otherwise the
// seconds themselves, which mean the same wherever the server is. Null where no text does.
export function customValue(from: number | undefined, to: number | undefined): string | null {
  if (from !== undefined && from <= EARLIEST_SECOND) from = undefined;
  if (to !== undefined && to >= LATEST_SECOND) to = undefined;
  if (from === undefined && to === undefined) return '';
  const midnight = (second: number) => new Date(second * 1000).toTimeString().startsWith('00:00:00');
  const whole = (from === undefined || midnight(from)) && (to === undefined || midnight(to + 1));
  const ends = [from, to].map((second) => (second === undefined ? '' : whole ? dayOf(second) : String(second)));
  const told = ends.every((end) => end === '' || (end.length >= FEWEST_DIGITS && !end.startsWith('-')));
  return told ? ends.join('..') : null;
}

// A day as a calendar's field takes it.
export function isDay(text: string): boolean {
  return /^\d{4}-\d\d-\d\d$/.test(text);
}

// The two days of a "FROM..TO"; both empty for a word.
export function splitCustom(value: string): [string, string] {
  const parts = value.split('..');
  return parts.length === 2 ? [parts[0]!, parts[1]!] : ['', ''];
}

export function describeTime(value: string): string {
  const word = TIME_WORDS.find(([key]) => key === value);
  if (word) return word[1].toLowerCase();
  const [from, to] = splitCustom(value).map(shown) as [string, string];
  if (from && to) return from === to ? `on ${from}` : `${from} to ${to}`;
  if (from) return `since ${from}`;
  return to ? `until ${to}` : value;
}

function shown(end: string): string {
  return /^\d{5,}$/.test(end) ? formatTime(Number(end)) : end;
}

export function formatTime(second: number): string {
  const time = new Date(second * 1000);
  return `${dayOf(second)} ${two(time.getHours())}:${two(time.getMinutes())}`;
}

function two(n: number): string {
  return String(n).padStart(2, '0');
}
