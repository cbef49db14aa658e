// The folders inside a folder, for the picker. There is no call that lists a folder, so a search
// for folders that does not descend does it; it leaves no trace in the history.
import * as client from '../api/client.ts';

export const MOST_FOLDERS = 500;
const TRIES = 40;
const TRY_MS = 100;

export interface Subfolders {
  paths: string[];
  more: number; // left out
}

export async function listSubfolders(path: string): Promise<Subfolders> {
  const { taskid } = await client.startSearch({
    folder_path: [path],
    filetype: 'dir',
    recursive: false,
    search_content: false,
  });
  try {
    for (let tries = 1; ; ++tries) {
      const page = await client.listResults({
        taskid,
        offset: 0,
        limit: MOST_FOLDERS,
        sort_by: 'name',
      });
      if (page.finished || tries === TRIES) {
        const paths = page.files.map((row) => row.path);
        return { paths, more: page.total - paths.length };
      }
      await new Promise((done) => setTimeout(done, TRY_MS));
    }
  } finally {
    client.cleanSearch(taskid).catch(() => {});
  }
}
