// The files that the tests search.
import * as fs from 'node:fs';
import { join } from 'node:path';
import type { Place } from './server.ts';

export const MANY = 20_000;
const PER_FOLDER = 1000;
// Of one point.
const PICTURE =
  'iVBORw0KGgoAAAANSUhEUgAAAAEAAAABCAYAAAAfFcSJAAAADUlEQVR42mNkYPhfDwAChwGA60e6kgAAAABJRU5ErkJggg==';

export const HOSTILE = [
  '<script>alert(1)',
  '<svg onload=alert(1)>',
  '<img src=x onerror=alert(2)>.txt',
  '"quoted" \'name\' & more.txt',
  'line\nbreak.txt',
  'tab\there.txt',
  '\u202egnp.exe',
  'שלום עולם.txt',
  '\x1b[31mred.txt',
  '{{7*7}} ${7*7} %00 %2f.txt',
  "javascript:alert(3)",
];
const BROKEN = Buffer.concat([Buffer.from('hostile broken '), Buffer.from([0xff, 0xfe]), Buffer.from('.txt')]);

export function makeFiles(place: Place): string {
  const top = place.folder('files');
  const write = (path: string, content: string | Buffer = '') => {
    fs.mkdirSync(join(top, path, '..'), { recursive: true });
    fs.writeFileSync(join(top, path), content);
  };
  HOSTILE.forEach((name) => write(`hostile/hostile ${name}`, 'safe'));
  fs.writeFileSync(Buffer.concat([Buffer.from(join(top, 'hostile/')), BROKEN]), '');
  for (const [name, bytes, day] of [
    ['plan small.txt', 10, '2026-01-03'],
    ['plan large.txt', 30_000, '2026-01-01'],
    ['plan middle.txt', 2000, '2026-01-02'],
  ] as const) {
    write(`plans/${name}`, 'x'.repeat(bytes));
    fs.utimesSync(join(top, 'plans', name), new Date(day), new Date(day));
  }
  write('docs/notes.txt', 'first line\n'.repeat(200) + 'the needle is here\n');
  write('docs/data.bin', Buffer.from([0, 1, 2, 255]));
  write('docs/100% & "fine" #1.txt', 'content of the oddly named');
  fs.mkdirSync(join(top, 'Straße/été'), { recursive: true });
  write('docs/view.png', Buffer.from(PICTURE, 'base64'));
  // Reading its contents takes minutes; it takes no room.
  write('slow/endless.txt', 'text '.repeat(60_000));
  fs.truncateSync(join(top, 'slow/endless.txt'), 2 ** 39);
  write('locked/secret.txt');
  fs.chmodSync(join(top, 'locked'), 0);
  return top;
}

export const itemName = (i: number) => `item ${String(i).padStart(6, '0')}.dat`;

export function makeMany(place: Place): string {
  const top = place.folder('many');
  for (let first = 0; first < MANY; first += PER_FOLDER) {
    const folder = join(top, `f${first / PER_FOLDER}`);
    fs.mkdirSync(folder);
    for (let i = first; i < first + PER_FOLDER; ++i) {
      fs.closeSync(fs.openSync(`${folder}/${itemName(i)}`, 'w'));
    }
  }
  return top;
}
