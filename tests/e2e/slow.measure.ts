// How the page feels on a slow line: tests/e2e/run --slow [FOLDER-OF-THE-PROGRAM]. Prints what was
// measured; nothing is asserted, as times are the machine's.
import { test } from 'node:test';
import type { CDPSession, Page } from 'playwright-core';
import { openBrowser, Tab } from './browser.ts';
import { Place, Server } from './server.ts';
import { makeMany } from './tree.ts';

const LATENCY_MS = 400;
const BYTES_PER_SECOND = 50 * 1000;
const ROUNDS = 5;

test('a slow line', async () => {
  const place = new Place();
  const shares = { many: makeMany(place) };
  for (const folder of Object.values(shares)) place.giveAway(folder);
  const server = await Server.start(place, { shares });
  const browser = await openBrowser();
  try {
    const first = await Tab.open(browser);
    await first.page.goto(server.address);
    await first.page.waitForSelector('#pattern');
    const cookies = await first.page.context().cookies();
    await first.close();
    const loads: number[] = [];
    const searches: number[] = [];
    const pasted: number[] = [];
    let line: Line | undefined;
    for (let round = 0; round < ROUNDS; ++round) {
      const tab = await Tab.open(browser);
      const { page } = tab;
      await page.context().addCookies(cookies);
      line = await Line.slow(page);
      loads.push(await timed(() => page.goto(server.origin).then(() => page.waitForSelector('#pattern'))));
      if (round === 0) line.tell('first load');
      await page.waitForTimeout(1500);
      line.forget();
      await page.locator('#pattern').pressSequentially('item 0001', { delay: 120 });
      await page.waitForTimeout(700); // a person looks at what was typed
      searches.push(await timed(() => enter(page)));
      if (round === 0) line.tell('Enter to first row');
      await page.fill('#pattern', '');
      await page.waitForTimeout(2500);
      await page.fill('#pattern', 'item 0002');
      pasted.push(await timed(() => enter(page, 'item 0002')));
      await tab.close();
    }
    for (const [what, times] of Object.entries({ loads, searches, pasted })) {
      times.sort((a, b) => a - b);
      const [least, middle, most] = [times[0], times[ROUNDS >> 1], times.at(-1)].map((ms) => Math.round(ms!));
      console.log(`${what}: median ${middle} ms (${least} to ${most}) of ${ROUNDS}`);
    }
  } finally {
    await browser.close();
    await server.stop();
    place.remove();
  }
});

async function enter(page: Page, name = 'item 0001'): Promise<void> {
  await page.press('#pattern', 'Enter');
  await page.locator('.row:not(.waiting) .name', { hasText: name }).first().waitFor();
}

async function timed(act: () => Promise<unknown>): Promise<number> {
  const begun = performance.now();
  await act();
  return performance.now() - begun;
}

class Line {
  private calls: string[] = [];
  private bytes = 0;
  private readonly paths = new Map<string, string>();

  static async slow(page: Page): Promise<Line> {
    const line = new Line();
    const session: CDPSession = await page.context().newCDPSession(page);
    await session.send('Network.enable');
    await session.send('Network.emulateNetworkConditions', {
      offline: false,
      latency: LATENCY_MS,
      downloadThroughput: BYTES_PER_SECOND,
      uploadThroughput: BYTES_PER_SECOND,
    });
    session.on('Network.requestWillBeSent', ({ requestId, request }) => {
      line.paths.set(requestId, new URL(request.url).pathname);
    });
    session.on('Network.loadingFinished', ({ requestId, encodedDataLength }) => {
      line.calls.push(`${line.paths.get(requestId)} ${encodedDataLength}`);
      line.bytes += encodedDataLength;
    });
    return line;
  }
  forget(): void {
    this.calls = [];
    this.bytes = 0;
  }
  tell(what: string): void {
    console.log(`${what}: ${this.calls.length} replies, ${this.bytes} bytes\n  ${this.calls.join('\n  ')}`);
  }
}
