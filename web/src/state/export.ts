// The whole result as a file to keep, fetched page by page in the order that is shown.
import type { FileRow } from '../api/types.ts';
import { csvHeader, csvRow, jsonLine } from '../model/csv.ts';
import { saveBlob } from './save.ts';
import type { Search } from './search.ts';

export type ExportFormat = 'csv' | 'jsonl';

// Larger pages cost the server fewer calls; some 500 KB each.
const EXPORT_ROWS = 2000;

const FORMATS = {
  csv: { type: 'text/csv;charset=utf-8', header: csvHeader, row: csvRow },
  jsonl: { type: 'application/x-ndjson', header: () => '', row: jsonLine },
};

// Calls `progress` with the part done; false when `cancelled` made it end early.
export async function exportResults(
  search: Search,
  format: ExportFormat,
  progress: (part: number) => void,
  cancelled: () => boolean,
): Promise<boolean> {
  const { type, header, row } = FORMATS[format];
  // Blobs of their own let the browser move them out of memory.
  const parts: Blob[] = [new Blob([header()])];
  for (let offset = 0; ; ) {
    if (cancelled()) return false;
    const page = await search.list(offset, EXPORT_ROWS);
    parts.push(new Blob([page.files.map((file: FileRow) => row(file)).join('')]));
    offset += page.files.length;
    progress(page.total > 0 ? offset / page.total : 1);
    if (page.files.length < EXPORT_ROWS) break;
  }
  saveBlob(new Blob(parts, { type }), `arbory-results.${format}`);
  return true;
}
