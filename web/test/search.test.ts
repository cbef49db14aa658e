// The life of a search against a scripted server.
import assert from 'node:assert/strict';
import { afterEach, beforeEach, test } from 'node:test';
import { NO_CRITERIA } from '../src/model/criteria.ts';
import { beginSearch } from '../src/api/client.ts';
import type { Begun, Page } from '../src/api/types.ts';
import { firstPage, Search } from '../src/state/search.ts';

type Reply = { status?: number; body: object };
type Script = Record<string, (times: number) => Reply | Promise<Reply> | 'broken'>; // by the end of the address

let asked: string[] = [];
let search: Search;
let signedOut = 0;

const data = (value: object): Reply => ({ body: { code: 0, data: value } });
const rows = (count: number) => Array.from({ length: count }, (_, i) => ({ name: `${i}`, path: `/a/${i}`, is_dir: false }));
const listing = (total: number, finished: boolean) => data({ files: rows(total), total, offset: 0, finished });
const progress = (finished: boolean, how: number, matches: number, errno?: number): Reply => ({
  body: { taskid: 't', finished, progress: how, errno, walk: { phase: 'names', matches } },
});
const HAPPY: Script = {
  searches: () => ({ body: { taskid: 't', params: {}, spans: [] } }),
  list: () => listing(3, true),
  'searches/t': () => progress(true, 1, 3),
  stop: () => data({}),
  clean: () => data({}),
};

function begin(change: Script): void {
  const script: Script = { ...HAPPY, ...change };
  asked = [];
  signedOut = 0;
  globalThis.fetch = (async (path: string) => {
    const key = Object.keys(script).find((end) => path.endsWith(end))!;
    asked.push(key);
    const reply = await script[key]!(asked.filter((one) => one === key).length);
    if (reply === 'broken') throw new TypeError('no network');
    const headers = { 'Content-Type': 'application/json', 'Retry-After': '0.01' };
    return new Response(JSON.stringify(reply.body), { status: reply.status ?? 200, headers });
  }) as typeof fetch;
  const begun = beginSearch({}, firstPage(null)) as Promise<Begun & { page?: Page }>;
  search = new Search(NO_CRITERIA, begun, null, () => {}, () => ++signedOut);
}
const count = (key: string) => asked.filter((one) => one === key).length;
const settle = () => new Promise((done) => setTimeout(done, 20));

beforeEach(() => {
  (globalThis as { document?: object }).document = { hidden: false };
});
afterEach(() => search.close());

test('how a search ends, and what is said', async () => {
  const ends: [string, Script, string, RegExp][] = [
    ['done', {}, 'done', /^$/],
    ['failed', { 'searches/t': () => progress(true, -1, 0, 407) }, 'failed', /may not read/],
    ['its worker died', { 'searches/t': () => progress(true, 0, 1) }, 'stopped', /ended early/],
    ['failed before it was listed', { 'searches/t': () => progress(true, -1, 0, 407), list: () => ({ body: { code: 600, data: null } }) }, 'failed', /may not read/],
    ['refused', { searches: () => ({ body: { code: 401 } }) }, 'failed', /could not be started/],
    ['no network', { searches: () => 'broken' }, 'failed', /does not answer/],
    ['forgotten by the server', { 'searches/t': () => ({ status: 404, body: { code: 404, error: 'x' } }) }, 'failed', /no longer has/],
    ['a lost answer', { 'searches/t': (n) => (n < 4 ? 'broken' : progress(true, 1, 3)) }, 'done', /^$/],
    ['no answer any more', { 'searches/t': () => 'broken' }, 'failed', /does not answer/],
    ['a busy server', { searches: (n) => (n < 3 ? { status: 503, body: { code: 503, error: 'busy' } } : HAPPY.searches!(n)) }, 'done', /^$/],
    ['too busy for too long', { searches: () => ({ status: 503, body: { code: 503, error: 'all is busy' } }) }, 'failed', /^All is busy\.$/],
    ['no session', { 'searches/t': () => ({ status: 401, body: { code: 401, error: 'x' } }) }, 'failed', /./],
  ];
  for (const [why, script, status, error] of ends) {
    begin(script);
    await search.run();
    await settle();
    assert.equal(search.status, status, why);
    assert.match(search.error, error, why);
    assert.equal(signedOut > 0, why === 'no session', why);
  }
});

test('what was found last is shown, though it came after the first page', async () => {
  begin({
    'searches/t': (n) => (n < 3 ? progress(false, 0, 2) : progress(true, 1, 3)),
    list: () => (search.over ? listing(3, true) : listing(2, false)),
  });
  await search.run();
  await settle();
  assert.equal(search.found, 3);
  assert.equal(search.pages.row(2)?.name, '2');
});

test('the rows that come with the begin are shown, and asked for again only where more may come', async () => {
  for (const [finished, lists] of [[true, 0], [false, 1]] as const) {
    const page = { files: rows(3), total: 3, offset: 0, finished };
    begin({
      searches: () => ({ body: { taskid: 't', params: {}, spans: [], page } }),
      'searches/t': (n) => (n < 3 ? progress(false, 0, 3) : progress(true, 1, 3)),
    });
    const over = search.run();
    await settle();
    assert.equal(search.pages.row(2)?.name, '2');
    await over;
    await settle();
    assert.equal(count('list'), lists, `finished: ${finished}`);
  }
});

test('growth shows before the end', async () => {
  let end = false;
  let found = 2;
  begin({
    'searches/t': () => progress(end, end ? 1 : 0, found),
    list: () => listing(found, end),
  });
  const over = search.run();
  await settle();
  found = 5;
  while (!search.pages.row(4)) await settle();
  assert.equal(search.status, 'running');
  end = true;
  await over;
  assert.equal(search.status, 'done');
});

test('growth shows though the page that is under way was written before it', async () => {
  let end = false;
  begin({
    'searches/t': () => progress(end, end ? 1 : 0, 2),
    list: async (n) => {
      const reply = n === 1 ? listing(0, false) : listing(2, end);
      await settle();
      return reply;
    },
  });
  const over = search.run();
  for (let i = 0; i < 20 && !search.pages.row(1); ++i) await settle();
  assert.ok(search.pages.row(1), 'the rows are shown');
  end = true;
  await over;
});

test('a search that is left leaves nothing behind, whenever that is', async () => {
  begin({ 'searches/t': () => progress(false, 0, 0) });
  const over = search.run();
  await settle();
  search.close();
  search.close();
  await over;
  assert.equal(count('clean'), 1);
  begin({});
  const early = search.run();
  await Promise.resolve();
  search.close(); // before the server has named it
  await early;
  assert.equal(count('clean'), 1);
  assert.equal(count('list'), 0);
});
