// The parts of the page that only compute: each table row is a case that once could go wrong.
import assert from 'node:assert/strict';
import { test } from 'node:test';
import { fromHash, toHash, type Address } from '../src/model/address.ts';
import { begun, contentsOf, CriterionError, NO_CRITERIA, type Criteria, type StartParams } from '../src/model/criteria.ts';
import { csvRow, jsonLine } from '../src/model/csv.ts';
import { Highlighter } from '../src/model/highlight.ts';
import { smallPicture } from '../src/model/exif.ts';
import { addressOf, offered, titleOf } from '../src/model/history.ts';
import { movedTo, painted, withTerm, without, type Query, type Span, type Word } from '../src/model/query.ts';
import { formatSize } from '../src/model/size.ts';
import { onlyInText, shownTerm, shownValue, sizeBetween, sizeEnds, written } from '../src/model/terms.ts';
import { pieces, visible } from '../src/model/text.ts';
import type { FileRow } from '../src/api/types.ts';

test('expressions that a browser reads otherwise, or that may run away, mark nothing', () => {
  const rows: [string, string][] = [
    ['(', 'a broken one'],
    ['(a+)+$', 'one that may run away is not tried'],
    ['[[:alpha:]]', 'what is another expression to a browser'],
  ];
  for (const [text, why] of rows) assert.deepEqual(new Highlighter([{ text, as: 'regex' }]).ranges('aaa'), [], why);
  const line = new Highlighter([{ text: '^b.*', as: 'regex' }], 'contents').ranges('a\nbc\nd');
  assert.deepEqual(line, [[2, 4]], 'contents have lines');
});

// A second of work, where a pattern that runs away takes years.
const MOST_MICROSECONDS = 1_000_000;

test('highlighting ends soon whatever the pattern', () => {
  const name = 'a'.repeat(255);
  const words: Word[][] = [
    [{ text: '*a'.repeat(120) + 'b', as: 'glob' }],
    Array.from({ length: 500 }, () => ({ text: 'a', as: 'literal' })),
    [{ text: '*' + '?*'.repeat(400), as: 'glob' }],
  ];
  for (const all of words) {
    // Of the processor: what else the machine does is no fault of the page.
    const begun = process.cpuUsage();
    new Highlighter(all).ranges(name);
    const { user } = process.cpuUsage(begun);
    assert.ok(user < MOST_MICROSECONDS, all[0]!.text.slice(0, 20));
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
      pattern: 'a b&c=d#e "ü" 100% created:last-7-days',
      folders: ['/photos/2024 & more', '/Straße'],
      contents: true,
      subfolders: false,
    },
    sort: { column: 'mtime', descending: true },
  };
  assert.deepEqual(fromHash(toHash(address)), address);
  assert.equal(fromHash(''), null);
  assert.equal(fromHash('#sort=name'), null);
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
  const full: Criteria = { ...NO_CRITERIA, pattern: ' x ', folders: ['/c'], contents: true };
  const asked = { pattern: ' x ', search_content: true, recursive: true };
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
  const wrong = async () => ({ wrong: { criterion: 'pattern', sentence: "'x' is wrong" } });
  const told = (error: unknown) => error instanceof CriterionError && error.field === 'pattern' && error.message === "'x' is wrong.";
  await assert.rejects(startParams(plain, ['/a'], wrong), told);
  await assert.rejects(startParams(plain, [], same), CriterionError);
  await assert.rejects(startParams({ ...full, pattern: ' ' }, ['/a'], same), CriterionError);
});

// "kind:text" of each span; a term is found by its prefix or a word of it.
const parts = ({ text, spans }: Query) => spans.map(({ begin, end }) => text.slice(begin, end)).join(' / ');

// As the server would cut it, in so far as these tests need it.
function cut(text: string): Query {
  const spans = [...text.matchAll(/regex:.*|(!)|(\|)|"[^"]*"?|(?:(\w+):)?[^\s|!"]*(?:"[^"]*"?)?/g)].flatMap((match) => {
    const [all, , , named] = match;
    const prefix = named ?? (all.startsWith('regex:') ? 'regex' : undefined);
    if (!all.trim()) return [];
    const begin = match.index;
    const alone = text[begin - 1] !== '!';
    const span: Span = { kind: prefix ? 'prefix' : /^[!|]$/.test(all) ? 'operator' : 'text', begin, end: begin + all.length, alone };
    if (prefix) Object.assign(span, { prefix, value: begin + prefix.length + 1 });
    if (prefix === 'regex' || (all.match(/"/g) ?? []).length % 2 === 1) span.open = true;
    return [span];
  });
  return { text, spans };
}

test('colours are carried over while one types', () => {
  const rows: [string, string, string, string][] = [
    ['plan ext:jp', 'plan ext:jpg', 'plan / ext:jpg', 'at the end of a term'],
    ['plan ext:jpg', 'plans ext:jpg', 'plans / ext:jpg', 'before others'],
    ['plan ext:jpg', 'plan a ext:jpg', 'plan / ext:jpg', 'a word between'],
    ['plan ext:jpg', 'ext:jpg', 'ext:jpg', 'without the first'],
    ['plan ext:jpg', 'plan ', 'plan', 'without the last'],
    ['plan ext:jpg', 'plan ext:g', 'plan / ext:g', 'within one'],
    ['plan ext:jpg', 'x', '', 'all replaced'],
    ['plan ext:jpg', '', '', 'nothing left'],
    ['plan', 'plan b', 'plan', 'a word more'],
    ['aa', 'aaa', 'aaa', 'one of several like it'],
    ['a|b', 'ax|b', 'ax / | / b', ''],
  ];
  for (const [from, to, moved, why] of rows) assert.equal(parts(movedTo(cut(from), to)), moved, `${from} to ${to}: ${why}`);
  // Whatever becomes of a text, its pieces are the text.
  const texts = rows.flatMap(([from, to]) => [from, to]);
  for (const from of texts) {
    for (const to of texts) {
      const query = movedTo(cut(from), to);
      assert.equal(painted(query).map(({ text }) => text).join(''), to, `${from} to ${to}`);
      for (const { begin, value = begin, end } of query.spans) assert.ok(begin <= value && value <= end && end <= to.length);
    }
  }
});

test('a criterion is a term of the query, put in, changed and taken out', () => {
  const rows: [string, string, string][] = [
    // query, with ext:png, without ext
    ['', 'ext:png', ''],
    ['plan', 'plan ext:png', 'plan'],
    ['ext:jpg plan', 'ext:png plan', 'plan'],
    ['a ext:jpg b', 'a ext:png b', 'a b'],
    ['a ext:"x y"', 'a ext:png', 'a'],
    ['a !ext:jpg', 'a !ext:jpg ext:png', 'a !ext:jpg'],
    ['a regex:^b c', 'ext:png a regex:^b c', 'a regex:^b c'],
    ['a "open end', 'ext:png a "open end', 'a "open end'],
    ['a |', 'ext:png a |', 'a |'],
    ['ext:a ext:b', 'ext:a ext:png', 'ext:a'],
  ];
  for (const [text, more, less] of rows) {
    const query = cut(text);
    const changed = withTerm(query, shownTerm(query, 'ext'), 'ext', 'png');
    assert.equal(changed.text, more);
    assert.deepEqual(parts(changed), parts(cut(more)), text);
    assert.equal(shownValue(changed, 'ext'), 'png', text);
    const term = shownTerm(query, 'ext');
    const left = term ? without(query, term) : query;
    assert.equal(left.text, less);
    assert.deepEqual(parts(left), parts(cut(less)), text);
  }
  assert.deepEqual(onlyInText(cut('a ext:jpg !ext:b size:>1k size:..2k depth:1 type:link exclude:x')), ['!ext:b', 'size:>1k', 'depth:1', 'type:link']);
  const sizes: [string, [string, string] | null][] = [
    ['', ['', '']],
    ['1KB..2.5GB', ['1KB', '2.5GB']],
    ['1.5KB..', ['1.5KB', '']],
    ['..2', ['', '2']],
    ['>=1k', ['1k', '']],
    ['<=2k', ['', '2k']],
    ['>1k', null],
    ['10MB', null],
    ['..', ['', '']],
  ];
  for (const [value, ends] of sizes) assert.deepEqual(sizeEnds(value), ends, value);
  assert.equal(sizeBetween(' 1.5 KB', ''), '1.5KB..');
  assert.equal(written('ext', ' jpg,  .png'), 'jpg,.png');
  assert.equal(written('owner', 'DOM\\ann b"'), '"DOM\\ann b"');
  assert.equal(written('modified', '2 weeks'), '"2 weeks"');
});

test('an address of the time when criteria stood beside the pattern says the same', () => {
  const rows: [string, string][] = [
    ['#q=plan&type=image&ext=jpg,+png&min=1.5+MB&modified=2026-01-01..&owner=DOM%5Cann', 'type:image ext:jpg,png size:1.5MB.. modified:2026-01-01.. owner:DOM\\ann plan'],
    ['#q=&min=1k&max=2k&accessed=2+weeks', 'size:1k..2k opened:"2 weeks"'],
    ['#q=regex:^a b&group=staff', 'group:staff regex:^a b'],
    ['#q=x&in=javascript:1&in=//evil&type=exe&sort=-DROP', 'x'],
  ];
  for (const [hash, pattern] of rows) assert.deepEqual(fromHash(hash)?.criteria, { ...NO_CRITERIA, pattern }, hash);
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
  const asked: Criteria = { ...NO_CRITERIA, pattern: 'x modified:last-7-days', folders: ['/a/b'], contents: true, subfolders: false };
  const of = (change: Partial<Criteria>) => addressOf({ ...NO_CRITERIA, ...change });
  const past = [
    { at: 5, search: of({ pattern: 'news' }) },
    { at: 4, search: addressOf(asked) },
    { at: 3, search: of({ pattern: 'terminal', folders: ['/tmp'] }) },
    { at: 2, search: 'no address' },
    { at: 1, search: of({ pattern: 'type:image' }), name: 'Pictures' },
  ];
  const list = offered(past, ['/a', '/home']);
  assert.deepEqual(list.map(titleOf), ['Pictures', 'news', 'x modified:last-7-days']);
  assert.deepEqual(list[2]!.criteria, asked, 'relative days and contents are kept');
  for (const blank of [{}, { pattern: ' ' }, contentsOf('/a'), { folders: ['/a'] }]) {
    assert.equal(of(blank), '', JSON.stringify(blank));
  }
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
