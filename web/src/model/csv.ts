// Results as files to keep. CSV follows RFC 4180 (CRLF, quotes doubled) and is safe to open in a
// spreadsheet: what would be taken for a formula gets an apostrophe in front.
import type { FileRow } from '../api/types.ts';

const COLUMNS = ['path', 'name', 'kind', 'size', 'modified', 'created', 'owner', 'group'];
const FORMULA = /^[=+\-@\t\r\n]/;
// Tells spreadsheets that the text is UTF-8.
const BYTE_ORDER_MARK = '\ufeff';

export const csvHeader = () => BYTE_ORDER_MARK + COLUMNS.join(',') + '\r\n';

export function csvRow(row: FileRow): string {
  const cells = [
    row.path,
    row.name,
    row.is_dir ? 'folder' : 'file',
    row.is_dir || row.size === undefined ? '' : String(row.size),
    isoTime(row.time?.mtime),
    isoTime(row.time?.crtime),
    row.owner?.user ?? '',
    row.owner?.group ?? '',
  ];
  return cells.map(csvCell).join(',') + '\r\n';
}

export function csvCell(text: string): string {
  const safe = FORMULA.test(text) ? "'" + text : text;
  return /[",\r\n]/.test(safe) ? `"${safe.replaceAll('"', '""')}"` : safe;
}

export function jsonLine(row: FileRow): string {
  return JSON.stringify(row) + '\n';
}

function isoTime(second: number | undefined): string {
  return second ? new Date(second * 1000).toISOString().replace('.000Z', 'Z') : '';
}
