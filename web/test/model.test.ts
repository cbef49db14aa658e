// The parts of the page that only compute: each table row is a case that once could go wrong.
import assert from 'node:assert/strict';
import * as fs from 'node:fs';
import { join } from 'node:path';
import { test } from 'node:test';
import { fromHash, toHash, type Address } from '../src/model/address.ts';
import { criterion, CriterionError, FIELDS, NO_CRITERIA, OTHER_PARAMS, startParams, type Criteria, type StartParams } from '../src/model/criteria.ts';
import { csvRow, jsonLine } from '../src/model/csv.ts';
import { Highlighter } from '../src/model/highlight.ts';
import { fromRecord, lookedInside, withInside } from '../src/model/history.ts';
import { formatSize } from '../src/model/size.ts';
import { pieces, visible } from '../src/model/text.ts';
import { customValue } from '../src/model/times.ts';
import type { FileRow } from '../src/api/types.ts';

// The engine's cases; `marks` is the name with what is marked in «», or null where it does not match.
test('highlighting speaks the language of the engine', () => {
  const table = fs.readFileSync(join(process.cwd(), '../tests/patterns.json'), 'utf8');
  const rows = JSON.parse(table) as { pattern: string; name: string; marks: string | null; why: string }[];
  assert.ok(rows.length > 100);
  const isOneTerm = (pattern: string) => /^[^ |!"]+$/.test(pattern);
  for (const { pattern, name, marks, why } of rows) {
    // The engine judges; only of a single term is nothing marked where it says no.
    if (marks === null && !isOneTerm(pattern)) continue;
    assert.equal(marked(pattern, name), marks ?? name, `${pattern} in ${name}: ${why}`);
  }
  for (const [pattern, why] of [
    ['regex:(', 'a broken one'],
    ['regex:(a+)+$', 'one that may run away is not tried'],
    ['regex:[[:alpha:]]', 'what is another expression to a browser'],
  ] as const) {
    assert.equal(marked(pattern, 'aaa'), 'aaa', why);
  }
  const line = new Highlighter('regex:^b.*', 'contents').ranges('a\nbc\nd');
  assert.deepEqual(line, [[2, 4]], 'contents have lines');
});

function marked(pattern: string, name: string): string {
  let text = '';
  let at = 0;
  for (const [start, end] of new Highlighter(pattern).ranges(name)) {
    text += `${name.slice(at, start)}«${name.slice(start, end)}»`;
    at = end;
  }
  return text + name.slice(at);
}

// A second of work, where a pattern that runs away takes years.
const MOST_MICROSECONDS = 1_000_000;

test('highlighting ends soon whatever the pattern', () => {
  const name = 'a'.repeat(255);
  for (const pattern of ['*a'.repeat(120) + 'b', 'a '.repeat(500), '*' + '?*'.repeat(400)]) {
    // Of the processor: what else the machine does is no fault of the page.
    const begun = process.cpuUsage();
    new Highlighter(pattern).ranges(name);
    const { user } = process.cpuUsage(begun);
    assert.ok(user < MOST_MICROSECONDS, pattern.slice(0, 20));
  }
});

test('what cannot be seen is shown as a sign', () => {
  const rows: [string, string][] = [
    ['a\nb\tc\rd', 'a\\nb\\tc\\rd'],
    ['\x1b[31mred\x7f', '\\x1B[31mred\\x7F'],
    ['\u202egnp.exe', 'U+202Egnp.exe'],
    ['zero\u200bwidth\ufeff', 'zeroU+200BwidthU+FEFF'],
    ['👩\u200d👧 שלום é', '👩\u200d👧 שלום é'],
    ['<b>&amp;"\'', '<b>&amp;"\''],
  ];
  for (const [name, shown] of rows) assert.equal(visible(name), shown);
  assert.deepEqual(pieces('a\nb', [[0, 2]]), [
    { text: 'a', marked: true, sign: false },
    { text: '\\n', marked: true, sign: true },
    { text: 'b', marked: false, sign: false },
  ]);
});

test('an address repeats its search, whatever it holds', () => {
  const address: Address = {
    criteria: {
      ...NO_CRITERIA,
      pattern: 'a b&c=d#e "ü" 100%',
      folders: ['/photos/2024 & more', '/Straße'],
      kind: 'image',
      extension: 'jpg, png',
      sizeFrom: '1.5 MB',
      modified: '2026-01-01..',
      created: 'last-7-days',
      owner: 'DOM\\ann',
      contents: true,
      subfolders: false,
    },
    sort: { column: 'mtime', descending: true },
  };
  assert.deepEqual(fromHash(toHash(address)), address);
  assert.equal(fromHash(''), null);
  assert.equal(fromHash('#sort=name'), null);
  const hostile = fromHash('#q=x&in=javascript:1&in=//evil&type=exe&sort=-DROP');
  assert.deepEqual(hostile, { criteria: { ...NO_CRITERIA, pattern: 'x' }, sort: null });
});

test('sizes', () => {
  const shown: [number, string][] = [
    [0, '0 B'],
    [999, '999 B'],
    [1000, '1.0 KB'],
    [10188, '9.9 KB'],
    [10189, '10 KB'],
    [1023 * 1024, '1.0 MB'],
    [2 ** 50 * 5000, '5000 PB'],
  ];
  for (const [bytes, text] of shown) assert.equal(formatSize(bytes), text, String(bytes));
});

// The tests run in the time zone of Berlin: clocks changed on 2026-03-29 and 2026-10-25.
test('remembered times are told as what holds the same seconds', () => {
  const midnight = (day: string) => new Date(`${day}T00:00`).getTime() / 1000;
  const first = midnight('2026-03-29');
  const rows: [number | undefined, number | undefined, string | null][] = [
    [undefined, undefined, ''],
    [first, first + 23 * 3600 - 1, '2026-03-29..2026-03-29'],
    [first, midnight('2026-10-26') - 1, '2026-03-29..2026-10-25'],
    [undefined, midnight('2026-10-26') - 1, '..2026-10-25'],
    [first, first + 24 * 3600 - 1, `${first}..${first + 24 * 3600 - 1}`], // days of another zone
    [first + 60, undefined, `${first + 60}..`],
    [-(2 ** 31), 2 ** 31 - 1, ''],
    [1500, undefined, null], // would be read as a year
    [-10_000_001, undefined, null],
  ];
  for (const [from, to, text] of rows) assert.equal(customValue(from, to), text, `${from}..${to}`);
});

// As the server reads what is typed; only of sizes and times it knows more.
async function understand(asked: StartParams) {
  const { mtime, crtime, atime, ...params } = asked;
  const seconds = (day: string, days: number) => {
    const date = new Date(`${day}T00:00`);
    date.setDate(date.getDate() + days);
    return date.getTime() / 1000;
  };
  for (const [name, value] of Object.entries({ mtime, crtime, atime })) {
    const [from, to] = String(value ?? '..').split('..') as [string, string];
    if (from) params[`${name}_from`] = seconds(from, 0);
    if (to) params[`${name}_to`] = seconds(to, 1) - 1;
  }
  for (const name of ['size_from', 'size_to']) {
    const [number, unit] = String(params[name]).split(' ');
    if (params[name] !== undefined) params[name] = Number(number) * (unit === 'GB' ? 2 ** 30 : 1);
  }
  return { params };
}

test('what a search is started with', async () => {
  const full: Criteria = { ...NO_CRITERIA, pattern: ' x ', folders: ['/c'], kind: 'image', sizeTo: ' 1 KB ', modified: '2 weeks', contents: true };
  const asked = { pattern: ' x ', filetype: 'image', size_to: '1 KB', mtime: '2 weeks', search_content: true, recursive: true };
  const same = async (query: StartParams) => ({ params: query });
  assert.deepEqual(await startParams(full, ['/a'], same), { ...asked, folder_path: ['/c'], search_type: 'advance' }, 'as typed');
  const plain = { ...NO_CRITERIA, pattern: 'x' };
  assert.deepEqual(await startParams(plain, ['/a', '/b'], same), {
    folder_path: ['/a', '/b'],
    pattern: 'x',
    recursive: true,
    search_content: false,
    search_type: 'simple',
  });
  for (const [criterion, field] of [['pattern', 'pattern'], ['size_to', 'sizeTo'], ['atime', 'accessed'], ['owner', 'owner'], ['news', 'pattern']] as const) {
    const wrong = async () => ({ wrong: { criterion, sentence: "'x' is wrong" } });
    const told = (error: unknown) => error instanceof CriterionError && error.field === field && error.message === "'x' is wrong.";
    await assert.rejects(startParams(plain, ['/a'], wrong), told, criterion);
  }
  await assert.rejects(startParams(plain, [], same), CriterionError);
  await assert.rejects(startParams({ ...full, pattern: ' ' }, ['/a'], same), CriterionError);
});

// What the server remembers of a search that was started with these parameters, as docs/api.md says.
function remembered(params: Record<string, unknown>): Record<string, unknown> {
  const { search_content: _c, search_type: _t, ...record } = params;
  for (const name of ['owner', 'group']) if (record[name]) record[name] = '1026';
  return record;
}

test('the history gives back what was searched, or nothing', async () => {
  const asked: Partial<Criteria>[] = [
    {},
    { contents: true },
    { kind: 'image', contents: true },
    { kind: 'image' },
    { extension: 'jpg' },
    { sizeFrom: '1500', sizeTo: '2 GB' },
    { modified: '2026-01-01..2026-01-31' },
    { created: '..2026-01-31' },
    { accessed: '2026-01-01..' },
    { subfolders: false },
    { owner: 'ann' },
    { group: 'staff' },
  ];
  const fields = new Set<string>(asked.flatMap((change) => Object.keys(change)));
  assert.deepEqual(FIELDS.filter((field) => !fields.has(field)), [], 'every criterion has a row here');
  for (const change of asked) {
    const criteria = { ...NO_CRITERIA, pattern: 'x', ...change };
    const params = await startParams(criteria, ['/a', '/b'], understand);
    const kind = params.search_type as 'simple' | 'advance';
    const patterns = withInside('y', criteria);
    const repeated = fromRecord(remembered(params), kind, ['/b', '/a'], (one) => lookedInside(patterns, one));
    const isId = 'owner' in change || 'group' in change;
    assert.deepEqual(repeated, isId ? null : criteria, JSON.stringify(change));
  }
  assert.equal(withInside('x\ny', { ...NO_CRITERIA, pattern: 'x', kind: 'file' }), 'y', 'no longer');
  assert.equal(withInside('x\ny', { ...NO_CRITERIA, pattern: 'x' }), 'x\ny', 'the other history');
  const never = () => false;
  const folders = (folder_path: unknown) => fromRecord({ pattern: 'x', folder_path }, 'simple', ['/a'], never)?.folders;
  assert.deepEqual(folders(['/a', '/b']), ['/a', '/b']);
  assert.deepEqual(folders('/a,/c'), ['/a', '/c']);
  for (const broken of [{}, { pattern: '' }, { pattern: 3 }, { pattern: 'x', color: 'red' }, { pattern: 'x', filetype: 'exe' }]) {
    assert.equal(fromRecord(broken, 'simple', [], never), null, JSON.stringify(broken));
  }
});

test('the page sends, and knows from the history, every parameter that the documents name', () => {
  const api = fs.readFileSync(join(process.cwd(), '../docs/api.md'), 'utf8');
  const start = /^### start\n([^]*?)^### /m.exec(api)![1]!;
  const table = /\| parameter \|.*\n\|[-|]+\n((?:\|.*\n)+)/.exec(start)![1]!;
  const documented = table.trim().split('\n').flatMap((row) => [...row.split('|')[1]!.matchAll(/`(\w+)`/g)].map((m) => m[1]!));
  const known = [...OTHER_PARAMS, ...FIELDS.flatMap((field) => criterion(field).params)];
  assert.deepEqual([...known].sort(), [...documented].sort());
});

test('exports are safe to open', () => {
  const row: FileRow = { name: '=1+1', path: '/a/=1+1', is_dir: false, size: 0, time: { mtime: 1, atime: 0, ctime: 0, crtime: 0 } };
  const name = (text: string) => csvRow({ ...row, name: text }).split(',').slice(1, -6).join(',');
  const rows: [string, string][] = [
    ['=1+1', "'=1+1"],
    ['@x', "'@x"],
    ['-1', "'-1"],
    ['+1', "'+1"],
    ['\t=1', "'\t=1"],
    ['a"b,c', '"a""b,c"'],
    ['a\nb', '"a\nb"'],
    ['\n=1', '"\'\n=1"'],
    ['plain', 'plain'],
  ];
  for (const [text, cell] of rows) assert.equal(name(text), cell, JSON.stringify(text));
  assert.equal(csvRow(row), "/a/=1+1,'=1+1,file,0,1970-01-01T00:00:01Z,,,\r\n");
  assert.deepEqual(JSON.parse(jsonLine({ ...row, name: 'a\nb' })).name, 'a\nb');
  assert.equal(jsonLine({ ...row, name: 'a\nb' }).split('\n').length, 2);
});
