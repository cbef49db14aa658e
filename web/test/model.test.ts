// The parts of the page that only compute: each table row is a case that once could go wrong.
import assert from 'node:assert/strict';
import * as fs from 'node:fs';
import { join } from 'node:path';
import { test } from 'node:test';
import { fromHash, toHash, type Address } from '../src/model/address.ts';
import { criterion, CriterionError, FIELDS, NO_CRITERIA, OTHER_PARAMS, startParams, type Criteria } from '../src/model/criteria.ts';
import { csvRow, jsonLine } from '../src/model/csv.ts';
import { Highlighter } from '../src/model/highlight.ts';
import { fromRecord, lookedInside, withInside } from '../src/model/history.ts';
import { formatSize, parseSize } from '../src/model/size.ts';
import { pieces, visible } from '../src/model/text.ts';
import { customValue, timeBounds } from '../src/model/times.ts';
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
  const hostile = fromHash('#q=x&in=javascript:1&in=//evil&type=exe&modified=ever&sort=-DROP');
  assert.deepEqual(hostile, { criteria: { ...NO_CRITERIA, pattern: 'x' }, sort: null });
});

// The cases of the engine too: one table for both.
function values(): { kind: string; text: string; from?: number | string; to?: string }[] {
  return JSON.parse(fs.readFileSync(join(process.cwd(), '../tests/values.json'), 'utf8'));
}

test('sizes', () => {
  for (const { kind, text, from } of values()) {
    if (kind === 'size') assert.equal(parseSize(text), from, text);
  }
  for (const text of ['', '99999999 PB']) assert.equal(parseSize(text), undefined, text);
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
test('times', () => {
  const now = new Date(2026, 2, 31, 15, 4, 5);
  const at = (...parts: [number, number, number]) => new Date(...parts).getTime() / 1000;
  const rows: [string, object | undefined][] = [
    ['', {}],
    ['2026-03-29..2026-03-29', { from: at(2026, 2, 29), to: at(2026, 2, 29) + 23 * 3600 - 1 }],
    ['..2100-01-01', { to: 2 ** 31 - 1 }],
    ['0001-01-01..', { from: -(2 ** 31) }],
    ['last-3-days', undefined],
    ['2026-01-01', undefined],
  ];
  for (const [value, bounds] of rows) assert.deepEqual(timeBounds(value, now), bounds, value);
  const midnight = (day: string) => new Date(`${day}T00:00`).getTime() / 1000;
  for (const { kind, text, from, to } of values()) {
    if (kind !== 'time') continue;
    const bounds = from === undefined ? undefined : {
      ...(from && { from: midnight(String(from)) }),
      ...(to && { to: midnight(to) - 1 }),
    };
    assert.deepEqual(timeBounds(text, now), bounds, text);
  }
  const days = '2026-03-29..2026-10-25';
  const { from, to } = timeBounds(days, now)!;
  assert.equal(customValue(from, to), days);
});

test('what a search is started with', () => {
  const now = new Date();
  const plain = { ...NO_CRITERIA, pattern: 'x' };
  assert.deepEqual(startParams(plain, ['/a', '/b'], now), {
    folder_path: ['/a', '/b'],
    pattern: 'x',
    recursive: true,
    search_content: false,
    search_type: 'simple',
  });
  const full = { ...plain, folders: ['/c'], kind: 'image', sizeTo: '1 KB', subfolders: false };
  assert.deepEqual(startParams(full, ['/a'], now), {
    folder_path: ['/c'],
    pattern: 'x',
    filetype: 'image',
    size_to: 1024,
    recursive: false,
    search_content: false,
    search_type: 'advance',
  });
  const wrong: [object, string][] = [
    [{ sizeFrom: 'much' }, 'sizeFrom'],
    [{ sizeFrom: '2 KB', sizeTo: '1 KB' }, 'sizeTo'],
    [{ modified: '2026-02-02..2026-02-01' }, 'modified'],
    [{ contents: true, pattern: ' ' }, 'contents'],
  ];
  for (const [change, field] of wrong) {
    assert.throws(
      () => startParams({ ...plain, ...change }, ['/a'], now),
      (error) => error instanceof CriterionError && error.field === field,
      field,
    );
  }
  assert.throws(() => startParams(plain, [], now), CriterionError);
});

// What the server remembers of a search that was started with these parameters, as docs/api.md says.
function remembered(params: Record<string, unknown>): Record<string, unknown> {
  const { search_content: _c, search_type: _t, ...record } = params;
  for (const name of ['owner', 'group']) if (record[name]) record[name] = '1026';
  return record;
}

test('the history gives back what was searched, or nothing', () => {
  const now = new Date();
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
    const params = startParams(criteria, ['/a', '/b'], now);
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
