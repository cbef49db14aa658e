// What a search inside files has found, in the rows and in the preview.
import assert from 'node:assert/strict';
import * as fs from 'node:fs';
import { test } from 'node:test';
import { join } from 'node:path';
import type { Browser } from 'playwright-core';
import { openBrowser, Tab } from './browser.ts';
import { Place, Server } from './server.ts';

test('lines that were found are shown, numbered and marked, however late and in any encoding', async () => {
  const place = new Place();
  const files = place.folder('files');
  const lines = Array.from({ length: 40_000 }, (_, i) => `line ${i + 1}`);
  fs.writeFileSync(join(files, 'late.txt'), [...lines, 'here is the Gärtner', ...lines].join('\n'));
  const latin = 'Der G\u00e4rtner und die \u00c4pfel, sch\u00f6ne Gr\u00fc\u00dfe aus K\u00f6ln\n';
  fs.writeFileSync(join(files, 'latin.txt'), Buffer.from(latin, 'latin1'));
  const server = await Server.start(place, { shares: { files } });
  const browser = await openBrowser();
  try {
    const tab = await Tab.open(browser);
    const { page } = tab;
    await page.goto(server.address + '#q=gärtner&contents=1');
    await tab.over();
    const rows: [string, string, string][] = [
      ['late.txt', '40001', 'here is the Gärtner'],
      ['latin.txt', '1', 'Der Gärtner und die Äpfel'],
    ];
    const row = (name: string) => page.locator('.row', { hasText: name });
    for (const [name, , text] of rows) await row(name).locator('.found', { hasText: text }).waitFor();
    const places = await page.locator('.row').evaluateAll((all) => all.map((one) => one.getBoundingClientRect().toJSON()));
    const [upper, lower] = places.sort((a, b) => a.top - b.top);
    assert.ok(lower.top >= upper.bottom - 1, 'one row is below the other');
    for (const [name, number] of rows) {
      assert.equal(await row(name).locator('.found .number').textContent(), number);
      assert.equal(await row(name).locator('.found mark').textContent(), 'Gärtner');
      await row(name).click();
      await page.locator('.details pre mark', { hasText: 'Gärtner' }).waitFor();
      const seen = await page.locator('.preview.text').evaluate((box) => {
        const mark = [...box.querySelectorAll('mark')][0]!.getBoundingClientRect();
        const frame = box.getBoundingClientRect();
        return mark.top >= frame.top && mark.bottom <= frame.bottom;
      });
      assert.ok(seen, `${name}: the mark is in sight`);
    }
    await tab.close();
    await enlarged(browser, await server.renewed());
  } finally {
    await browser.close();
    await server.stop();
    place.remove();
  }
});

// A window of 1280 by 1024 points, enlarged fourfold: the rows are reached and chosen, with the
// criteria folded away and unfolded.
async function enlarged(browser: Browser, address: string): Promise<void> {
  const tab = await Tab.open(browser, { viewport: { width: 320, height: 256 } });
  const { page } = tab;
  await page.goto(address + '#q=txt');
  await tab.over();
  for (const criteria of ['folded', 'unfolded']) {
    if (criteria === 'unfolded') await page.click('text=Criteria');
    await page.locator('.scroller').scrollIntoViewIfNeeded();
    const { height, width } = await page.evaluate(() => ({
      height: document.querySelector('.scroller')!.clientHeight,
      width: document.documentElement.scrollWidth,
    }));
    assert.ok(height > 2 * 54, `${height} points are left for rows of 54`);
    assert.equal(width, 320);
  }
  await page.click('#row-1');
  await page.getByRole('button', { name: 'Download' }).waitFor();
  await tab.close();
}
