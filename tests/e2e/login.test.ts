// Signing in, as root with people's own accounts. The PAM service lets one account in, so that no
// real password is needed.
import assert from 'node:assert/strict';
import * as fs from 'node:fs';
import { join } from 'node:path';
import { test } from 'node:test';
import { openBrowser, Tab } from './browser.ts';
import { Place, Server } from './server.ts';

const root = process.getuid?.() === 0;

test('people sign in and out', { skip: !root && 'only root can serve logins' }, async () => {
  const place = new Place();
  const files = place.folder('files');
  fs.writeFileSync(join(files, 'note.txt'), '');
  const pam = place.folder('pam');
  fs.writeFileSync(
    join(pam, 'arbory'),
    'auth required pam_succeed_if.so user = nobody\naccount required pam_permit.so\n',
  );
  const settings = `pam_dir = "${pam}"\n`;
  const server = await Server.start(place, { shares: { files }, logins: true, settings });
  const browser = await openBrowser();
  try {
    const tab = await Tab.open(browser);
    const { page } = tab;
    await page.goto(server.address + '#q=note');
    const signIn = async (user: string) => {
      await page.getByLabel('User').fill(user);
      await page.getByLabel('Password').fill('whatever');
      await page.getByRole('button', { name: 'Sign in' }).click();
    };
    await signIn('root');
    await page.getByRole('alert').filter({ hasText: /\w/ }).waitFor();
    assert.equal(await page.locator('#pattern').count(), 0);
    await signIn('nobody');
    await tab.over(); // the search of the address
    assert.equal(await tab.count(), '1 match');
    await page.getByRole('button', { name: 'Menu' }).click();
    await page.getByText('nobody').waitFor();
    await page.getByRole('button', { name: 'Sign out' }).click();
    await page.getByRole('heading', { name: 'Sign in' }).waitFor();
    assert.equal((await page.request.get(server.origin + '/session')).status(), 401);
    await tab.close();
  } finally {
    await browser.close();
    await server.stop();
    place.remove();
  }
});
