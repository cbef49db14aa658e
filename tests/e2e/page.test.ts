// What people do with the page, from the address that the server prints to leaving it.
import assert from 'node:assert/strict';
import * as fs from 'node:fs';
import { test } from 'node:test';
import { Tab } from './browser.ts';
import { Index } from './server.ts';
import { Stage } from './stage.ts';
import { HOSTILE, itemName, makeFiles, makeMany, MANY } from './tree.ts';

const stage = new Stage((place) => ({ files: makeFiles(place), many: makeMany(place) }));

test('without a session the page tells to open the printed address, which works', async () => {
  const tab = await Tab.open(stage.browser);
  await tab.page.goto(stage.server.origin);
  await tab.page.getByRole('heading', { name: 'Open the printed address' }).waitFor();
  await tab.page.goto(stage.server.address + '#q=plan');
  await tab.page.waitForSelector('#pattern:focus');
  assert.equal(new URL(tab.page.url()).search, '', 'the token does not stay in the address');
  stage.cookies = await tab.page.context().cookies();
  await tab.close();
});

test('a search shows what was found, marked, and how it went', async () => {
  const tab = await stage.openTab();
  const { page } = tab;
  await tab.search('PLAN !middle');
  assert.equal(await tab.count(), '3 matches'); // the folder "plans" too
  assert.deepEqual([...(await tab.names())].sort(), ['plan large.txt', 'plan small.txt', 'plans']);
  assert.equal(await page.textContent('.row mark >> nth=0'), 'plan');
  assert.match((await page.textContent('.elapsed'))!, /^\d\.\d\d s$/);
  await page.click('text=1 folder could not be read');
  await page.getByText('Ask the owner for permission').waitFor();
  await tab.close();
});

test('columns sort, and back to the order found', async () => {
  const tab = await stage.openTab('#q=plan*.txt');
  const { page } = tab;
  const order = async (column: string) => {
    await page.getByRole('columnheader', { name: column }).getByRole('button').click();
    return page.waitForFunction(() => {
      const sorted = document.querySelector('[aria-sort$=ing]');
      return sorted ? `${sorted.textContent} ${sorted.getAttribute('aria-sort')}` : 'found';
    });
  };
  const rows: [string, string][] = [
    ['Size', 'large'],
    ['Size', 'small'],
    ['Modified', 'small'],
    ['Modified', 'large'],
    ['Name', 'large'],
    ['Name', 'small'],
  ];
  for (const [column, first] of rows) {
    await order(column);
    await tab.firstIs(`plan ${first}.txt`);
  }
  assert.match(page.url(), /sort=-name/);
  await order('Name');
  await page.waitForURL((url) => !url.hash.includes('sort'));
  await tab.close();
});

test('a table of many rows is scrolled to any of them, and fetches only what is seen', async () => {
  const tab = await stage.openTab('#q=item&in=/many&sort=name');
  const { page } = tab;
  let fetched = 0;
  page.on('request', (request) => request.url().endsWith('/list') && ++fetched);
  assert.equal(await tab.count(), `${MANY.toLocaleString('en')} matches`);
  await walkTable(tab, MANY);
  assert.ok(fetched < 30, `${fetched} pages were fetched`);
  await tab.close();
});

test('so is one that is higher than a browser can lay out', async () => {
  const million = 1_000_000;
  const tab = await stage.openTab();
  // More files than a test can make: the replies tell of them, once the search has begun without any.
  await tab.page.route('**/searches', async (route) => {
    const reply = await route.fetch();
    const { page: _rows, ...begun } = await reply.json();
    await route.fulfill({ response: reply, json: begun });
  });
  await tab.page.route('**/list', async (route) => {
    const { offset, limit } = route.request().postDataJSON();
    const rows = Math.max(0, Math.min(limit, million - offset));
    const files = Array.from({ length: rows }, (_, i) => ({
      name: itemName(offset + i),
      path: '/many/' + itemName(offset + i),
      is_dir: false,
    }));
    await route.fulfill({ json: { code: 0, data: { files, total: million, offset, finished: true } } });
  });
  await tab.search('item 0000');
  await tab.page.locator('.figures strong', { hasText: '1,000,000' }).waitFor();
  await walkTable(tab, million);
  await tab.close();
});

// To the end by a key, over everything by the bar, and on by the wheel, of a table sorted by name.
async function walkTable(tab: Tab, rows: number): Promise<void> {
  const { page } = tab;
  await page.focus('.table');
  await page.keyboard.press('End');
  await page.getByText(itemName(rows - 1)).waitFor();
  await page.keyboard.press('ArrowUp');
  await page.locator('.row.active', { hasText: itemName(rows - 2) }).waitFor();
  await page.locator('.scroller').evaluate(async (element) => {
    for (const part of [1, 0.8, 0.6, 0.4, 0.2, 0, 0.25, 0.5]) {
      element.scrollTop = part * (element.scrollHeight - element.clientHeight);
      await new Promise((drawn) => requestAnimationFrame(() => requestAnimationFrame(drawn)));
    }
  });
  await page.getByText(itemName(rows / 2)).waitFor();
  const [first] = await tab.names();
  await page.hover('.scroller');
  await page.mouse.wheel(0, 300);
  const isGone = (id: string) => document.getElementById(id) === null;
  await page.waitForFunction(isGone, `row-${Number(first!.slice(5, 11))}`);
  const numbers = (await tab.names()).map((name) => Number(name.slice(5, 11)));
  assert.ok(numbers[0]! - Number(first!.slice(5, 11)) < 30, 'the wheel does not jump');
  numbers.forEach((number, i) => assert.equal(number, numbers[0]! + i, 'no row is missing'));
  assert.ok(numbers.length < 60, 'only what is seen is drawn');
}

test('a running search is stopped, and says so', async () => {
  const tab = await stage.openTab();
  const { page } = tab;
  await page.fill('#pattern', 'needle|slow');
  await page.click('text=Criteria');
  await page.check('text=Also look inside files');
  await page.press('#pattern', 'Enter');
  await page.waitForSelector('.stop');
  await page.getByText('slow', { exact: true }).first().waitFor(); // by its name, while files are read
  await page.click('.stop');
  await page.locator('.figures', { hasText: 'stopped' }).waitFor();
  assert.match(await tab.count(), /[1-9]/);
  await tab.close();
});

test('hostile names are shown as text, everywhere', async () => {
  const tab = await stage.openTab('#q=hostile+&sort=name');
  const { page } = tab;
  const names = await tab.names();
  const visible: Record<string, string> = { '\n': '\\n', '\t': '\\t', '\u202e': 'U+202E', '\x1b': '\\x1B' };
  for (const name of HOSTILE) {
    const shown = 'hostile ' + name.replace(/[\n\t\u202e\x1b]/g, (c) => visible[c]!);
    assert.ok(names.includes(shown), `${JSON.stringify(shown)} in ${names.join(' · ')}`);
  }
  assert.ok(names.some((name) => /^hostile broken \ufffd+\.txt$/.test(name)));
  for (let row = 0; row < names.length; ++row) {
    await page.click(`#row-${row}`);
    await page.locator('.details h2', { hasText: names[row]! }).waitFor();
  }
  assert.equal(await page.locator('main script, main img[src=x]').count(), 0);
  await tab.search('"<img src=x onerror=alert(2)>"');
  assert.equal(await page.textContent('.row mark >> nth=0'), '<img src=x onerror=alert(2)>');
  assert.equal(await page.title(), '"<img src=x onerror=alert(2)>" · Arbory Search');
  await page.goto(`${stage.server.origin}/#q=${encodeURIComponent('"><script>alert(4)</script>')}`);
  await page.reload();
  await tab.over();
  await page.getByText('Nothing found').waitFor();
  await tab.close();
});

test('files are previewed, downloaded and their paths copied, by keyboard', async () => {
  const tab = await stage.openTab('#q=*&in=/files/docs&sort=name', { acceptDownloads: true });
  const { page } = tab;
  await page.context().grantPermissions(['clipboard-read', 'clipboard-write']);
  await page.press('#pattern', 'ArrowDown');
  const go = async (name: string) => {
    const index = (await tab.names()).indexOf(name);
    assert.ok(index >= 0, name);
    await page.keyboard.press('Home');
    for (let i = 0; i < index; ++i) await page.keyboard.press('ArrowDown');
    await page.locator('.row.active', { hasText: name }).waitFor();
  };
  const downloaded = async () => {
    const [download] = await Promise.all([page.waitForEvent('download'), page.keyboard.press('d')]);
    return { name: download.suggestedFilename(), text: fs.readFileSync(await download.path(), 'utf8') };
  };
  await go('100% & "fine" #1.txt');
  assert.equal((await downloaded()).text, 'content of the oddly named');
  await page.keyboard.press('c');
  await page.getByText('The path is copied.').waitFor();
  assert.equal(await page.evaluate(() => navigator.clipboard.readText()), '/files/docs/100% & "fine" #1.txt');
  await go('view.png');
  await page.keyboard.press('Space');
  await page.waitForFunction(() => document.querySelector<HTMLImageElement>('.details img')?.naturalWidth === 1);
  await go('notes.txt'); // the details follow the keyboard
  await page.locator('.details pre', { hasText: 'the needle is here' }).waitFor();
  await page.keyboard.press('Escape');
  await page.locator('.details').waitFor({ state: 'detached' });
  await page.keyboard.press('/');
  await page.waitForSelector('#pattern:focus');
  await tab.close();
});

test('the whole result is saved, page by page', async () => {
  const tab = await stage.openTab('#q=item+00&in=/many&sort=name', { acceptDownloads: true });
  const { page } = tab;
  const saved = async (format: string) => {
    await page.getByRole('button', { name: 'Save result' }).click();
    const [download] = await Promise.all([
      page.waitForEvent('download'),
      page.getByRole('button', { name: format }).click(),
    ]);
    return fs.readFileSync(await download.path(), 'utf8');
  };
  const total = Number((await tab.count()).replace(/\D/g, ''));
  assert.ok(total > 4000, 'more than one page');
  const lines = (await saved('JSON lines')).trim().split('\n');
  assert.equal(new Set(lines.map((line) => JSON.parse(line).path)).size, total);
  const csv = (await saved('CSV')).split('\r\n');
  assert.equal(csv.length, total + 2); // the heading, and nothing after the last line end
  assert.match(csv[1]!, /^\/many\/f0\/item 000000\.dat,item 000000\.dat,file,0,20/);
  await tab.close();
});

test('folders are chosen from a tree', async () => {
  const tab = await stage.openTab();
  const { page } = tab;
  await page.getByRole('button', { name: 'All folders' }).click();
  await page.getByRole('button', { name: 'Folders in files' }).click();
  await page.getByRole('checkbox', { name: 'Straße' }).check();
  await page.getByRole('dialog').getByRole('button', { name: 'Search', exact: true }).click();
  await tab.over();
  assert.deepEqual(await tab.names(), ['été']);
  assert.match(decodeURIComponent(page.url()), /in=\/files\/Straße$/);
  await tab.close();
});

test('failures are sentences that say what to do', async () => {
  const rows: [string, string][] = [
    ['#q=regex%3A(', "'regex:(': missing"],
    ['#q=x+size:>1xb', 'write a size as in'],
    ['#q=x&owner=nob0dy', "There is no user 'nob0dy'"],
    ['#q=x&in=/nowhere', 'Choose others'],
    ['#q=x&in=/files/locked', 'ask their owner for access'],
  ];
  for (const [hash, sentence] of rows) {
    const tab = await stage.openTab();
    await tab.page.goto(`${stage.server.origin}/${hash}`);
    await tab.page.getByText(sentence).waitFor();
    await tab.close();
  }
  const tab = await stage.openTab();
  await tab.page.click('text=Criteria');
  await tab.search('plan');
  await tab.page.getByLabel('Size from').fill('huge');
  await tab.page.press('#pattern', 'Enter');
  await tab.page.getByText("'size:huge..': write a size as in").waitFor();
  assert.equal(await tab.page.getByLabel('Size from').getAttribute('aria-invalid'), 'true');
  assert.equal(await tab.count(), '4 matches', 'what was found before is shown still');
  // Whatever the server reads may be written.
  await tab.page.getByLabel('Size from').fill('');
  await tab.page.getByRole('combobox', { name: 'Modified' }).selectOption('As written …');
  await tab.page.getByLabel('Modified, as written').fill('2026-01-02..2026-01');
  await tab.page.press('#pattern', 'Enter');
  await tab.page.locator('.figures strong', { hasText: '2 matches' }).waitFor();
  assert.equal(await tab.page.inputValue('#pattern'), 'plan modified:2026-01-02..2026-01');
  await tab.close();
});

test('what finds nothing tells what is in the way, and what is near', async () => {
  const tab = await stage.openTab();
  await tab.search('plam ext:txt');
  await tab.page.getByText('Without plam there would be').waitFor();
  await tab.page.getByRole('button', { name: 'plan large.txt' }).click();
  await tab.page.locator('.figures strong', { hasText: '1 match' }).waitFor();
  assert.equal(await tab.page.inputValue('#pattern'), '"plan large.txt" ext:txt');
  await tab.search('plan size > 20kb');
  await tab.page.getByRole('button', { name: 'plan size:>20kb' }).click();
  await tab.page.locator('.figures strong', { hasText: '1 match' }).waitFor();
  await tab.close();
});

test('a lost session asks to sign in again', async () => {
  const tab = await stage.openTab('#q=plan');
  await tab.page.context().clearCookies();
  await tab.page.press('#pattern', 'Enter');
  await tab.page.getByRole('heading', { name: 'Open the printed address' }).waitFor();
  await tab.close();
});

test('it is usable on a phone', async () => {
  const tab = await stage.openTab('#q=plan', { viewport: { width: 390, height: 800 }, hasTouch: true, isMobile: true });
  const { page } = tab;
  assert.equal(await page.evaluate(() => document.documentElement.scrollWidth), 390);
  await page.getByLabel('Sort by').selectOption('size');
  await tab.firstIs('plan large.txt');
  await page.tap('#row-0');
  await page.getByRole('button', { name: 'Download' }).waitFor();
  await page.getByRole('button', { name: 'Close' }).tap();
  await page.tap('text=Criteria');
  assert.equal(await page.evaluate(() => document.documentElement.scrollWidth), 390);
  await tab.close();
});

test('screen readers find names, roles and contrast in order, light and dark', async () => {
  const states: [string, string, string?][] = [
    ['the start', ''],
    ['results', '#q=plan'],
    ['details', '#q=plan', '#row-0'],
    ['criteria', '#q=plan&type=file', 'text=Criteria'],
    ['the folders', '#q=plan', '.folders'],
    ['nothing found', '#q=nowhere+to+be+found'],
    ['the criteria of a query', '#q=plan+size:>1+!ext:x+exclude:.git', 'text=Criteria'],
  ];
  // What is typed, and what is to be seen then.
  const typed: [string, string, string][] = [
    ['what can be written next', 'plan si', '[role=option]'],
    ['what is wrong', 'size:1xb plan "a b" !<c|regex:d>', '.mistaken'],
  ];
  const axe = fs.readFileSync(require.resolve('axe-core/axe.min.js'), 'utf8');
  for (const colorScheme of ['light', 'dark'] as const) {
    for (const [state, hash, action] of [...states, ...typed]) {
      const tab = await stage.openTab(hash.startsWith('#') ? hash : '', { colorScheme });
      if (hash && !hash.startsWith('#')) {
        await tab.page.locator('#pattern').pressSequentially(hash);
        await tab.page.waitForSelector(action!);
      } else if (action) {
        await tab.page.click(action);
      }
      await tab.page.evaluate(axe);
      const found = await tab.page.evaluate(async () => {
        // The table scrolls by the keys of the grid around it, which has the focus.
        const rules = { 'scrollable-region-focusable': { enabled: false } };
        const { violations } = await (window as unknown as { axe: Axe }).axe.run(document, { rules });
        return violations.map(({ id, nodes }) => `${id}: ${nodes[0]!.html}`);
      });
      assert.deepEqual(found, [], `${state}, ${colorScheme}`);
      await tab.close();
    }
  }
});

interface Axe {
  run(
    root: Document,
    options: object,
  ): Promise<{ violations: { id: string; nodes: { html: string }[] }[] }>;
}

test('with an index, the best results are there while one types', async () => {
  const index = await Index.start(stage.place);
  try {
    const tab = await stage.openTab();
    const { page } = tab;
    await page.fill('#pattern', 'pla');
    await page.getByText('from the index').waitFor();
    assert.equal(await page.textContent('.figures strong'), '4 matches');
    assert.match((await tab.names())[0]!, /^plan/);
    assert.equal(new URL(page.url()).hash, '', 'nothing was searched for');
    // What is wrong for a moment takes nothing away; the newest words count.
    await page.fill('#pattern', '<pla size:>');
    await page.fill('#pattern', 'plan small');
    await page.waitForFunction(() => document.querySelector('.figures strong')?.textContent === '1 match');
    await page.keyboard.press('Enter');
    await tab.over();
    assert.match(page.url(), /#q=plan/);
    assert.deepEqual(await tab.names(), ['plan small.txt']);
    await page.fill('#pattern', '');
    await tab.firstIs('plan small.txt');
    await tab.close();
  } finally {
    await index.stop();
  }
});
