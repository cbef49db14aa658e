// What a person asks for, as the form and the address bar hold it, and what becomes of it: what the
// server is asked for, and words. Values stay as they were typed until
// the search starts, so that "last 7 days" in a shared link means the seven days before it is
// opened; what they mean the server alone knows.
import { asSentence } from '../api/errors.ts';
import type { Wrong } from '../api/types.ts';
import { plural } from './text.ts';
import { describeTime } from './times.ts';

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

// Everything but the pattern and the folders.
export type Field = Exclude<keyof Criteria, 'pattern' | 'folders'>;
export type TextField = { [F in Field]: Criteria[F] extends string ? F : never }[Field];
export type StartParams = Record<string, unknown>;

// A criterion that cannot be understood: which one, and a sentence about it.
export class CriterionError extends Error {
  constructor(
    readonly field: keyof Criteria,
    message: string,
  ) {
    super(message);
  }
}

// How one criterion is offered, sent and told. Adding one is adding a row to CRITERIA: the form, the
// address, the request, the tags and the repeated search are made of it.
interface Criterion<F extends Field> {
  none: Criteria[F]; // restricts nothing
  key: string; // in the address
  input: 'kind' | 'text' | 'time' | 'choice' | 'folders'; // 'folders': chosen beside them
  label: string;
  placeholder?: string;
  sent: string; // under this name, as it was typed
  params: readonly string[]; // of start, that it becomes
  describe(value: Criteria[F], all: Criteria): string; // empty: nothing to say
  fits?(value: Criteria[F]): boolean; // what an address may hold; anyone can write one
}

function text(key: string, param: string, label: string, placeholder: string, about: (value: string) => string) {
  return {
    none: '',
    key,
    input: 'text',
    label,
    placeholder,
    sent: param,
    params: [param],
    describe: (value: string) => value && about(value),
  } as const;
}

function account(param: string, placeholder: string, label: string) {
  return text(param, param, label, placeholder, (value) => `${param} ${value}`);
}

function size(key: string, param: string, label: string, placeholder: string, about: Criterion<'sizeTo'>['describe']) {
  return {
    ...text(key, param, label, placeholder, () => ''),
    describe: (value: string, all: Criteria) => value && about(tidy(value), all),
  };
}

function time(key: string, param: string, label: string, verb: string) {
  return {
    none: '',
    key,
    input: 'time',
    label,
    sent: param,
    params: [`${param}_from`, `${param}_to`],
    describe: (value: string) => value && `${verb} ${describeTime(value)}`,
  } as const;
}

const isKind = (value: unknown) => KINDS.some(([kind]) => kind === value);

// In the order in which they are shown.
export const CRITERIA: { readonly [F in Field]: Criterion<F> } = {
  kind: {
    ...text('type', 'filetype', 'Type', '', () => ''),
    input: 'kind',
    describe: (value) => (value ? KINDS.find(([kind]) => kind === value)?.[1].toLowerCase() ?? '' : ''),
    fits: isKind,
  },
  extension: text('ext', 'extension', 'Extension', 'jpg, png, tar.gz', (value) => '.' + value.replace(/^[*.]+/, '')),
  sizeFrom: size('min', 'size_from', 'Size from', '10 MB', (value, all) =>
    all.sizeTo ? `${value} to ${tidy(all.sizeTo)}` : `at least ${value}`,
  ),
  sizeTo: size('max', 'size_to', 'to', '2 GB', (value, all) => (all.sizeFrom ? '' : `at most ${value}`)),
  modified: time('modified', 'mtime', 'Modified', 'modified'),
  created: time('created', 'crtime', 'Created', 'created'),
  accessed: time('accessed', 'atime', 'Last opened', 'opened'),
  owner: account('owner', 'account name', 'Owner'),
  group: account('group', 'group name', 'Group'),
  contents: {
    none: false,
    key: 'contents',
    input: 'choice',
    label: 'Also look inside files',
    sent: 'search_content',
    params: ['search_content'],
    describe: (value) => (value ? 'also inside files' : ''),
  },
  subfolders: {
    none: true,
    key: 'subfolders',
    input: 'folders',
    label: 'Subfolders',
    sent: 'recursive',
    params: ['recursive'],
    describe: (value) => (value ? '' : 'not in subfolders'),
  },
};
export const FIELDS = Object.keys(CRITERIA) as Field[];

export const NO_CRITERIA: Criteria = {
  pattern: '',
  folders: [],
  ...(Object.fromEntries(FIELDS.map((field) => [field, CRITERIA[field].none])) as Pick<Criteria, Field>),
};

// A row whose field is not known beforehand: its values are those of that field.
export const criterion = (field: Field) => CRITERIA[field] as Criterion<Field> as Criterion<'kind'>;
const valueOf = (c: Criteria, field: Field) => c[field] as string;

export function hasCriteria(c: Criteria): boolean {
  return FIELDS.some((field) => c[field] !== NO_CRITERIA[field]);
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

// "pictures, at least 1 MB, modified last 7 days".
export function describe(c: Criteria): string[] {
  return FIELDS.map((field) => criterion(field).describe(valueOf(c, field), c)).filter(Boolean);
}

// What was typed, as the server is asked to read it.
export function typed(c: Criteria): StartParams {
  const asked: StartParams = { pattern: c.pattern };
  for (const field of FIELDS) {
    const value = c[field];
    const text = typeof value === 'string' ? value.trim() : value;
    if (text !== '') asked[criterion(field).sent] = text;
  }
  return asked;
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
  if ('wrong' in reply) {
    const { criterion: name, sentence } = reply.wrong;
    const ofName = (field: Field) => criterion(field).sent === name;
    throw new CriterionError(FIELDS.find(ofName) ?? 'pattern', asSentence(sentence));
  }
  return reply;
}

function tidy(size: string): string {
  return size.trim().replace(/^\d+$/, (digits) => plural(Number(digits), 'byte'));
}
