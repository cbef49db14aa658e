// What people do with rows they have found: choosing several of them, and looking at them.
import assert from 'node:assert/strict';
import { execFileSync } from 'node:child_process';
import { test } from 'node:test';
import { join } from 'node:path';
import { Stage } from './stage.ts';
import { makeFiles } from './tree.ts';

const stage = new Stage((place) => ({ files: makeFiles(place) }));

// What an unpacker makes of it: names, and whether all that is in it is sound.
const UNPACK = `
import sys, zipfile
archive = zipfile.ZipFile(sys.argv[1])
assert archive.testzip() is None
for name in sorted(archive.namelist()): print(ascii(name), archive.getinfo(name).file_size)
`;
const unpacked = (path: string) =>
  execFileSync('python3', ['-c', UNPACK, path], { encoding: 'utf8' }).trim().split('\n');

test('several rows are chosen by mouse and keys, copied and downloaded as one archive', async () => {
  const tab = await stage.openTab('#q=plan*.txt|notes|view&sort=name', { acceptDownloads: true });
  const { page } = tab;
  await page.context().grantPermissions(['clipboard-read', 'clipboard-write']);
  const all = ['notes.txt', 'plan large.txt', 'plan middle.txt', 'plan small.txt', 'view.png'];
  assert.deepEqual(await tab.names(), all);
  const click = (row: number, ...modifiers: ('Shift' | 'Control')[]) => page.click(`#row-${row}`, { modifiers });
  const key = (keys: string) => page.keyboard.press(keys);
  const steps: [string, () => Promise<unknown>, number[]][] = [
    ['a click chooses nothing yet', () => click(1), []],
    ['a span', () => click(3, 'Shift'), [1, 2, 3]],
    ['one out of it', () => click(2, 'Control'), [1, 3]],
    ['and another to it', () => click(0, 'Control'), [0, 1, 3]],
    ['another span beside it', () => page.click('#row-4', { modifiers: ['Shift', 'Control'] }), [0, 1, 2, 3, 4]],
    ['nothing', () => key('Escape'), []],
    ['by keys', async () => [await key('Home'), await key('Shift+ArrowDown'), await key('Shift+ArrowDown')], [0, 1, 2]],
    ['back again', () => key('Shift+ArrowUp'), [0, 1]],
    ['one by one', async () => [await key('Control+ArrowDown'), await key('Control+ArrowDown'), await key('Control+ ')], [0, 1, 3]],
    ['all', () => key('Control+a'), [0, 1, 2, 3, 4]],
    ['the arrow alone', () => key('ArrowUp'), []],
    ['two', async () => [await click(0), await click(2, 'Control')], [0, 2]],
  ];
  for (const [why, act, chosen] of steps) {
    await act();
    const want = chosen.map((row) => `row-${row}`).join();
    await page
      .waitForFunction((rows) => [...document.querySelectorAll('.row[aria-selected=true]')].map(({ id }) => id).sort().join() === rows, want)
      .catch((error) => assert.fail(`${why}: ${error}`));
  }
  await key('c');
  await page.getByText('2 paths copied.').waitFor();
  assert.equal(await page.evaluate(() => navigator.clipboard.readText()), '/files/docs/notes.txt\n/files/plans/plan middle.txt');
  const zipped = async (act: () => Promise<unknown>) => {
    const [download] = await Promise.all([page.waitForEvent('download'), act()]);
    assert.equal(download.suggestedFilename(), 'arbory.zip');
    return unpacked(await download.path());
  };
  const zip = () => page.getByRole('button', { name: 'Zip' }).click();
  assert.deepEqual(await zipped(zip), [`'docs/notes.txt' 2219`, `'plans/plan middle.txt' 2000`]);
  // In another order the places are others', so nothing is chosen any more.
  await page.getByRole('columnheader', { name: 'Name' }).getByRole('button').click();
  await tab.firstIs('view.png');
  await page.locator('.chosenbar').waitFor({ state: 'detached' });
  // Folders with what they hold, once; what cannot be read is told, names of any bytes come along.
  await tab.search('docs|locked|hostile|notes');
  await page.focus('.table');
  const names = await zipped(async () => [await key('Control+a'), await key('d')]);
  const holds = (name: string) => assert.equal(names.filter((line) => line.startsWith(`'${name}`)).length, 1, `${name} in\n${names.join('\n')}`);
  ['docs/notes.txt', 'docs/data.bin', 'hostile/hostile line\\nbreak.txt', 'hostile/hostile broken ', 'not included.txt'].forEach(holds);
  assert.ok(names.includes(`'hostile/hostile \\u05e9\\u05dc\\u05d5\\u05dd \\u05e2\\u05d5\\u05dc\\u05dd.txt' 4`), 'marked as UTF-8');
  // So does one folder that nobody chose but that is at hand.
  await tab.search('docs');
  await page.focus('.table');
  const alone = await zipped(async () => [await key('Home'), await key('d')]);
  assert.ok(alone.includes(`'docs/notes.txt' 2219`), alone.join());
  await tab.close();
});

test('what was found is narrowed while one types, and columns are chosen', async () => {
  const tab = await stage.openTab('#q=plan*.txt&sort=name', { acceptDownloads: true });
  const { page, tasks } = tab;
  const shows = (figures: string) => page.locator('.figures strong', { hasText: figures }).waitFor();
  await page.focus('.table');
  await page.keyboard.press('n');
  await page.keyboard.type('-large');
  await shows('0 of 3 matches');
  await page.fill('#narrow', '!large size:>100');
  await shows('1 of 3 matches');
  assert.deepEqual(await tab.names(), ['plan middle.txt']);
  await page.fill('#narrow', 'regex:(');
  await page.waitForSelector('#narrow[aria-invalid=true]');
  assert.deepEqual(await tab.names(), ['plan middle.txt'], 'the rows before stay');
  await page.fill('#narrow', '!large');
  await shows('2 of 3 matches');
  // What is narrowed is what is chosen from.
  await page.keyboard.press('Enter');
  await page.keyboard.press('Control+a');
  const [download] = await Promise.all([page.waitForEvent('download'), page.keyboard.press('d')]);
  assert.deepEqual(unpacked(await download.path()), [`'plan middle.txt' 2000`, `'plan small.txt' 10`]);
  await page.keyboard.press('Escape');
  await page.fill('#narrow', '');
  await shows('3 matches');
  assert.equal(tasks.length, 1, 'nothing was searched anew');

  const heads = () => page.locator('[role=columnheader]').allTextContents();
  await page.getByRole('button', { name: 'Columns' }).click();
  for (const name of ['Owner', 'Created']) await page.getByRole('checkbox', { name }).check();
  await page.getByRole('checkbox', { name: 'Type' }).uncheck();
  await page.getByRole('checkbox', { name: 'Small pictures' }).check();
  await page.keyboard.press('Escape');
  assert.deepEqual(await heads(), ['Name', 'Folder', 'Size', 'Modified', 'Created', 'Owner']);
  const owner = execFileSync('stat', ['-c', '%U', join(stage.place.root, 'files/plans/plan large.txt')], { encoding: 'utf8' }).trim();
  assert.equal(await page.textContent('#row-0 .user'), owner);
  await page.getByRole('columnheader', { name: 'Created' }).getByRole('button').click();
  await page.waitForURL(/sort=-crtime/);
  await page.reload();
  await tab.over();
  assert.deepEqual(await heads(), ['Name', 'Folder', 'Size', 'Modified', 'Created', 'Owner']);
  await page.setViewportSize({ width: 720, height: 700 });
  await page.waitForFunction(() => document.querySelectorAll('[role=columnheader]').length < 6);
  assert.equal(await page.evaluate(() => document.documentElement.scrollWidth), 720);
  await page.goto(`${stage.server.origin}/#q=view.png`);
  await page.waitForFunction(() => document.querySelector<HTMLImageElement>('#row-0 .thumbnail')?.naturalWidth === 1);
  await tab.close();
});
