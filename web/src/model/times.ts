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

// A day as a calendar's field takes it.
export function isDay(text: string): boolean {
  return /^\d{4}-\d\d-\d\d$/.test(text);
}

// The two days of a "FROM..TO"; both empty for a word.
export function splitCustom(value: string): [string, string] {
  const parts = value.split('..');
  return parts.length === 2 ? [parts[0]!, parts[1]!] : ['', ''];
}

export function formatTime(second: number): string {
  const time = new Date(second * 1000);
  return `${dayOf(second)} ${two(time.getHours())}:${two(time.getMinutes())}`;
}

function two(n: number): string {
  return String(n).padStart(2, '0');
}
