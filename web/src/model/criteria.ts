// What a person asks for, as the form and the address bar hold it, and what becomes of it: the
// parameters of a search's start. Values stay as they were typed until the search starts, so that
// "last 7 days" in a shared link means the seven days before it is opened.
import { parseSize } from './size.ts';
import { timeBounds } from './times.ts';

export const KINDS = [
  ['', 'Anything'],
  ['file', 'Files'],
  ['dir', 'Folders'],
  ['document', 'Documents'],
  ['image', 'Pictures'],
  ['video', 'Videos'],
  ['audio', 'Audio'],
  ['archive', 'Archives'],
] as const;

export interface Criteria {
  pattern: string;
  folders: string[]; // none: every folder the user can see
  kind: string;
  extension: string;
  sizeFrom: string;
  sizeTo: string;
  modified: string;
  created: string;
  accessed: string;
  owner: string;
  group: string;
  contents: boolean;
  subfolders: boolean;
}

export const NO_CRITERIA: Criteria = {
  pattern: '',
  folders: [],
  kind: '',
  extension: '',
  sizeFrom: '',
  sizeTo: '',
  modified: '',
  created: '',
  accessed: '',
  owner: '',
  group: '',
  contents: false,
  subfolders: true,
};

// A criterion that cannot be understood: which one, and a sentence about it.
export class CriterionError extends Error {
  constructor(
    readonly field: keyof Criteria,
    message: string,
  ) {
    super(message);
  }
}

const TIMES = [
  ['modified', 'mtime'],
  ['created', 'crtime'],
  ['accessed', 'atime'],
] as const;

export type StartParams = Record<string, unknown>;

// Everything but the pattern and the folders.
export function hasCriteria(c: Criteria): boolean {
  const { pattern: _p, folders: _f, ...rest } = c;
  const { pattern: _q, folders: _g, ...none } = NO_CRITERIA;
  return JSON.stringify(rest) !== JSON.stringify(none);
}

export function sameCriteria(a: Criteria, b: Criteria): boolean {
  return JSON.stringify(a) === JSON.stringify(b);
}

// Throws CriterionError. `everywhere` is what stands for no chosen folder.
export function startParams(c: Criteria, everywhere: string[], now: Date): StartParams {
  const folders = c.folders.length > 0 ? c.folders : everywhere;
  if (folders.length === 0) {
    throw new CriterionError('folders', 'There is no folder that you may search. Ask for access.');
  }
  const params: StartParams = {
    folder_path: folders,
    pattern: c.pattern,
    recursive: c.subfolders,
    search_content: c.contents,
    search_type: hasCriteria(c) ? 'advance' : 'simple',
  };
  if (c.contents && c.pattern.trim() === '') {
    throw new CriterionError('contents', 'Type the words to look for inside the files.');
  }
  if (c.kind) params.filetype = c.kind;
  if (c.extension.trim()) params.extension = c.extension.trim();
  if (c.owner.trim()) params.owner = c.owner.trim();
  if (c.group.trim()) params.group = c.group.trim();
  const from = sizeParam(c.sizeFrom, 'sizeFrom');
  const to = sizeParam(c.sizeTo, 'sizeTo');
  if (from !== undefined && to !== undefined && from > to) {
    throw new CriterionError('sizeTo', 'The largest size is below the smallest one.');
  }
  if (from !== undefined) params.size_from = from;
  if (to !== undefined) params.size_to = to;
  for (const [field, name] of TIMES) {
    const bounds = timeBounds(c[field], now);
    if (!bounds) throw new CriterionError(field, 'Choose a time from the list, or give two dates.');
    if (bounds.from !== undefined && bounds.to !== undefined && bounds.from > bounds.to) {
      throw new CriterionError(field, 'The last day is before the first one.');
    }
    if (bounds.from !== undefined) params[`${name}_from`] = bounds.from;
    if (bounds.to !== undefined) params[`${name}_to`] = bounds.to;
  }
  return params;
}

function sizeParam(text: string, field: 'sizeFrom' | 'sizeTo'): number | undefined {
  if (text.trim() === '') return undefined;
  const size = parseSize(text);
  if (size === undefined) {
    throw new CriterionError(field, 'Write a size as a number with a unit: 500, 20 KB, 1.5 GB.');
  }
  return size;
}
