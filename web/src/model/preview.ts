// What of a file can be shown beside the table.
import type { Highlighter } from './highlight.ts';
import { pieces, extensionOf, type Piece } from './text.ts';

export type PreviewKind = 'image' | 'pdf' | 'text' | 'none';

const words = (text: string) => new Set(text.split(' '));
const IMAGES = words('png jpg jpeg gif webp avif');
const TEXTS = words(
  'txt md log csv tsv json xml yaml yml ini conf cfg toml c h cpp hpp cc py js ts go rs java sh sql',
);

export function previewKind(name: string): PreviewKind {
  const extension = extensionOf(name);
  if (IMAGES.has(extension)) return 'image';
  if (extension === 'pdf') return 'pdf';
  return TEXTS.has(extension) ? 'text' : 'none';
}

// Enough to tell what it is; more would make the page slow, not the reader wiser.
const MOST_BYTES = 128 * 1024;
const MOST_MARKS = 300;

export interface TextStart {
  pieces: Piece[];
  cut: boolean;
}

// The beginning of a text file, read no further than shown. Rejects when it cannot be read.
export async function readStart(
  address: string,
  highlighter: Highlighter,
  signal: AbortSignal,
): Promise<TextStart> {
  const response = await fetch(address, { signal, credentials: 'same-origin' });
  if (!response.ok || !response.body) throw new Error(`status ${response.status}`);
  const reader = response.body.getReader();
  const decoder = new TextDecoder();
  let text = '';
  let bytes = 0;
  let cut = false;
  for (;;) {
    const { value, done } = await reader.read();
    if (done) break;
    bytes += value.length;
    cut = bytes > MOST_BYTES;
    text += decoder.decode(cut ? value.subarray(0, value.length - (bytes - MOST_BYTES)) : value, {
      stream: true,
    });
    if (cut) {
      await reader.cancel();
      break;
    }
  }
  const ranges = highlighter.ranges(text).slice(0, MOST_MARKS);
  return { pieces: textPieces(text, ranges), cut };
}

// Line breaks and tabs are shown as what they are here; other controls as signs.
function textPieces(text: string, ranges: [number, number][]): Piece[] {
  return pieces(text, ranges).map((piece) => {
    const plain = { '\\n': '\n', '\\t': '\t', '\\r': '' }[piece.text];
    return piece.sign && plain !== undefined ? { ...piece, text: plain } : piece;
  });
}
