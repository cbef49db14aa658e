// Debian's Chromium without a window, and a page in it that fails its test when anything goes wrong
// behind the scenes: a script error, a refused request, a request to anywhere else.
import { chromium, type Browser, type BrowserContextOptions, type Page } from 'playwright-core';
import assert from 'node:assert/strict';

const CHROMIUM = process.env.CHROMIUM ?? '/usr/bin/chromium';
// A loaded machine is slow, not wrong.
export const SOON_MS = 20_000;

const LAUNCH = {
  executablePath: CHROMIUM,
  args: [
    '--no-sandbox',
    '--disable-gpu',
    '--disable-quic',
    '--no-first-run',
    '--disable-background-networking',
    '--disable-component-update',
    '--disable-sync',
  ],
};

export const openBrowser = (): Promise<Browser> => chromium.launch(LAUNCH);

// One that can be killed without a word.
export async function openMortalBrowser(): Promise<{ browser: Browser; kill: () => void }> {
  const server = await chromium.launchServer(LAUNCH);
  const browser = await chromium.connect(server.wsEndpoint());
  return { browser, kill: () => server.process().kill('SIGKILL') };
}

export type Cookies = Awaited<ReturnType<ReturnType<Page['context']>['cookies']>>;

// The session that the address which a server printed gives, once.
export async function sessionOf(browser: Browser, address: string): Promise<Cookies> {
  const tab = await Tab.open(browser);
  await tab.page.goto(address);
  await tab.page.waitForSelector('#pattern');
  const cookies = await tab.page.context().cookies();
  await tab.close();
  return cookies;
}

export class Tab {
  readonly troubles: string[] = [];
  readonly tasks: string[] = []; // of the searches it started

  private constructor(readonly page: Page) {}

  static async open(browser: Browser, options: BrowserContextOptions = {}): Promise<Tab> {
    const context = await browser.newContext({ viewport: { width: 1280, height: 760 }, ...options });
    context.setDefaultTimeout(SOON_MS);
    const tab = new Tab(await context.newPage());
    tab.watch();
    return tab;
  }

  // With a session, at the page's address.
  static async openAt(
    browser: Browser,
    cookies: Cookies,
    address: string,
    options: BrowserContextOptions = {},
  ): Promise<Tab> {
    const tab = await Tab.open(browser, options);
    await tab.page.context().addCookies(cookies);
    await tab.page.goto(address);
    await tab.page.waitForSelector('#pattern');
    return tab;
  }

  private watch(): void {
    const { page, troubles } = this;
    page.on('pageerror', (error) => troubles.push(error.message));
    page.on('console', (message) => {
      // Refusals are told by the browser itself too.
      const expected = /\b40[13]\b|ERR_FAILED/.test(message.text());
      if (message.type() === 'error' && !expected) troubles.push(message.text());
    });
    page.on('request', (request) => {
      const url = new URL(request.url());
      if (url.protocol === 'http:' && url.hostname !== '127.0.0.1') troubles.push(request.url());
    });
    page.on('dialog', (dialog) => {
      troubles.push('a dialog: ' + dialog.message());
      void dialog.dismiss();
    });
    page.on('response', async (response) => {
      if (!response.url().endsWith('/searches')) return;
      const reply = await response.json().catch(() => null);
      if (reply?.taskid) this.tasks.push(reply.taskid);
    });
  }

  async close(): Promise<void> {
    await this.page.context().close();
    assert.deepEqual(this.troubles, []);
  }

  // Types a search, runs it, and waits for its end.
  async search(pattern: string): Promise<void> {
    await this.page.fill('#pattern', pattern);
    await this.page.press('#pattern', 'Enter');
    await this.over();
  }

  // Until the shown search has ended.
  async over(): Promise<void> {
    await this.page.waitForSelector('.searchbar .primary:not(.stop)');
    await this.page.waitForSelector('.table[aria-busy=false], .blank:not(.welcome)');
    await this.fetched();
  }

  // Until no row that can be seen still waits for its page of the result.
  private async fetched(): Promise<void> {
    await this.page.waitForFunction(() => !document.querySelector('.row.waiting'));
  }

  async count(): Promise<string> {
    return (await this.page.textContent('.figures strong')) ?? '';
  }

  // The names that can be seen, in their order on the screen.
  async names(): Promise<string[]> {
    await this.fetched();
    const rows = this.page.locator('.row');
    const found = await rows.evaluateAll((elements) =>
      elements.map((row) => ({
        index: Number(row.id.slice('row-'.length)),
        name: row.querySelector('.name bdi')?.textContent ?? '', // without the line that was found in it
      })),
    );
    return found.sort((a, b) => a.index - b.index).map((row) => row.name);
  }

  // Waits until the first row has this name.
  async firstIs(name: string): Promise<void> {
    await this.page.locator('#row-0 .name', { hasText: name }).waitFor();
  }
}
