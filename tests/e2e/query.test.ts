// The query line: its colours, what it says of terms, what it offers to write, and the panel as
// another view of the same query.
import assert from 'node:assert/strict';
import * as fs from 'node:fs';
import { test } from 'node:test';
import { join } from 'node:path';
import { Highlighter } from '../../web/src/model/highlight.ts';
import { wordsOf, type Span } from '../../web/src/model/query.ts';
import type { Tab } from './browser.ts';
import { Stage } from './stage.ts';
import { makeFiles } from './tree.ts';

const stage = new Stage((place) => ({ files: makeFiles(place), photos: place.folder('photos') }));

async function openTab(hash = '', options = {}): Promise<Tab> {
  const tab = await stage.openTab(hash, options);
  await tab.page.waitForSelector('#pattern:focus');
  return tab;
}

// The pieces that have a colour, as "look:text", once that is so.
async function looks(tab: Tab, expected: string): Promise<void> {
  await tab.page.waitForFunction((wanted) => {
    const pieces = [...document.querySelectorAll('.painted span')];
    return pieces.map((one) => `${one.className.trim()}:${one.textContent}`).join(' ') === wanted;
  }, expected).catch(async (error) => {
    const pieces = await tab.page.locator('.painted span').evaluateAll((all) => all.map((one) => `${one.className.trim()}:${one.textContent}`));
    throw new Error(`${pieces.join(' ')} is not ${expected}: ${error.message}`);
  });
}

// The engine's cases; `marks` is the name with what is marked in «», or null where it does not match.
test('what is marked in a name is what the engine has found there', async () => {
  const table = fs.readFileSync(join(process.cwd(), '../tests/patterns.json'), 'utf8');
  const rows = JSON.parse(table) as { pattern: string; name: string; marks: string | null; why: string }[];
  assert.ok(rows.length > 100);
  const tab = await openTab();
  const isOneTerm = (pattern: string) => /^[^ |!"]+$/.test(pattern);
  for (const { pattern, name, marks, why } of rows) {
    // The engine judges; only of a single term is nothing marked where it says no.
    if (marks === null && !isOneTerm(pattern)) continue;
    const reply = await tab.page.request.post(`${stage.server.origin}/query`, { data: { pattern }, headers: { Origin: stage.server.origin } });
    const { spans } = (await reply.json()) as { spans: Span[] };
    let text = '';
    let at = 0;
    for (const [start, end] of new Highlighter(wordsOf(spans)).ranges(name)) {
      text += `${name.slice(at, start)}«${name.slice(start, end)}»`;
      at = end;
    }
    assert.equal(text + name.slice(at), marks ?? name, `${pattern} in ${name}: ${why}`);
  }
  await tab.close();
});

test('colours follow the text, letter by letter and wherever the field scrolls', async () => {
  const tab = await openTab();
  const { page } = tab;
  const field = page.locator('#pattern');
  await field.pressSequentially('😀 "a b"|c !ext:png regex:^x');
  await looks(tab, 'phrase:"a b" operator:| operator:! prefix:ext: value:png prefix:regex: regex:^x');
  // What is known of the rest stays while the answer to a change is on its way.
  let answer = () => {};
  const held = new Promise<void>((go) => (answer = go));
  await page.route('**/query', async (route) => {
    await held;
    await route.continue().catch(() => {});
  });
  await page.keyboard.press('Home');
  await field.pressSequentially('size:1 ');
  await looks(tab, 'phrase:"a b" operator:| operator:! prefix:ext: value:png prefix:regex: regex:^x');
  answer();
  await looks(tab, 'prefix:size: value:1 phrase:"a b" operator:| operator:! prefix:ext: value:png prefix:regex: regex:^x');
  await page.unroute('**/query');
  // The letters stand where the field has its own, however long the text is.
  await page.fill('#pattern', 'word '.repeat(60) + 'size:>1');
  await page.keyboard.press('End');
  await looks(tab, 'prefix:size: value:>1');
  const shift = () =>
    page.evaluate(() => {
      const input = document.querySelector<HTMLInputElement>('#pattern')!;
      const { left } = document.querySelector('.painted div')!.getBoundingClientRect();
      const box = document.querySelector('.painted')!.getBoundingClientRect();
      const inside = input.getBoundingClientRect().left + parseFloat(getComputedStyle(input).paddingLeft) + 1;
      return [input.scrollLeft > 0, Math.abs(left + input.scrollLeft - box.left) < 1, Math.abs(inside - box.left) < 1.5];
    });
  await page.waitForFunction(() => document.querySelector<HTMLElement>('.painted div')!.style.translate.startsWith('-'));
  assert.deepEqual(await shift(), [true, true, true]);
  await page.keyboard.press('Home');
  await page.waitForFunction(() => document.querySelector<HTMLElement>('.painted div')!.style.translate === '0px');
  assert.deepEqual(await shift(), [false, true, true]);
  await tab.close();
});

test('a term says what it asks for, and what is wrong with it is told at its place', async () => {
  const tab = await openTab();
  const { page } = tab;
  const says = page.locator('#query-says');
  const field = page.locator('#pattern');
  await field.pressSequentially('plan size:>1MB');
  await says.getByText('More than 1 MB', { exact: true }).waitFor();
  await page.locator('[role=status]', { hasText: 'More than 1 MB' }).waitFor({ state: 'attached' });
  await page.keyboard.press('Home');
  await says.getByText('“plan” in the name', { exact: true }).waitFor();
  // What is being written is no fault yet.
  await page.fill('#pattern', 'plan size:1x');
  await says.getByText('Write a size as in').waitFor();
  assert.equal(await page.locator('.mistaken').count(), 0);
  assert.equal(await field.getAttribute('aria-invalid'), 'false');
  await field.pressSequentially('b owner:nob0dy x');
  await looks(tab, 'prefix mistaken:size: value mistaken:1xb prefix mistaken:owner: value mistaken:nob0dy');
  await says.getByText('“size:1xb”: Write a size as in').waitFor();
  assert.equal(await field.getAttribute('aria-describedby'), 'query-says');
  assert.equal(await field.getAttribute('aria-invalid'), 'true');
  // At the place itself, there is its own sentence.
  await page.keyboard.press('ArrowLeft');
  await page.keyboard.press('ArrowLeft');
  await page.keyboard.press('ArrowLeft');
  await says.getByText("There is no user 'nob0dy'.", { exact: true }).waitFor();
  await page.keyboard.press('Enter');
  await page.getByRole('alert').getByText("'size:1xb': write a size").waitFor();
  // What was searched for is no longer being written.
  await page.fill('#pattern', 'size:1x');
  await says.getByText('Write a size as in').waitFor();
  await looks(tab, 'prefix:size: value:1x');
  await page.keyboard.press('Enter');
  await looks(tab, 'prefix mistaken:size: value mistaken:1x');
  await page.fill('#pattern', 'plan');
  await looks(tab, '');
  await tab.close();
});

test('what can be written next is offered, and taken by keyboard or mouse', async () => {
  const tab = await openTab();
  const { page } = tab;
  const field = page.locator('#pattern');
  const options = page.getByRole('listbox', { name: 'What can be written here' }).getByRole('option');
  const value = () => page.inputValue('#pattern');
  const type = async (text: string) => {
    await page.fill('#pattern', '');
    await field.pressSequentially(text);
  };
  // Words are left alone; of one letter it is only offered where it is asked for.
  await type('s');
  await looks(tab, '');
  await page.waitForTimeout(300);
  assert.equal(await options.count(), 0);
  await page.keyboard.press('ArrowDown');
  await options.first().waitFor();
  assert.equal(await options.count(), 1);
  assert.equal(await field.getAttribute('aria-expanded'), 'true');
  await page.keyboard.press('Escape');
  await options.first().waitFor({ state: 'detached' });
  assert.equal(await value(), 's');
  // The list stays while what follows is typed, though the answer to that has not come.
  await type('mo');
  await options.nth(1).waitFor();
  await page.route('**/query', () => {});
  await field.pressSequentially('d');
  await page.waitForFunction(() => document.querySelectorAll('[role=option]').length === 1);
  assert.equal(await options.textContent(), 'modified:when it was changed: last-7-days');
  await page.unroute('**/query');
  // Arrows and Enter; then a value, with Tab.
  await type('plan mo');
  await options.nth(1).waitFor();
  await page.keyboard.press('ArrowDown');
  await page.keyboard.press('ArrowDown');
  await page.keyboard.press('ArrowUp');
  assert.equal(await field.getAttribute('aria-activedescendant'), 'suggestion-0');
  await page.keyboard.press('Enter');
  await options.filter({ hasText: 'last-30-days' }).waitFor();
  assert.equal(await value(), 'plan modified:');
  await field.pressSequentially('last-3');
  await page.waitForFunction(() => document.querySelectorAll('[role=option]').length === 1);
  await page.keyboard.press('Tab');
  assert.equal(await value(), 'plan modified:last-30-days');
  assert.equal(await page.evaluate(() => document.activeElement?.id), 'pattern');
  await options.first().waitFor({ state: 'detached' });
  // Where nothing has been begun the key goes on its way, and Enter searches.
  await type('plan empty:');
  await options.first().waitFor();
  await page.keyboard.press('Tab');
  assert.equal(await value(), 'plan empty:');
  assert.notEqual(await page.evaluate(() => document.activeElement?.id), 'pattern');
  await type('plan type:d');
  await options.first().waitFor();
  await page.keyboard.press('Enter');
  await tab.over();
  assert.equal(await value(), 'plan type:d');
  assert.deepEqual(await tab.names(), ['plans']);
  // Owners; shares; by mouse, in the middle of a query; and undone.
  await type('owner:roo');
  await options.filter({ hasText: /^root$/ }).click();
  assert.equal(await value(), 'owner:root');
  await page.keyboard.press('Control+z');
  assert.equal(await value(), 'owner:roo');
  await type('/ph');
  await options.first().waitFor();
  await page.keyboard.press('Tab');
  assert.equal(await value(), '/photos/');
  await type('a |b');
  await page.keyboard.press('ArrowLeft');
  await page.keyboard.press('ArrowLeft');
  await page.keyboard.press('Control+Space');
  await options.filter({ hasText: 'exclude:' }).click();
  assert.equal(await value(), 'a exclude:|b');
  await tab.close();
});

test('the panel and the text are two views of one query', async () => {
  const tab = await openTab('#q=plan&type=image&min=1+KB');
  const { page } = tab;
  // What is chosen is written once the server has said what the text is made of.
  const holds = async (text: string) => {
    const written = (wanted: string) => document.querySelector<HTMLInputElement>('#pattern')!.value === wanted;
    await page.waitForFunction(written, text, { timeout: 20000 }).catch(() => undefined);
    assert.equal(await page.inputValue('#pattern'), text);
  };
  // An address of old says it in the query now.
  await holds('type:image size:1KB.. plan');
  await page.click('text=Criteria');
  await page.locator('input[type=radio]:checked').and(page.getByRole('radio', { name: 'Pictures' })).waitFor({ state: 'attached' });
  assert.equal(await page.getByLabel('Size from').inputValue(), '1KB');
  await page.getByRole('radio', { name: 'Anything' }).check({ force: true });
  await holds('size:1KB.. plan');
  await page.getByLabel('to', { exact: true }).pressSequentially('1.5 MB');
  assert.equal(await page.getByLabel('to', { exact: true }).inputValue(), '1.5 MB', 'as it is typed');
  await holds('size:1KB..1.5MB plan');
  await page.getByLabel('Extension').pressSequentially('txt, md');
  await page.getByRole('button', { name: '.git', exact: true }).click();
  await holds('size:1KB..1.5MB plan ext:txt,md exclude:.git');
  await page.getByRole('button', { name: 'Remove: 1 KB to 1.5 MB' }).click();
  await page.waitForURL((url) => !url.hash.includes('size'));
  await holds('plan ext:txt,md exclude:.git');
  // And the other way round; what the panel cannot show stays, and is said.
  await page.fill('#pattern', '!ext:a size:>1k opened:2026 "x y');
  await page.waitForFunction(() => document.querySelectorAll('.criteria code').length === 2);
  assert.deepEqual(await page.locator('.criteria code').allTextContents(), ['!ext:a', 'size:>1k']);
  assert.equal(await page.getByLabel('Last opened, as written').inputValue(), '2026');
  assert.equal(await page.getByLabel('Extension').inputValue(), '');
  // The accounts of the machine are offered, as behind the prefix.
  await page.getByLabel('Owner').focus();
  await page.waitForSelector('#accounts-owner option[value=root]', { state: 'attached' });
  await page.getByLabel('Owner').pressSequentially('no one');
  await holds('owner:"no one" !ext:a size:>1k opened:2026 "x y');
  await page.waitForFunction(() => document.querySelector('.owner input')?.getAttribute('aria-invalid') === 'true');
  await page.getByRole('button', { name: 'Remove all criteria' }).click();
  await holds('!ext:a size:>1k "x y');
  await tab.close();
});
