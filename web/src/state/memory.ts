// What the browser keeps for this page from one visit to the next. Storage may be closed to it; then
// things last as long as the page.
const PREFIX = 'arbory.';

export function recall(name: string): string {
  try {
    return localStorage.getItem(PREFIX + name) ?? '';
  } catch {
    return '';
  }
}

export function remember(name: string, value: string): void {
  try {
    localStorage.setItem(PREFIX + name, value);
  } catch {
    // As said above.
  }
}
