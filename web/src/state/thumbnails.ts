// Small pictures for the rows that are seen. Little is fetched for each: of a photo its beginning,
// where cameras put a small one; of another picture all of it, if that is little. The newest wish
// comes first, as the older ones have been scrolled past.
import { fileAddress } from '../api/client.ts';
import type { FileRow } from '../api/types.ts';
import { smallPicture } from '../model/exif.ts';
import { previewKind } from '../model/preview.ts';
import { extensionOf } from '../model/text.ts';

const BEGINNING = 96 * 1024; // holds what cameras write, which is 64 KB at most, and what may stand before
const WHOLE = 64 * 1024;
const AT_ONCE = 3;
const MOST_KEPT = 400;
const MOST_WANTED = 60;

export type Thumbnail = string | null; // an address; null: there is none

export class Thumbnails {
  private readonly kept = new Map<string, Thumbnail>(); // the oldest first
  private wanted: FileRow[] = [];
  private flying = new Set<string>();

  constructor(private readonly changed: () => void) {}

  // Undefined while it is not known.
  of(row: FileRow): Thumbnail | undefined {
    if (row.is_dir || previewKind(row.name) !== 'image') return null;
    const key = keyOf(row);
    const known = this.kept.get(key);
    if (known === undefined && !this.flying.has(key)) {
      this.wanted = [row, ...this.wanted.filter((other) => other !== row)].slice(0, MOST_WANTED);
      queueMicrotask(() => this.pump());
    }
    return known;
  }

  private pump(): void {
    while (this.flying.size < AT_ONCE && this.wanted.length > 0) void this.fetch(this.wanted.shift()!);
  }

  private async fetch(row: FileRow): Promise<void> {
    const key = keyOf(row);
    if (this.kept.has(key) || this.flying.has(key)) return;
    this.flying.add(key);
    let address: Thumbnail = null;
    try {
      address = await load(row);
    } catch {
      // Its icon says as much.
    }
    this.flying.delete(key);
    this.keep(key, address);
    this.changed();
    this.pump();
  }

  private keep(key: string, address: Thumbnail): void {
    this.kept.set(key, address);
    for (const [old, held] of this.kept) {
      if (this.kept.size <= MOST_KEPT) break;
      if (held) URL.revokeObjectURL(held);
      this.kept.delete(old);
    }
  }
}

const keyOf = (row: FileRow) => `${row.path} ${row.time?.mtime}`;

async function load(row: FileRow): Promise<Thumbnail> {
  const size = row.size ?? Infinity;
  const isPhoto = /^jpe?g$/.test(extensionOf(row.name));
  if (size === 0 || (size > WHOLE && !isPhoto)) return null;
  const range = { Range: `bytes=0-${BEGINNING - 1}` };
  const reply = await fetch(fileAddress(row, true), {
    credentials: 'same-origin',
    headers: size > WHOLE ? range : {},
  });
  const whole = reply.status === 200 && size <= WHOLE;
  if (!whole && reply.status !== 206) return null;
  if (whole) return URL.createObjectURL(await reply.blob());
  const picture = smallPicture(new Uint8Array(await reply.arrayBuffer()));
  return picture && URL.createObjectURL(new Blob([picture.slice()], { type: 'image/jpeg' }));
}
