// Light, dark, or as the system says. Kept in the browser, and set before the first drawing.
const KEY = 'arbory.theme';
const THEMES = ['system', 'light', 'dark'] as const;
type Theme = (typeof THEMES)[number];

export function themeName(): Theme {
  try {
    return THEMES.find((theme) => theme === localStorage.getItem(KEY)) ?? 'system';
  } catch {
    return 'system'; // storage may be closed to the page
  }
}

export function applyTheme(theme: Theme = themeName()): void {
  document.documentElement.dataset.theme = theme;
}

export function nextTheme(): Theme {
  const next = THEMES[(THEMES.indexOf(themeName()) + 1) % THEMES.length]!;
  try {
    localStorage.setItem(KEY, next);
  } catch {
    // Then it lasts as long as the page.
  }
  applyTheme(next);
  return next;
}
