// The files that the tests search.
import * as fs from 'node:fs';
import { join } from 'node:path';
import { deflateSync } from 'node:zlib';
import type { Place } from './server.ts';

export const MANY = 20_000;
const PER_FOLDER = 1000;

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
  write('docs/view.png', picture());
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

export function picture(width = 320, height = 200): Buffer {
  const rows = Buffer.alloc(height * (1 + width * 3));
  for (let y = 0; y < height; ++y) {
    for (let x = 0; x < width; ++x) {
      const at = y * (1 + width * 3) + 1 + x * 3;
      // An evening sky over hills and a lake, in parts of the whole.
      const [across, down] = [x / width, y / height];
      const far = 0.5 + 0.06 * Math.sin(across * 9) + 0.02 * Math.sin(across * 31);
      const near = 0.62 + 0.05 * Math.sin(across * 5 + 2) + 0.015 * Math.sin(across * 23);
      const sun = Math.max(0, 1 - 6 * Math.hypot(across - 0.68, (down - 0.42) * 0.7));
      let shade = [226 - 30 * down + 60 * sun, 178 + 40 * down + 50 * sun, 160 + 30 * down];
      if (down > far) shade = [104, 122, 134];
      if (down > near) shade = [52, 82, 74];
      if (down > 0.74) shade = [150 - 50 * down + 40 * sun, 160 - 40 * down, 168 - 30 * down];
      shade.forEach((value, i) => (rows[at + i] = Math.max(0, Math.min(255, value))));
    }
  }
  const chunk = (type: string, data: Buffer) => {
    const body = Buffer.concat([Buffer.from(type), data]);
    const frame = Buffer.alloc(8);
    frame.writeUInt32BE(data.length, 0);
    frame.writeUInt32BE(crc(body), 4);
    return Buffer.concat([frame.subarray(0, 4), body, frame.subarray(4)]);
  };
  const head = Buffer.alloc(13);
  head.writeUInt32BE(width, 0);
  head.writeUInt32BE(height, 4);
  head.set([8, 2, 0, 0, 0], 8); // 8 bits, red green blue
  const signature = Buffer.from([0x89, 0x50, 0x4e, 0x47, 0x0d, 0x0a, 0x1a, 0x0a]);
  return Buffer.concat([
    signature,
    chunk('IHDR', head),
    chunk('IDAT', deflateSync(rows)),
    chunk('IEND', Buffer.alloc(0)),
  ]);
}

function crc(data: Buffer): number {
  let value = ~0;
  for (const byte of data) {
    value ^= byte;
    for (let bit = 0; bit < 8; ++bit) value = (value >>> 1) ^ (value & 1 ? 0xedb88320 : 0);
  }
  return ~value >>> 0;
}
