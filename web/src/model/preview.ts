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

const MOST_MARKS = 300;

// Line breaks and tabs are shown as what they are here; other controls as signs.
export function textPieces(text: string, highlighter: Highlighter): Piece[] {
  return pieces(text, highlighter.ranges(text).slice(0, MOST_MARKS)).map((piece) => {
    const plain = { '\\n': '\n', '\\t': '\t', '\\r': '' }[piece.text];
    return piece.sign && plain !== undefined ? { ...piece, text: plain } : piece;
  });
}
