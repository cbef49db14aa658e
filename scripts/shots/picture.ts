// A picture to preview, as a PNG file.
import { deflateSync } from 'node:zlib';

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
