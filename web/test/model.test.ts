// The parts of the page that only compute: each table row is a case that once could go wrong.
import assert from 'node:assert/strict';
import * as fs from 'node:fs';
import { join } from 'node:path';
import { test } from 'node:test';
import { fromHash, toHash, type Address } from '../src/model/address.ts';
import { begun, contentsOf, criterion, CriterionError, FIELDS, NO_CRITERIA, type Criteria, type StartParams } from '../src/model/criteria.ts';
import { csvRow, jsonLine } from '../src/model/csv.ts';
import { Highlighter } from '../src/model/highlight.ts';
import { smallPicture } from '../src/model/exif.ts';
import { excludesOf, withExclude, withoutExclude } from '../src/model/excludes.ts';
import { addressOf, offered, titleOf } from '../src/model/history.ts';
import { formatSize } from '../src/model/size.ts';
import { pieces, visible } from '../src/model/text.ts';
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

test('what a search is started with', async () => {
  const full: Criteria = { ...NO_CRITERIA, pattern: ' x ', folders: ['/c'], kind: 'image', sizeTo: ' 1 KB ', modified: '2 weeks', contents: true };
  const asked = { pattern: ' x ', filetype: 'image', size_to: '1 KB', mtime: '2 weeks', search_content: true, recursive: true };
  const same = async (query: StartParams) => ({ params: query });
  const startParams = async (c: Criteria, folders: string[], begin: Parameters<typeof begun>[2]) => ((await begun(c, folders, begin)) as { params?: object }).params;
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
    const wrong = async () => ({ wrong: { criterion, sentence: "'x' is wrong" } }) as const;
    const told = (error: unknown) => error instanceof CriterionError && error.field === field && error.message === "'x' is wrong.";
    await assert.rejects(startParams(plain, ['/a'], wrong), told, criterion);
  }
  await assert.rejects(startParams(plain, [], same), CriterionError);
  await assert.rejects(startParams({ ...full, pattern: ' ' }, ['/a'], same), CriterionError);
});

test('what is left out is a term of the query, put in and taken out', () => {
  const rows: [string, string[], string, string][] = [
    // pattern, what it leaves out, with .git, without a
    ['', [], 'exclude:.git', ''],
    ['plan', [], 'plan exclude:.git', 'plan'],
    ['plan exclude:a', ['a'], 'plan exclude:a exclude:.git', 'plan'],
    ['exclude:a plan', ['a'], 'exclude:a plan exclude:.git', 'plan'],
    ['EXCLUDE:a,.git x', ['a', '.git'], 'EXCLUDE:a,.git x', 'exclude:.git x'],
    ['exclude:"a b",a x', ['"a b"', 'a'], 'exclude:"a b",a x exclude:.git', 'exclude:"a b" x'],
    ['"say exclude:a"', [], '"say exclude:a" exclude:.git', '"say exclude:a"'],
    ['exclude:a\\,b', ['a\\,b'], 'exclude:a\\,b exclude:.git', 'exclude:a\\,b'],
  ];
  for (const [pattern, names, more, less] of rows) {
    assert.deepEqual(excludesOf(pattern), names, pattern);
    assert.equal(withExclude(pattern, '.git'), more, pattern);
    assert.equal(withoutExclude(pattern, 'a'), less, pattern);
  }
});

test('the small picture of a photo is found, and nothing beyond the bytes there are', () => {
  // A JPEG with another block before the one that counts; `little`: the order of bytes in that.
  const photo = (little: boolean, from: number, length: number) => {
    const tiff = Buffer.alloc(64);
    const short = (at: number, n: number) => (little ? tiff.writeUInt16LE(n, at) : tiff.writeUInt16BE(n, at));
    const long = (at: number, n: number) => (little ? tiff.writeUInt32LE(n, at) : tiff.writeUInt32BE(n, at));
    tiff.write(little ? 'II' : 'MM');
    long(4, 8); // the first directory: nothing in it, and where the next is
    long(10, 14);
    short(14, 2);
    [[0x0201, from], [0x0202, length]].forEach(([tag, value], i) => (short(16 + 12 * i, tag!), long(24 + 12 * i, value!)));
    Buffer.from([0xff, 0xd8, 7, 7, 0xff, 0xd9]).copy(tiff, 50);
    const exif = Buffer.concat([Buffer.from('Exif\0\0'), tiff]);
    return Buffer.concat([Buffer.from([0xff, 0xd8, 0xff, 0xe0, 0, 4, 1, 1, 0xff, 0xe1, 0, exif.length + 2]), exif, Buffer.from([0xff, 0xda])]);
  };
  const rows: [string, Buffer, number | null][] = [
    ['little-endian', photo(true, 50, 6), 6],
    ['big-endian', photo(false, 50, 6), 6],
    ['longer than what there is', photo(true, 50, 60), null],
    ['far away', photo(true, 2 ** 32 - 1, 6), null],
    ['no picture there', photo(true, 20, 6), null],
    ['empty', photo(true, 50, 0), null],
    ['no JPEG', Buffer.from('GIF89a'), null],
  ];
  for (const [why, bytes, length] of rows) assert.equal(smallPicture(bytes)?.length ?? null, length, why);
  const whole = photo(false, 50, 6);
  for (let cut = 0; cut < whole.length; ++cut) smallPicture(whole.subarray(0, cut));
  for (let at = 0; at < whole.length; ++at) {
    for (const value of [0, 0xff]) smallPicture(Buffer.from(whole.map((byte, i) => (i === at ? value : byte))));
  }
});

test('past searches are offered as they were asked for, the pinned first', () => {
  const asked: Criteria = { ...NO_CRITERIA, pattern: 'x', folders: ['/a/b'], contents: true, modified: 'last-7-days', owner: 'ann', subfolders: false };
  const of = (change: Partial<Criteria>) => addressOf({ ...NO_CRITERIA, ...change });
  const past = [
    { at: 5, search: of({ pattern: 'news' }) },
    { at: 4, search: addressOf(asked) },
    { at: 3, search: of({ pattern: 'terminal', folders: ['/tmp'] }) },
    { at: 2, search: 'no address' },
    { at: 1, search: of({ kind: 'image' }), name: 'Pictures' },
  ];
  const list = offered(past, ['/a', '/home']);
  assert.deepEqual(list.map(titleOf), ['Pictures', 'news', 'x']);
  assert.deepEqual(list[2]!.criteria, asked, 'relative days and contents are kept');
  for (const blank of [{}, { pattern: ' ' }, contentsOf('/a'), { folders: ['/a'] }]) {
    assert.equal(of(blank), '', JSON.stringify(blank));
  }
});

test('the page sends every parameter that the documents name', () => {
  const api = fs.readFileSync(join(process.cwd(), '../docs/api.md'), 'utf8');
  const start = /^### start\n([^]*?)^### /m.exec(api)![1]!;
  const table = /\| parameter \|.*\n\|[-|]+\n((?:\|.*\n)+)/.exec(start)![1]!;
  const documented = table.trim().split('\n').flatMap((row) => [...row.split('|')[1]!.matchAll(/`(\w+)`/g)].map((m) => m[1]!));
  const known = ['folder_path', 'pattern', 'search_type', ...FIELDS.flatMap((field) => criterion(field).params)];
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
