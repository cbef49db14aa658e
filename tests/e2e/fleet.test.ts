// The page of a front: what several machines have found, and what it says of one that is down and of
// one that is late.
import assert from 'node:assert/strict';
import { spawnSync } from 'node:child_process';
import * as fs from 'node:fs';
import { test } from 'node:test';
import { join } from 'node:path';
import { openBrowser, Tab } from './browser.ts';
import { Place, Server } from './server.ts';

const USER = process.getuid?.() === 0 ? 'nobody' : process.env.USER;

// A machine with files of its own, which knows the front by its key.
async function startBox(name: string, key: string): Promise<{ place: Place; box: Server }> {
  const place = new Place();
  const files = place.folder('files');
  for (const month of ['January', 'February', 'March']) {
    fs.writeFileSync(join(files, `Invoice of ${month}, ${name}.txt`), `Kept on ${name}.`);
  }
  const settings = `[fleet]\nname = "${name}"\nlowest_uid = 1\n[fleet.fronts.office]\nkey = "${key}"\nusers = ["${USER}"]\n`;
  return { place, box: await Server.start(place, { shares: { documents: files }, settings }) };
}

test('a front shows what machines have found, and names those that are down or late', async () => {
  const front = new Place();
  const keyFile = join(front.root, 'office.key');
  const key = spawnSync(process.env.ARBORY_PROGRAM!, ['fleet', 'key', keyFile], { encoding: 'utf8' }).stdout.trim();
  const boxes = await Promise.all(['attic', 'cellar', 'studio'].map((name) => startBox(name, key)));
  const addresses = boxes.map(({ box }, i) => `${['attic', 'cellar', 'studio'][i]} = "${box.origin}"\n`);
  const fleet = join(front.root, 'fleet.toml');
  fs.writeFileSync(
    fleet,
    `front = "office"\nkey_file = "${keyFile}"\ndeadline_ms = 1500\n[boxes]\n${addresses.join('')}`,
  );
  if (process.getuid?.() !== 0) fs.chmodSync(keyFile, 0o600);
  const server = await Server.start(front, { shares: {}, words: ['--fleet', fleet] });
  const browser = await openBrowser();
  const picture = async (tab: Tab, name: string) => {
    const folder = process.env.ARBORY_SHOTS;
    if (folder) await tab.page.screenshot({ path: join(folder, `fleet-${name}.png`) });
  };
  try {
    const tab = await Tab.open(browser);
    const { page } = tab;
    await page.goto(server.address);
    await tab.search('invoice');
    assert.equal(await tab.count(), '9 matches');
    assert.match((await page.textContent('.figures'))!, /3 of 3 machines answered/);
    const row = page.locator('.row', { hasText: 'January, cellar' });
    await row.click();
    await page.locator('.preview.text', { hasText: 'Kept on cellar.' }).waitFor();
    await picture(tab, 'all');
    await page.click('button[title="Close (Esc)"]'); // what is shown of a file is asked for anew

    boxes[1]!.box.kill();
    boxes[2]!.box.freeze();
    await tab.search('march');
    assert.equal(await tab.count(), 'at least 1 match');
    await page.locator('summary, button', { hasText: '2 machines did not answer' }).first().waitFor();
    await picture(tab, 'down-and-late');
    await page.locator('summary, button', { hasText: '2 machines did not answer' }).first().click();
    await page.locator('li', { hasText: 'cellar: cannot be reached' }).waitFor();
    await page.locator('li', { hasText: 'studio: no answer in time' }).waitFor();
    await picture(tab, 'why');
    await tab.close();
  } finally {
    boxes[2]!.box.freeze(false);
    await browser.close();
    await Promise.all([server, ...boxes.map(({ box }) => box)].map((one) => one.stop()));
    for (const place of [front, ...boxes.map(({ place }) => place)]) place.remove();
  }
});
