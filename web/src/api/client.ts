// The server's routes as functions. Everything goes to the page's own origin.
import { ApiError, asSentence, callFailure, UNREACHABLE } from './errors.ts';
import type {
  Begun,
  FileRow,
  FoundLine,
  HistoryKind,
  InstantAnswer,
  Misses,
  Page,
  PastSearch,
  Progress,
  Read,
  Session,
  Shares,
  Started,
  Wrong,
} from './types.ts';

const SEARCH = 'NUVA.Arbory.Search/2';
const HISTORY = 'NUVA.Arbory.Search.History/1';

// A busy server says when to come back; this often it is asked again before a person is told.
const BUSY_TRIES = 4;
const BUSY_SECONDS_MOST = 5;

const wait = (ms: number) => new Promise((done) => setTimeout(done, ms));

async function request(path: string, init: RequestInit = {}): Promise<unknown> {
  for (let tries = 1; ; ++tries) {
    let response: Response;
    try {
      response = await fetch(path, { credentials: 'same-origin', cache: 'no-store', ...init });
    } catch (error) {
      if ((error as Error).name === 'AbortError') throw error;
      throw new ApiError(UNREACHABLE, 0);
    }
    const body = (await response.json().catch(() => null)) as Record<string, unknown> | null;
    if (response.ok && body) return body;
    if (response.status === 503 && tries < BUSY_TRIES) {
      const seconds = Number(response.headers.get('Retry-After')) || 1;
      await wait(Math.min(seconds, BUSY_SECONDS_MOST) * 1000);
      continue;
    }
    const mode = typeof body?.mode === 'string' ? body.mode : '';
    const code = Number(body?.code ?? 0);
    throw new ApiError(sentence(response.status, body), response.status, code, mode);
  }
}

function sentence(status: number, body: Record<string, unknown> | null): string {
  if (typeof body?.error === 'string' && body.error) return asSentence(body.error);
  return status === 503 ? 'The server is busy. Try again in a moment.' : UNREACHABLE;
}

function post(path: string, body: object, init: RequestInit = {}): Promise<unknown> {
  // Searches of a page that is gone, without a word to the server, end by themselves.
  const headers = { 'Content-Type': 'application/json', 'Arbory-Lease': '1' };
  return request(path, { method: 'POST', headers, body: JSON.stringify(body), ...init });
}

async function call<T>(api: string, method: string, params: object, init?: RequestInit) {
  const reply = (await post(`api/${api}/${method}`, params, init)) as { code: number; data: T };
  if (reply.code !== 0) throw new ApiError(callFailure(method, reply.code), 200, reply.code);
  return reply.data;
}

export const startSearch = (params: object) => call<Started>(SEARCH, 'start', params);
// Of the pattern that was typed, alone or with the place of the caret in it.
export const readQuery = (typed: { pattern: string; caret?: number }, signal: AbortSignal) =>
  post('query', typed, { signal }) as Promise<Read>;
export const instant = (typed: object, signal: AbortSignal) =>
  request(`instant?${new URLSearchParams({ params: JSON.stringify(typed) })}`, {
    signal,
  }) as Promise<InstantAnswer>;
export const nearMisses = (taskid: string, params: object) =>
  post(`searches/${encodeURIComponent(taskid)}/misses`, params) as Promise<Misses>;
export const stopSearch = (taskid: string) => call<null>(SEARCH, 'stop', { taskid: [taskid] });
// Outlives the page, so that leaving it leaves nothing behind.
export const cleanSearch = (taskid: string) =>
  call<object>(SEARCH, 'clean', { taskid: [taskid] }, { keepalive: true });
export const searchProgress = (taskid: string) =>
  request(`searches/${encodeURIComponent(taskid)}`) as Promise<Progress>;

export interface ListOrder {
  sort_by?: string;
  sort_direction?: 'ASC' | 'DESC';
  pattern?: string;
}
export interface ListParams extends ListOrder {
  taskid: string;
  offset: number;
  limit: number;
}

const ADDITIONAL = ['size', 'owner', 'time', 'type'];

export async function listResults(params: ListParams, signal?: AbortSignal): Promise<Page> {
  const asked = { additional: ADDITIONAL, ...params };
  return whole(await call<Partial<Page>>(SEARCH, 'list', asked, { signal }), params.offset);
}

function whole(page: Partial<Page>, offset: number): Page {
  return { files: [], total: 0, offset, finished: true, ...page };
}

// Begins a search of what was typed, and lists its first rows by the way.
export async function beginSearch(
  typed: object,
  list: Omit<ListParams, 'taskid' | 'offset'>,
): Promise<(Begun & { page?: Page }) | Wrong> {
  const body = { ...typed, list: { additional: ADDITIONAL, ...list } };
  const reply = (await post('searches', body)) as Begun | Wrong | { code: number };
  if ('code' in reply) throw new ApiError(callFailure('start', reply.code), 200, reply.code);
  if ('wrong' in reply) return reply;
  const { page, ...begun } = reply;
  return { ...begun, ...(page && { page: whole(page, 0) }) };
}

type Past = Promise<{ searches: PastSearch[] }>;
export const getPast = () => request('past') as Past;
// Outlives the page too: a search whose page was left at once is remembered.
export const changePast = (change: { add: string } | { pin: string; name: string } | { remove: string } | { clear: true }) =>
  post('past', change, { keepalive: true }) as Past;
// The histories that other clients read, into which the searches of the page go too.
export const clearHistory = (search_type: HistoryKind) =>
  call<null>(HISTORY, 'delete', { search_type });

export const getSession = () => request('session') as Promise<Session>;
export const getShares = () => request('shares') as Promise<Shares>;
export const logIn = (user: string, password: string) => post('login', { user, password });
export const logOut = () => post('logout', { stop_searches: true });

type Listed = Pick<FileRow, 'path' | 'path_encoded'>;

// Where a listed file is fetched from.
export function fileAddress({ path, path_encoded }: Listed, preview = false): string {
  const segments = path_encoded ?? path.split('/').map(encodeURIComponent).join('/');
  return `files/${segments.replace(/^\/+/, '')}${preview ? '?preview=1' : ''}`;
}

// With `text`, what of the file is shown beside the table too.
export function foundLine(row: Listed, pattern: string, text: boolean, signal: AbortSignal): Promise<FoundLine> {
  const query = new URLSearchParams({ pattern, ...(text && { text: '1' }) });
  const address = fileAddress(row).replace(/^files/, 'lines');
  return request(`${address}?${query}`, { signal }) as Promise<FoundLine>;
}

// Whether the file can be fetched, before a browser is sent for it, which would not say why not.
// Rejects with the reason.
export async function checkFile(row: Listed): Promise<void> {
  const address = fileAddress(row);
  const init: RequestInit = { method: 'HEAD', credentials: 'same-origin', cache: 'no-store' };
  const looked = await fetch(address, init).catch(() => null);
  if (looked?.ok) return;
  // That has no words; these have.
  await request(address, { headers: { Range: 'bytes=0-0' } });
}

export function zipAddress(taskid: string, rows: string, order: ListOrder): string {
  return `searches/${encodeURIComponent(taskid)}/zip?${new URLSearchParams({ rows, ...order })}`;
}

// Why an address cannot be downloaded, as a sentence; empty when it can. A download itself tells
// nobody.
export async function refusal(address: string): Promise<string> {
  try {
    const reply = await fetch(address, { method: 'HEAD', credentials: 'same-origin', cache: 'no-store' });
    if (reply.ok) return '';
    if (reply.status === 401) throw new ApiError('', 401);
    return reply.status === 503 ? 'The server is busy. Try again in a moment.' : 'The server no longer has this. Search again.';
  } catch (error) {
    if (error instanceof ApiError) throw error;
    return UNREACHABLE;
  }
}
