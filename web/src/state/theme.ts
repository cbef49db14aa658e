// Light, dark, or as the system says. Set before the first drawing.
import { recall, remember } from './memory.ts';

const THEMES = ['system', 'light', 'dark'] as const;
type Theme = (typeof THEMES)[number];

export function themeName(): Theme {
  const set = document.documentElement.dataset.theme ?? recall('theme');
  return THEMES.find((theme) => theme === set) ?? 'system';
}

export function applyTheme(theme: Theme = themeName()): void {
  document.documentElement.dataset.theme = theme;
}

export function nextTheme(): Theme {
  const next = THEMES[(THEMES.indexOf(themeName()) + 1) % THEMES.length]!;
  remember('theme', next);
  applyTheme(next);
  return next;
}
