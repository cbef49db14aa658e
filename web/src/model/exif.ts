// The small picture that cameras put at the beginning of a photo: found in the first bytes of a JPEG
// file, so that a table of photos need not fetch them whole. The bytes are somebody's: every offset is
// checked against their end.
const APP1 = 0xe1;
const SCAN = 0xda; // the picture itself begins
const IFD1 = 1; // of the small picture; the first is of the whole
const AT = 0x0201;
const LENGTH = 0x0202;
const ENTRY_BYTES = 12;

export function smallPicture(bytes: Uint8Array): Uint8Array | null {
  const view = new DataView(bytes.buffer, bytes.byteOffset, bytes.byteLength);
  const has = (at: number, count: number) => at >= 0 && at + count <= bytes.length;
  if (!has(0, 2) || view.getUint16(0) !== 0xffd8) return null;
  for (let at = 2; has(at, 4) && bytes[at] === 0xff && bytes[at + 1] !== SCAN; ) {
    const length = view.getUint16(at + 2);
    const isExif = bytes[at + 1] === APP1 && has(at + 4, 6) && view.getUint32(at + 4) === 0x45786966;
    if (isExif) {
      const start = at + 10;
      return inTiff(bytes.subarray(start, Math.min(at + 2 + length, bytes.length)));
    }
    at += 2 + Math.max(length, 2);
  }
  return null;
}

function inTiff(bytes: Uint8Array): Uint8Array | null {
  const view = new DataView(bytes.buffer, bytes.byteOffset, bytes.byteLength);
  const has = (at: number, count: number) => at >= 0 && at + count <= bytes.length;
  if (!has(0, 8)) return null;
  const little = view.getUint16(0) === 0x4949;
  const short = (at: number) => view.getUint16(at, little);
  const long = (at: number) => view.getUint32(at, little);
  // From one directory to the next.
  let at = long(4);
  for (let skipped = 0; skipped < IFD1; ++skipped) {
    const next = has(at, 2) ? at + 2 + ENTRY_BYTES * short(at) : -1;
    if (!has(next, 4)) return null;
    at = long(next);
  }
  if (at === 0 || !has(at, 2)) return null;
  let [from, length] = [0, 0];
  for (let entry = 0; entry < short(at); ++entry) {
    const place = at + 2 + ENTRY_BYTES * entry;
    if (!has(place, ENTRY_BYTES)) return null;
    if (short(place) === AT) from = long(place + 8);
    if (short(place) === LENGTH) length = long(place + 8);
  }
  const picture = length > 2 && has(from, length) ? bytes.subarray(from, from + length) : null;
  return picture?.[0] === 0xff && picture[1] === 0xd8 ? picture : null;
}
