// What a person asks for, as the form and the address bar hold it: a query, which says all that is
// asked of files, and what stands beside it. The text stays as it was typed, so that "last-7-days" in
// a shared link means the seven days before it is opened.
import { asSentence } from '../api/errors.ts';
import type { Wrong } from '../api/types.ts';

export interface Criteria {
  pattern: string;
  folders: string[]; // none: every folder the user can see
  contents: boolean;
  subfolders: boolean;
}

export type StartParams = Record<string, unknown>;

// What is asked for cannot be understood: which part, and a sentence about it.
export class CriterionError extends Error {
  constructor(
    readonly field: keyof Criteria,
    message: string,
  ) {
    super(message);
  }
}

export const NO_CRITERIA: Criteria = { pattern: '', folders: [], contents: false, subfolders: true };

// Whether more is asked for than the query says.
export function hasCriteria(c: Criteria): boolean {
  return c.contents || !c.subfolders;
}

// Whether this asks for nothing but what one folder holds, as opening it does.
export function browses(c: Criteria): boolean {
  return c.folders.length === 1 && sameCriteria(c, contentsOf(c.folders[0]!));
}

export function contentsOf(folder: string): Criteria {
  return { ...NO_CRITERIA, folders: [folder], subfolders: false };
}

export function sameCriteria(a: Criteria, b: Criteria): boolean {
  return JSON.stringify(a) === JSON.stringify(b);
}

// What is asked for beside the query, in words.
export function describe({ contents, subfolders }: Criteria): string[] {
  return [...(contents ? ['also inside files'] : []), ...(subfolders ? [] : ['not in subfolders'])];
}

// What was typed, as the server is asked to read it.
export function typed({ pattern, contents, subfolders }: Criteria): StartParams {
  // A half of a pair, as a broken text may hold, is no character to the server.
  return { pattern: pattern.toWellFormed(), search_content: contents, recursive: subfolders };
}

// Has a search begun by `begin`, which the server understands or not. Throws CriterionError.
// `everywhere` is what stands for no chosen folder.
export async function begun<Begun extends object>(
  c: Criteria,
  everywhere: string[],
  begin: (asked: StartParams) => Promise<Begun | Wrong>,
): Promise<Begun> {
  const folders = c.folders.length > 0 ? c.folders : everywhere;
  if (folders.length === 0) {
    throw new CriterionError('folders', 'There is no folder that you may search. Ask for access.');
  }
  if (c.contents && c.pattern.trim() === '') {
    throw new CriterionError('contents', 'Type the words to look for inside the files.');
  }
  const search_type = hasCriteria(c) ? 'advance' : 'simple';
  const reply = await begin({ ...typed(c), folder_path: folders, search_type });
  if ('wrong' in reply) throw new CriterionError('pattern', asSentence(reply.wrong.sentence));
  return reply;
}
