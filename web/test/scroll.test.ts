import assert from 'node:assert/strict';
import { test } from 'node:test';
import { MOST_PIXELS, ScrollModel } from '../src/model/scroll.ts';
import { PAGE_ROWS, Pages } from '../src/state/pages.ts';
import type { Page } from '../src/api/types.ts';

const ROW = 30;
const VIEW = 600;

// A browser's scroll bar: what it is set to is cut to what the element allows.
class Bar {
  readonly model = new ScrollModel();
  at = 0;
  constructor(readonly rows: number) {
    this.model.resize({ rows, rowHeight: ROW, viewport: VIEW });
  }
  move(to: number): void {
    const at = Math.min(Math.max(to, 0), Math.max(0, this.model.height - VIEW));
    if (at === this.at) return;
    this.at = at;
    this.model.scrolled(at);
    this.check();
  }
  settle(): void {
    const first = this.model.placeOf(this.model.first) - this.at;
    const row = this.model.first;
    this.at = this.model.settle();
    assert.equal(this.model.first, row);
    assert.equal(this.model.placeOf(row) - this.at, first, 'settling moves no row on the screen');
    this.check();
  }
  check(): void {
    const { model } = this;
    assert.ok(model.height <= MOST_PIXELS);
    assert.ok(model.first >= 0 && model.last < this.rows);
    for (const row of [model.first, model.last]) {
      const place = model.placeOf(row) - this.at;
      assert.ok(place > -ROW && place < VIEW, `row ${row} is seen at ${place}`);
    }
  }
}

test('every row of any table can be reached', () => {
  for (const rows of [1, 19, 20, 21, 1000, MOST_PIXELS / ROW, 1_000_000, 30_000_000]) {
    const bar = new Bar(rows);
    bar.move(MOST_PIXELS);
    assert.equal(bar.model.last, rows - 1, `dragged to the end of ${rows}`);
    bar.move(0);
    assert.equal(bar.model.first, 0);
    for (const row of [0, rows >> 1, rows - 1]) {
      bar.model.reveal(row);
      bar.settle();
      assert.ok(row >= bar.model.first && row <= bar.model.last, `${row} of ${rows} is revealed`);
    }
  }
});

test('small movements pass no row over, to both ends of a scaled table', () => {
  const bar = new Bar(1_000_000);
  bar.model.reveal(999_000);
  bar.settle();
  let last = bar.model.last;
  for (let i = 0; i < 5000 && bar.model.last < 999_999; ++i) {
    bar.move(bar.at + 97);
    assert.ok(bar.model.last - last <= 4, `from ${last} to ${bar.model.last}`);
    last = bar.model.last;
    if (i % 10 === 0) bar.settle();
  }
  assert.equal(last, 999_999);
  bar.model.reveal(900);
  bar.settle();
  let first = bar.model.first;
  for (let i = 0; i < 5000 && bar.model.first > 0; ++i) {
    bar.move(bar.at - 97);
    assert.ok(first - bar.model.first <= 4);
    first = bar.model.first;
    if (i % 10 === 0) bar.settle();
  }
  assert.equal(first, 0);
});

const page = (offset: number, limit: number, total: number, finished = true): Page => ({
  files: Array.from({ length: Math.max(0, Math.min(limit, total - offset)) }, (_, i) => ({
    name: String(offset + i),
    path: '/s/' + (offset + i),
    is_dir: false,
  })),
  total,
  offset,
  finished,
});
const turn = () => new Promise((done) => setTimeout(done, 0));

test('only pages that are seen are fetched, two at a time', async () => {
  const asked: number[] = [];
  const answers: (() => void)[] = [];
  const total = 1_000_000;
  const pages = new Pages(
    (offset, limit) => {
      asked.push(offset / PAGE_ROWS);
      return new Promise((done) => answers.push(() => done(page(offset, limit, total))));
    },
    () => {},
    (error) => assert.fail(String(error)),
  );
  pages.open();
  pages.show(0, 20);
  assert.deepEqual(asked, [0]);
  answers.shift()!();
  await turn();
  assert.deepEqual(asked, [0, 1]); // ahead of the reader
  for (let row = 1000; row <= 900_000; row += 1000) pages.show(row, row + 20);
  assert.equal(asked.length, 3, 'a drag waits for what is under way');
  while (answers.length > 0) {
    answers.shift()!();
    await turn();
  }
  assert.ok(asked.length < 10 && asked.includes(4500), String(asked));
  assert.equal(pages.row(900_000)?.name, '900000');
  assert.equal(pages.row(500_000), undefined);
});

test('growth fetches again what may have changed; a new order shows the old until it is there', async () => {
  let total = 250;
  let finished = false;
  let fetched = 0;
  const pages = new Pages(
    async (offset, limit) => (++fetched, page(offset, limit, total, finished)),
    () => {},
    (error) => assert.fail(String(error)),
  );
  pages.open();
  pages.show(0, 249);
  await turn();
  total = 300;
  fetched = 0;
  pages.grown(300, true);
  await turn();
  assert.equal(fetched, 1, 'a full page in found order stays as it is');
  assert.equal(pages.row(299)?.name, '299');
  fetched = 0;
  pages.grown(300, false);
  await turn();
  assert.equal(fetched, 2);
  total = 10;
  finished = true;
  pages.renew();
  assert.equal(pages.row(299)?.name, '299');
  await turn();
  assert.equal(pages.row(299), undefined);
  assert.equal(pages.total, 10, 'the end says how many there are');
});
