// The way back: an address that repeats its search, folders opened from a result, past searches, and
// what becomes of searches that were left.
import assert from 'node:assert/strict';
import * as fs from 'node:fs';
import { test } from 'node:test';
import { join } from 'node:path';
import type { Response } from 'playwright-core';
import { Stage } from './stage.ts';
import { itemName, makeFiles, makeMany } from './tree.ts';

const stage = new Stage((place) => ({ files: makeFiles(place), many: makeMany(place) }));

test('reload and a shared link repeat the search; the way back leads to the one before', async () => {
  const tab = await stage.openTab();
  const { page } = tab;
  await page.fill('#pattern', 'plan');
  await page.click('text=Criteria');
  await page.getByLabel('Size from').fill('1 KB');
  await page.getByRole('radio', { name: 'Files' }).check({ force: true });
  await page.press('#pattern', 'Enter');
  await page.locator('.figures strong', { hasText: '2 matches' }).waitFor();
  assert.deepEqual([...(await tab.names())].sort(), ['plan large.txt', 'plan middle.txt']);
  const link = page.url();
  await tab.search('notes');
  await page.goBack();
  await tab.over();
  assert.equal(page.url(), link);
  assert.equal(await page.inputValue('#pattern'), 'plan size:1KB.. type:file');
  await page.reload();
  await tab.over();
  assert.equal(await tab.count(), '2 matches');
  await page.getByRole('button', { name: 'Remove: 1 KB or more' }).click();
  await page.locator('.figures strong', { hasText: '3 matches' }).waitFor();
  await tab.close();
});

test('a found folder opens; the way back leads to its row, and closes details first', async () => {
  const tab = await stage.openTab('#q=*&in=/many&sort=-name');
  const { page, tasks } = tab;
  const details = page.locator('.details');
  await page.focus('.table');
  await page.keyboard.press('End');
  await page.locator('.row.active', { hasText: 'f0' }).waitFor();
  const [top] = await tab.names();
  await page.keyboard.press('Space');
  await details.waitFor();
  await page.keyboard.press('Enter');
  await tab.firstIs(itemName(0));
  await tab.over();
  assert.equal(await tab.count(), '1,000 items', 'nothing but what the folder holds');
  assert.equal(await page.textContent('.crumbs'), 'manyf0');
  await page.goBack();
  await page.locator('.row.active', { hasText: 'f0' }).waitFor();
  await details.waitFor();
  assert.equal((await tab.names())[0], top);
  await page.goBack();
  await details.waitFor({ state: 'detached' });
  await page.goForward();
  await details.getByRole('button', { name: 'Close' }).click();
  await details.waitFor({ state: 'detached' });
  assert.equal((await tab.names())[0], top, 'the table has not moved');
  assert.equal(tasks.length, 2, 'nothing was searched anew');
  await page.waitForFunction(() => history.state.active > 0 && !history.state.details);
  // A reload repeats the search; what is typed is looked for below.
  await page.reload();
  await page.locator('.row.active', { hasText: 'f0' }).waitFor();
  assert.equal((await tab.names())[0], top);
  await page.goForward();
  await page.goForward();
  await page.getByRole('button', { name: 'many', exact: true }).click();
  await tab.firstIs('f0');
  await tab.search(itemName(7));
  assert.equal(await tab.count(), '1 match');
  await tab.close();
});

test('past searches are offered, repeated and cleared', async () => {
  const tab = await stage.openTab();
  const { page } = tab;
  // A search is remembered a moment after its rows are there.
  const isRemembering = (reply: Response) => reply.url().endsWith('/past') && reply.request().method() === 'POST';
  const remembered = (search: Promise<void>) => Promise.all([search, page.waitForResponse(isRemembering)]);
  await remembered(tab.search('plan type:file'));
  await remembered(tab.search('notes'));
  // All that was asked for comes back, days as they were chosen.
  const needleAddress = '#q=needle&ext=txt&in=/files/docs&contents=1&modified=last-7-days';
  await remembered(page.goto(`${stage.server.origin}/${needleAddress}`).then(() => tab.over()));
  assert.deepEqual(await tab.names(), ['notes.txt']);
  // The key is pressed before the history has come, which waits for it here.
  let come = () => {};
  const pressed = new Promise<void>((go) => (come = go));
  await page.route('**/past', (route) => void pressed.then(() => route.continue()));
  await page.goto(stage.server.origin + '/');
  await page.reload();
  await page.press('#pattern', 'ArrowDown');
  come();
  await page.getByRole('option', { name: 'notes', exact: true }).waitFor();
  const needle = page.getByRole('option', { name: /^ext:txt modified:last-7-days needle also inside files/ });
  await needle.click();
  await tab.over();
  assert.deepEqual(await tab.names(), ['notes.txt']);
  assert.match(decodeURIComponent(page.url()), /modified:last-7-days/);
  // One goes alone; a pinned one has a name, and stays first.
  await page.fill('#pattern', 'not');
  await page.press('#pattern', 'ArrowDown');
  await page.press('#pattern', 'Delete');
  await page.getByRole('option', { name: 'notes', exact: true }).waitFor({ state: 'detached' });
  await page.click('.home');
  await page.getByRole('button', { name: 'Pin plan type:file', exact: true }).click();
  await page.getByRole('button', { name: 'Name plan type:file', exact: true }).click();
  await page.getByLabel('Name of the pinned search').fill('My plans');
  await page.keyboard.press('Enter');
  await page.getByRole('button', { name: 'My plans', exact: true }).waitFor();
  await page.reload();
  await page.getByRole('button', { name: 'My plans', exact: true }).click();
  await tab.over();
  assert.equal(await page.inputValue('#pattern'), 'plan type:file');
  await page.fill('#pattern', '');
  await page.click('text=Clear history');
  await page.getByText('The history is cleared.').waitFor();
  await needle.waitFor({ state: 'detached' });
  await page.click('.home');
  await page.getByRole('button', { name: 'Remove My plans' }).click();
  await page.getByRole('button', { name: 'My plans', exact: true }).waitFor({ state: 'detached' });
  await page.press('#pattern', 'ArrowDown');
  assert.equal(await page.getByRole('option').count(), 0);
  // A damaged file of other clients' history: what stays as it is must not be told as if it would pass.
  await tab.search('notes');
  await page.goto(`${stage.server.origin}/#q=plan&ext=txt&in=/files/docs`);
  await tab.over();
  const users = join(stage.place.root, 'state/users');
  const store = join(users, fs.readdirSync(users)[0]!, 'preference/search_history.db');
  fs.writeFileSync(store, 'no database'.repeat(100));
  await page.fill('#pattern', '');
  await page.click('text=Clear history');
  await page.getByText('its file on the server is damaged').waitFor();
  await page.press('#pattern', 'ArrowDown');
  assert.equal(await page.getByRole('option').count(), 0);
  fs.rmSync(store);
  await tab.close();
});

test('leaving the page cleans its searches; coming back repeats them', async () => {
  const tab = await stage.openTab('#q=plan');
  const { page, tasks } = tab;
  const known = async (task: string) => (await page.request.get(`${stage.server.origin}/searches/${task}`)).status();
  const gone = async (task: string) => {
    for (let tries = 0; tries < 100 && (await known(task)) !== 404; ++tries) await page.waitForTimeout(100);
    assert.equal(await known(task), 404);
  };
  assert.equal(await known(tasks[0]!), 200);
  // A few are kept for the way back.
  for (const pattern of ['notes', 'data', 'view', 'Straße', 'été']) await tab.search(pattern);
  await gone(tasks[0]!);
  assert.equal(await known(tasks[1]!), 200);
  await page.goto('about:blank');
  await Promise.all(tasks.map(gone));
  await page.goBack();
  await tab.over();
  assert.equal(await tab.count(), '1 match');
  await tab.close();
});
