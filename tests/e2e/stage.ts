// What the tests of one file share: a tree that a server serves, and a browser with a session of it.
import { after, before } from 'node:test';
import type { Browser, BrowserContextOptions } from 'playwright-core';
import { openBrowser, type Cookies, sessionOf, Tab } from './browser.ts';
import { Place, Server } from './server.ts';

export class Stage {
  place!: Place;
  server!: Server;
  browser!: Browser;
  // Taken from the printed address, which gives them once, for the first tab that wants them.
  cookies?: Cookies;

  // `makeShares` fills the place, and gives the folders by the names of their shares.
  constructor(makeShares: (place: Place) => Record<string, string>) {
    before(async () => {
      this.place = new Place();
      const shares = makeShares(this.place);
      for (const folder of Object.values(shares)) this.place.giveAway(folder);
      this.server = await Server.start(this.place, { shares });
      this.browser = await openBrowser();
    });
    after(async () => {
      await this.browser?.close();
      await this.server?.stop();
      this.place?.remove();
    });
  }

  // A tab of the page; with the search in its address, once that is over.
  async openTab(hash = '', options: BrowserContextOptions = {}): Promise<Tab> {
    this.cookies ??= await sessionOf(this.browser, this.server.address);
    const tab = await Tab.openAt(this.browser, this.cookies, `${this.server.origin}/${hash}`, options);
    if (hash) await tab.over();
    return tab;
  }
}
