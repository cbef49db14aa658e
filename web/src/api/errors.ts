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
  405: 'There is no such owner or group any more. Check the spelling.',
  407: 'You may not read these folders. Choose others, or ask their owner for access.',
  408: 'These folders are no longer there. Choose others.',
  418: 'The folders or a criterion could not be understood. A folder begins with the name of a share: /photos/2026.',
};

const STORE = 401;

export function walkFailure(code: number): string {
  return WALK_FAILURES[code] ?? `The search failed on the server (error ${code}). Try again.`;
}

// Of the server's own words.
export function asSentence(words: string): string {
  const text = words.slice(0, 1).toUpperCase() + words.slice(1);
  return /[.!?]$/.test(text) ? text : text + '.';
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
