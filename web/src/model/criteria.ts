// What a person asks for, as the form and the address bar hold it, and what becomes of it: the
// parameters of a search's start, what the server remembers of them, and words. Values stay as they
// were typed until the search starts, so that "last 7 days" in a shared link means the seven days
// before it is opened.
import { exactSize, formatSize, parseSize } from './size.ts';
import { customValue, describeTime, timeBounds } from './times.ts';

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

// How one criterion is offered, sent, remembered and told. Adding one is adding a row to CRITERIA:
// the form, the address, the request, the history, the tags and the repeated search are made of it.
interface Criterion<F extends Field> {
  none: Criteria[F]; // restricts nothing
  key: string; // in the address
  input: 'kind' | 'text' | 'time' | 'choice' | 'folders'; // 'folders': chosen beside them
  label: string;
  placeholder?: string;
  // The parameters of start that it becomes; also the members of a remembered search, see `recall`.
  params: readonly string[];
  // The values of `params`; what is undefined is not sent. Throws the sentence about what is wrong.
  send(value: Criteria[F], now: Date): readonly unknown[];
  // From the remembered values of `params`. Null: they do not tell what was asked for, so that the
  // search cannot be repeated.
  recall(values: readonly unknown[]): Criteria[F] | null;
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
    params: [param],
    send: (value: string) => [value.trim() || undefined],
    recall: ([value]: readonly unknown[]) => (typeof value === 'string' ? value : ''),
    describe: (value: string) => value && about(value),
  } as const;
}

// Remembered by the server as an id, which a search does not take: repeating it would silently find
// more than it did.
function account(param: string, placeholder: string, label: string) {
  return {
    ...text(param, param, label, placeholder, (value) => `${param} ${value}`),
    recall: ([id]: readonly unknown[]) => (id === undefined ? '' : null),
  };
}

function size(key: string, param: string, label: string, placeholder: string, about: Criterion<'sizeTo'>['describe']) {
  return {
    ...text(key, param, label, placeholder, () => ''),
    send: (value: string) => {
      const bytes = parseSize(value);
      if (bytes === undefined && value.trim()) {
        throw 'Write a size as a number with a unit: 500, 20 KB, 1.5 GB.';
      }
      return [bytes];
    },
    recall: ([bytes]: readonly unknown[]) =>
      typeof bytes === 'number' && bytes >= 0 ? exactSize(bytes) : '',
    describe: (value: string, all: Criteria) => value && about(tidy(value), all),
  };
}

function time(key: string, param: string, label: string, verb: string) {
  return {
    none: '',
    key,
    input: 'time',
    label,
    params: [`${param}_from`, `${param}_to`],
    send: (value: string, now: Date) => {
      const bounds = timeBounds(value, now);
      if (!bounds) throw 'Choose a time from the list, or give two dates.';
      if (bounds.from !== undefined && bounds.to !== undefined && bounds.from > bounds.to) {
        throw 'The last day is before the first one.';
      }
      return [bounds.from, bounds.to];
    },
    recall: ([from, to]: readonly unknown[]) => customValue(number(from), number(to)),
    describe: (value: string) => value && `${verb} ${describeTime(value)}`,
    fits: (value: string) => timeBounds(value, new Date()) !== undefined,
  } as const;
}

const isKind = (value: unknown) => KINDS.some(([kind]) => kind === value);

// In the order in which they are shown.
export const CRITERIA: { readonly [F in Field]: Criterion<F> } = {
  kind: {
    ...text('type', 'filetype', 'Type', '', () => ''),
    input: 'kind',
    recall: ([kind]) => (kind === undefined ? '' : isKind(kind) ? String(kind) : null),
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
    params: ['search_content'],
    send: (value) => [value],
    recall: ([value]) => value === true, // seldom remembered: see fromRecord
    describe: (value) => (value ? 'also inside files' : ''),
  },
  subfolders: {
    none: true,
    key: 'subfolders',
    input: 'folders',
    label: 'Subfolders',
    params: ['recursive'],
    send: (value) => [value],
    recall: ([value]) => value !== false,
    describe: (value) => (value ? '' : 'not in subfolders'),
  },
};
export const FIELDS = Object.keys(CRITERIA) as Field[];
// What a search is made of beside the criteria.
export const OTHER_PARAMS = ['folder_path', 'pattern', 'search_type'];

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

export function sameCriteria(a: Criteria, b: Criteria): boolean {
  return JSON.stringify(a) === JSON.stringify(b);
}

// "pictures, at least 1 MB, modified last 7 days".
export function describe(c: Criteria): string[] {
  return FIELDS.map((field) => criterion(field).describe(valueOf(c, field), c)).filter(Boolean);
}

// Throws CriterionError. `everywhere` is what stands for no chosen folder.
export function startParams(c: Criteria, everywhere: string[], now: Date): StartParams {
  const folders = c.folders.length > 0 ? c.folders : everywhere;
  if (folders.length === 0) {
    throw new CriterionError('folders', 'There is no folder that you may search. Ask for access.');
  }
  if (c.contents && c.pattern.trim() === '') {
    throw new CriterionError('contents', 'Type the words to look for inside the files.');
  }
  const params: StartParams = {
    folder_path: folders,
    pattern: c.pattern,
    search_type: hasCriteria(c) ? 'advance' : 'simple',
  };
  for (const field of FIELDS) {
    const values = sent(c, field, now);
    criterion(field).params.forEach((name, i) => {
      if (values[i] !== undefined) params[name] = values[i];
    });
  }
  if (Number(params.size_from) > Number(params.size_to)) {
    throw new CriterionError('sizeTo', 'The largest size is below the smallest one.');
  }
  return params;
}

function sent(c: Criteria, field: Field, now: Date): readonly unknown[] {
  try {
    return criterion(field).send(valueOf(c, field), now);
  } catch (sentence) {
    throw typeof sentence === 'string' ? new CriterionError(field, sentence) : sentence;
  }
}

function number(value: unknown): number | undefined {
  return typeof value === 'number' ? value : undefined;
}

function tidy(value: string): string {
  return /^\d+$/.test(value.trim()) ? formatSize(Number(value)) : value.trim();
}
