// Sizes as people read them. Units are 1024-based, as the rest of the program counts. What people
// write is read by the server.
const UNITS = ['B', 'KB', 'MB', 'GB', 'TB', 'PB'];
const STEP = 1024;

// Three digits at most: "0 B", "999 B", "1.2 KB", "35 MB".
export function formatSize(bytes: number): string {
  let value = bytes;
  let unit = 0;
  while (value >= 999.5 && unit + 1 < UNITS.length) {
    value /= STEP;
    ++unit;
  }
  const digits = unit > 0 && value < 9.95 ? 1 : 0;
  return `${value.toFixed(digits)} ${UNITS[unit]}`;
}
