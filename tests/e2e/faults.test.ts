// What goes wrong around the page is said, and not for longer than it is so.
import assert from 'node:assert/strict';
import * as fs from 'node:fs';
import { after, before, test } from 'node:test';
import { join } from 'node:path';
import type { Browser } from 'playwright-core';
import { openBrowser, openMortalBrowser, SOON_MS, Tab } from './browser.ts';
import { Place, Server } from './server.ts';

const LEASE_SECONDS = 2;
// Names that are no text, or hold what an address must not.
const BROKEN = Buffer.concat([Buffer.from("odd 'caf"), Buffer.from([0xe9]), Buffer.from("'.txt")]);
const LINES = 'odd line\nbreak.txt';

let place: Place;
let server: Server;
let browser: Browser;
let top: string;

before(async () => {
  place = new Place();
  top = place.folder('files');
  fs.writeFileSync(join(top, 'plan small.txt'), 'small');
  fs.writeFileSync(join(top, 'plan closed.txt'), 'closed');
  fs.chmodSync(join(top, 'plan closed.txt'), 0);
  fs.writeFileSync(Buffer.concat([Buffer.from(top + '/'), BROKEN]), 'of bytes');
  fs.writeFileSync(join(top, LINES), 'of lines');
  fs.mkdirSync(join(top, 'slow'));
  // Reading its contents takes minutes; it takes no room.
  fs.writeFileSync(join(top, 'slow/endless.txt'), 'text '.repeat(60_000));
  fs.truncateSync(join(top, 'slow/endless.txt'), 2 ** 39);
  fs.chownSync(top, 65534, 65534);
  server = await Server.start(place, { shares: { files: top }, top: `lease_seconds = ${LEASE_SECONDS}\n` });
  browser = await openBrowser();
});
after(async () => {
  await browser?.close();
  await server?.stop();
  place?.remove();
});

let address = '';

test('a used address leads to the page, or says what to do', async () => {
  address = server.address;
  const tab = await Tab.open(browser);
  for (const visit of ['first', 'second']) {
    await tab.page.goto(address + '#q=plan');
    await tab.over();
    assert.equal(await tab.count(), '2 matches', visit);
  }
  await tab.close();
  const stranger = await Tab.open(browser);
  await stranger.page.goto(address);
  await stranger.page.getByText('has been used before').waitFor();
  await stranger.page.getByText('SIGHUP').waitFor();
  await stranger.close();
});

async function openTab(hash: string, options = {}): Promise<Tab> {
  const tab = await Tab.open(browser, options);
  await tab.page.goto((await server.renewed()) + hash);
  await tab.page.waitForSelector('#pattern');
  if (hash) await tab.over();
  return tab;
}

test('a session that has ended says so, and what was asked for goes on in the next', async () => {
  const tab = await openTab('#q=plan');
  const { page } = tab;
  await page.context().clearCookies();
  await page.fill('#pattern', 'small');
  await page.click('text=Criteria');
  await page.getByLabel('Extension').fill('txt');
  await page.press('#pattern', 'Enter');
  await page.getByText('Your session has ended').waitFor();
  await page.goto(await server.renewed());
  await tab.over();
  assert.deepEqual(await tab.names(), ['plan small.txt']);
  assert.match(page.url(), /#q=small/);
  await tab.close();
});

test('rows that could not be fetched are told of until they are there', async () => {
  const tab = await openTab('#q=plan');
  const { page } = tab;
  await page.route('**/list', (route) => route.abort());
  await page.getByRole('columnheader', { name: 'Name' }).getByRole('button').click();
  const band = page.locator('.band[role=alert]');
  await band.filter({ hasText: 'does not answer' }).waitFor();
  await page.unroute('**/list');
  await band.waitFor({ state: 'detached' });
  await tab.firstIs('plan closed.txt');
  await tab.close();
});

test('files are fetched and copied whatever bytes their names hold; what is refused is told', async () => {
  const tab = await openTab('#q=odd|plan&sort=name', { acceptDownloads: true });
  const { page } = tab;
  await page.context().grantPermissions(['clipboard-read', 'clipboard-write']);
  const rows: [string, string, string][] = [
    ['odd \'caf', 'of bytes', "$'/files/odd \\'caf\\xe9\\'.txt'"],
    ['odd line', 'of lines', "$'/files/odd line\\x0abreak.txt'"],
    ['plan small', 'small', '/files/plan small.txt'],
  ];
  for (const [name, text, path] of rows) {
    await page.locator('.row', { hasText: name }).click();
    await page.locator('.details pre', { hasText: text }).waitFor();
    const [download] = await Promise.all([page.waitForEvent('download'), page.keyboard.press('d')]);
    assert.equal(fs.readFileSync(await download.path(), 'utf8'), text, name);
    await page.keyboard.press('c');
    await page.getByText('The path is copied').first().waitFor();
    await page.waitForFunction((wanted) => navigator.clipboard.readText().then((got) => got === wanted), path);
  }
  await page.locator('.row', { hasText: 'plan closed' }).click();
  await page.keyboard.press('d');
  await page.getByRole('status').filter({ hasText: 'You may not read this file' }).waitFor();
  await tab.close();
});

test('what a killed browser asked for ends and is removed, though the server is killed too', async () => {
  const state = join(place.root, 'state');
  // Of the tests before there may be results of searches that had ended, which stay for a day.
  const results = () => new Set((fs.readdirSync(state, { recursive: true }) as string[]).filter((name) => /FBSearch\/.+\.db$/.test(name)));
  const before = results();
  const mortal = await openMortalBrowser();
  const tab = await Tab.open(mortal.browser);
  await tab.page.goto((await server.renewed()) + '#q=needle&contents=1');
  await tab.page.waitForSelector('.stop');
  const user = fs.readdirSync(join(state, 'users'))[0]!;
  const record = () => join(state, 'users', user, 'tasks', `${tab.tasks[0]}.json`);
  const own = () => [...results()].filter((name) => !before.has(name));
  const until = async (holds: () => boolean) => {
    const end = Date.now() + SOON_MS;
    while (!holds() && Date.now() < end) await new Promise((done) => setTimeout(done, 100));
  };
  await until(() => fs.existsSync(record()) && own().length === 1);
  const runs = fs.existsSync(record()) && own().length === 1;
  mortal.kill();
  server.kill();
  assert.ok(runs, 'it runs');
  await until(() => !fs.existsSync(record()) && own().length === 0);
  assert.deepEqual([fs.existsSync(record()), own()], [false, []]);
});
