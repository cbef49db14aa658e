// Takes the pictures of the page's states for the documents: tests/e2e/run --shots docs/images
import * as fs from 'node:fs';
import { dirname, join } from 'node:path';
import { test } from 'node:test';
import type { Browser, BrowserContextOptions } from 'playwright-core';
import { openBrowser, Tab } from '../../tests/e2e/browser.ts';
import { Place, Server } from '../../tests/e2e/server.ts';
import { picture } from './picture.ts';

const NOW = Date.UTC(2026, 9, 14, 9, 30) / 1000;
const DAY = 86_400;

// A household's files: always the same, dates too, so that pictures change only with the page.
function makeHome(place: Place): Record<string, string> {
  const shares = Object.fromEntries(['photos', 'documents', 'music'].map((name) => [name, place.folder(name)]));
  const folders = new Set<string>();
  let made = 0;
  const file = (share: string, path: string, bytes: number | Buffer | string) => {
    const full = join(shares[share]!, path);
    fs.mkdirSync(dirname(full), { recursive: true });
    folders.add(dirname(full));
    fs.writeFileSync(full, typeof bytes === 'number' ? '' : bytes);
    if (typeof bytes === 'number') fs.truncateSync(full, bytes);
    const time = NOW - ((made++ * 7919) % (900 * DAY));
    fs.utimesSync(full, time, time);
  };
  const trips = ['Lisbon', 'Harbour walk', 'Holiday at the lake', 'Garden', 'Christmas market', 'Zoë’s birthday'];
  for (const year of [2023, 2024, 2025, 2026]) {
    trips.forEach((trip, t) => {
      for (let i = 0; i < 120; ++i) {
        const number = 1000 + ((i * 37 + year + t * 11) % 8999);
        file('photos', `${year}/${trip}/IMG_${number}.jpg`, 1_900_000 + ((i * 48_271) % 4_000_000));
      }
      file('photos', `${year}/${trip}/${trip} ${year} best of.zip`, 88_000_000 + t * 9_000_000);
      file('photos', `${year}/${trip}/${trip} ${year}.png`, picture(960, 600));
    });
    for (const what of ['Invoice', 'Tax report', 'Holiday plan', 'Insurance', 'Letter to the school', 'Offer for the roof']) {
      file('documents', `${year}/${what} ${year}.pdf`, 120_000 + made * 311);
      file('documents', `${year}/drafts/${what} ${year} draft.odt`, 24_000 + made * 77);
    }
    file('documents', `${year}/Holiday packing list ${year}.txt`, PACKING.replace('YEAR', String(year)));
    file('music', `Mixes/Holiday mix ${year}.m3u`, 2100 + year);
    for (let i = 1; i < 13; ++i) file('music', `Concerts ${year}/${String(i).padStart(2, '0')} Set.flac`, 31_000_000 + i * 777_777);
  }
  file('documents', 'private/diary.txt', 'closed');
  fs.chmodSync(join(shares.documents!, 'private'), 0);
  file('documents', 'archive/mail.txt', 'text '.repeat(60_000));
  fs.truncateSync(join(shares.documents!, 'archive/mail.txt'), 2 ** 38);
  for (const folder of Object.values(shares)) {
    place.giveAway(folder);
  }
  for (const folder of folders) {
    const time = NOW - ((made++ * 7919 * 31) % (900 * DAY));
    fs.utimesSync(folder, time, time);
  }
  return shares;
}

const PACKING = `Packing list, holiday YEAR

[x] passports, tickets, insurance card
[x] chargers and the long cable
[ ] swimming things, two towels each
[ ] rain jackets (it is the lake, after all)
[ ] books: one each, no more
[ ] first aid box, sun cream
[ ] camera, spare card

Leave a key with the neighbours, holiday address on the fridge.
`;

const DESK = { viewport: { width: 1140, height: 660 } };
const PHONE = { viewport: { width: 390, height: 700 }, isMobile: true, hasTouch: true, deviceScaleFactor: 1.5 };
const DARK = { ...DESK, colorScheme: 'dark' as const };

test('pictures', async () => {
  const place = new Place();
  const server = await Server.start(place, { shares: makeHome(place) });
  const browser: Browser = await openBrowser();
  try {
    const first = await Tab.open(browser);
    await first.page.goto(server.address);
    await first.page.waitForSelector('#pattern');
    const cookies = await first.page.context().cookies();
    const shoot = async (name: string, hash: string, options: BrowserContextOptions, act?: (tab: Tab) => Promise<unknown>) => {
      const tab = await Tab.open(browser, options);
      await tab.page.context().addCookies(cookies);
      await tab.page.goto(`${server.origin}/${hash}`);
      await tab.page.waitForSelector('#pattern');
      if (hash.includes('q=') && name !== 'page-running' && name !== 'page-error') await tab.over();
      await act?.(tab);
      await tab.page.evaluate(() => document.fonts.ready);
      await tab.page.waitForTimeout(400);
      await tab.page.screenshot({ path: join(process.env.ARBORY_SHOTS!, `${name}.png`), caret: 'hide' });
      await tab.close();
    };
    const choose = (text: string) => (tab: Tab) => tab.page.locator('.row', { hasText: text }).first().click();
    await shoot('page-light', '#q=holiday&sort=-mtime', DESK, (tab) => tab.page.press('#pattern', 'ArrowDown'));
    await shoot('page-preview', '#q=holiday+2025&sort=name', DESK, choose('lake 2025.png'));
    await shoot('page-dark', '#q=holiday+202&sort=-mtime', DARK, choose('packing list 2025'));
    await shoot('page-criteria', '#q=img+type:image+size:3MB..+modified:2026-01-01..2026-06-30&in=/photos', DESK, (tab) => tab.page.click('text=Criteria'));
    await shoot('page-running', '#q=holiday&contents=1', DESK, (tab) => tab.page.waitForTimeout(2500));
    await shoot('page-nothing', '#q=submarine+type:video', DESK);
    await shoot('page-error', '#q=regex:(2025', DESK);
    await shoot('page-history', '', DARK, async ({ page }) => {
      await page.press('#pattern', 'ArrowDown');
      await page.press('#pattern', 'ArrowDown');
    });
    await shoot('page-query', '', DESK, async ({ page }) => {
      await page.locator('#pattern').pressSequentially('"at the lake"|plan !draft size:>1MB modified:last-');
      await page.getByRole('option').first().waitFor();
      await page.press('#pattern', 'ArrowDown');
    });
    await shoot('page-folders', '#q=holiday&in=/photos/2025', DESK, async ({ page }) => {
      await page.click('.folders');
      await page.click('[aria-label="Folders in photos"]');
      await page.waitForSelector('.tree .tree li, .tree ul li');
    });
    await shoot('page-phone', '#q=holiday&sort=-mtime', PHONE);
    await shoot('page-phone-details', '#q=holiday+2025&sort=name', PHONE, choose('lake 2025.png'));
    await first.close();
  } finally {
    await browser.close();
    await server.stop();
    place.remove();
  }
});
