// What is done with several rows at once.
import * as client from '../api/client.ts';
import type { FileRow } from '../api/types.ts';
import type { Spans } from '../model/choice.ts';
import { follow } from './save.ts';
import { Search } from './search.ts';
import type { Shown } from './shown.ts';

// Of one request; some 500 KB.
const ROWS = 2000;

// The chosen rows, of which those that are not at hand are fetched.
export async function chosenRows(shown: Shown, spans: Spans): Promise<FileRow[]> {
  const rows: FileRow[] = [];
  for (const [first, last] of spans) {
    for (let at = first; at <= last; ) {
      const row = shown.pages.row(at);
      if (row || !(shown instanceof Search)) {
        if (row) rows.push(row);
        ++at;
        continue;
      }
      const { files } = await shown.list(at, Math.min(ROWS, last - at + 1));
      if (files.length === 0) break; // they have vanished
      rows.push(...files);
      at += files.length;
    }
  }
  return rows;
}

// As one archive. Gives a sentence where the server refuses; empty otherwise.
export async function downloadRows(search: Search, spans: Spans): Promise<string> {
  const address = search.zipAddress(spans);
  const refused = await client.refusal(address);
  if (!refused) follow(address, 'arbory.zip');
  return refused;
}
