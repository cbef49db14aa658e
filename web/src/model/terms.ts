// The criteria of the panel as terms of the query: each shows the last term of its prefix that holds
// by itself and that it can show. All others stay in the text as they are.
import { quoted, valueOf, without, type Query, type Span } from './query.ts';

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

export const TIMES = { modified: 'Modified', created: 'Created', opened: 'Last opened' } as const;
export const TEXTS = {
  ext: ['Extension', 'jpg, png, tar.gz'],
  owner: ['Owner', 'account name'],
  group: ['Group', 'group name'],
} as const;

// Folders full of files that nobody looks for.
export const USUAL_EXCLUDES = ['@eaDir', '.git', 'node_modules'] as const;

export const isKind = (value: string) => KINDS.some(([kind]) => kind === value);

// The two ends of a size; nothing where it has another form.
export function sizeEnds(value: string): [string, string] | null {
  if (value === '') return ['', ''];
  const match = /^(?:([^<>=.]*(?:\.\d[^<>=.]*)?)\.\.([^<>=]*)|>=([^<>=]*)|<=([^<>=]*))$/.exec(value);
  return match && [match[1] ?? match[3] ?? '', match[2] ?? match[4] ?? ''];
}

// Of the form's two fields.
export function sizeBetween(from: string, to: string): string {
  const [first, last] = [from, to].map((text) => text.replace(/\s+/g, ''));
  return first || last ? quoted(`${first}..${last}`) : '';
}

// A value of another criterion, as it was typed, as it stands in the query.
export function written(prefix: string, value: string): string {
  const text = value.trim();
  return quoted(prefix === 'ext' ? text.replace(/[\s,;]+/g, ',') : text);
}

const PREFIXES = ['type', 'size', ...Object.keys(TIMES), ...Object.keys(TEXTS)];

function shows(prefix: string, value: string): boolean {
  if (prefix === 'type') return isKind(value);
  if (prefix === 'size') return sizeEnds(value) !== null;
  return PREFIXES.includes(prefix);
}

// The term that the panel shows and changes.
export function shownTerm(query: Query, prefix: string): Span | undefined {
  const fits = (span: Span) => span.alone && span.prefix === prefix && shows(prefix, valueOf(query, span));
  return query.spans.findLast(fits);
}

export function shownValue(query: Query, prefix: string): string {
  const term = shownTerm(query, prefix);
  return term ? valueOf(query, term) : '';
}

// Without what the panel shows.
export function withoutCriteria(query: Query): Query {
  const drop = (left: Query, prefix: string) => {
    const term = shownTerm(left, prefix);
    return term ? without(left, term) : left;
  };
  return PREFIXES.reduce(drop, query);
}

export const excludesOf = ({ spans }: Query): string[] =>
  spans.flatMap(({ prefix, alone, values }) => (prefix === 'exclude' && alone ? (values ?? []) : []));

// Terms with a prefix that the panel does not show, as they are written.
export function onlyInText(query: Query): string[] {
  const { text, spans } = query;
  return spans
    .filter((span) => span.kind === 'prefix' && !(span.alone && span.prefix === 'exclude'))
    .filter((span) => shownTerm(query, span.prefix!) !== span)
    .map(({ begin, end }) => text.slice(text[begin - 1] === '!' ? begin - 1 : begin, end));
}

// Of an address that was made when criteria stood beside the pattern: the query that says the same.
export function fromFields(pattern: string, field: (key: string) => string): string {
  const size = sizeBetween(field('min'), field('max'));
  const values: [string, string][] = [
    ['type', isKind(field('type')) ? field('type') : ''],
    ['ext', written('ext', field('ext'))],
    ['size', size],
    ...(['modified', 'created', 'owner', 'group'] as const).map((key) => [key, written(key, field(key))] as [string, string]),
    ['opened', written('opened', field('accessed'))],
  ];
  const terms = values.filter(([, value]) => value !== '').map(([prefix, value]) => `${prefix}:${value}`);
  // What stands before a pattern is never part of it.
  return [...terms, ...(pattern && [pattern])].join(' ');
}
