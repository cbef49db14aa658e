// Failures as sentences that say what to do. The server's own errors come with a sentence; those of
// a search are numbers.
export class ApiError extends Error {
  constructor(
    message: string,
    readonly status: number,
    readonly code = 0,
    readonly mode = '', // with a 401: how one signs in here
  ) {
    super(message);
  }
  get signedOut(): boolean {
    return this.status === 401;
  }
  // The server knows no such search: it was cleaned up, or the server's state is gone.
  get gone(): boolean {
    return this.status === 404;
  }
}

export const UNREACHABLE =
  'The server does not answer. Check the connection and that arbory is running, then try again.';

const WALK_FAILURES: Record<number, string> = {
  401: 'The search failed on the server: its disk may be full. Try again, or ask who runs it.',
  405: 'There is no such owner or group, in the criteria or behind owner: or group:. Check the spelling.',
  407: 'You may not read these folders. Choose others, or ask their owner for access.',
  408: 'These folders are no longer there. Choose others.',
  418: 'The folders or a criterion could not be understood. A folder begins with the name of a share: /photos/2026.',
};

const BAD_REGEX =
  'What follows regex: is not a complete regular expression. Check its brackets and repetitions.';
// What a value looks like behind each prefix whose values can be wrong.
const VALUES: Record<string, string> = {
  'size:': 'size:>10MB, size:1GB..2GB or size:0',
  'modified:': 'modified:today, modified:last-7-days, modified:2026-07 or modified:<2026',
  'created:': 'created:today, created:last-7-days, created:2026-07 or created:<2026',
  'opened:': 'opened:today, opened:last-7-days, opened:2026-07 or opened:<2026',
  'type:': 'type:image; there are file, dir, image, video, audio, document and archive',
  'depth:': 'depth:1 or depth:<3',
  'ext:': 'ext:jpg,png',
  'empty:': 'empty: or empty:no',
  'content:': 'content:invoice',
  'case:': 'case:README',
};
const CRITERION = 418;
const STORE = 401;

export function walkFailure(code: number, pattern: string): string {
  if (code === CRITERION) {
    if (pattern.includes('regex:')) return BAD_REGEX;
    const lowered = pattern.toLowerCase();
    const known = Object.keys(VALUES).filter((prefix) => lowered.includes(prefix));
    if (known.length > 0) {
      return `What stands behind ${known.join(' or ')} could not be understood. Write it as in ${known
        .map((prefix) => VALUES[prefix])
        .join('; ')}.`;
    }
  }
  return WALK_FAILURES[code] ?? `The search failed on the server (error ${code}). Try again.`;
}

export function callFailure(method: string, code: number): string {
  if (method === 'start') {
    return code === 400
      ? 'Choose at least one folder to search.'
      : 'The search could not be started. Too many may be running: wait a moment and try again.';
  }
  if (method === 'list') return 'The results could not be read. Search again to see them.';
  if (method === 'delete') {
    return code === STORE
      ? 'A part of the history could not be cleared: its file on the server is damaged or cannot be written. Ask who runs the server; the system log names the file.'
      : 'The history could not be cleared. Try again.';
  }
  return `The server could not do this (error ${code}). Try again.`;
}
