// The criteria: another view of the terms of the query. What is chosen here is written there, and what
// is written there is shown here where it can be; below are the tags that say what the terms mean.
import { useRef, useState } from 'preact/hooks';
import { readQuery } from '../api/client.ts';
import { browses, hasCriteria, NO_CRITERIA } from '../model/criteria.ts';
import { nameList, without, withTerm, type Query, type Span } from '../model/query.ts';
import {
  excludesOf,
  KINDS,
  onlyInText,
  shownTerm,
  shownValue,
  sizeBetween,
  sizeEnds,
  TEXTS,
  TIMES,
  USUAL_EXCLUDES,
  withoutCriteria,
  written,
} from '../model/terms.ts';
import { isDay, splitCustom, TIME_WORDS } from '../model/times.ts';
import { visible } from '../model/text.ts';
import type { App } from '../state/app.ts';
import { Icon } from './icons.tsx';

const LAST_DAY = '2038-01-18'; // the last whole day that a search can compare
const BETWEEN = 'between';
const WRITTEN = 'written';

// `value` as it has to stand in a query.
function put(app: App, prefix: string, value: string): void {
  app.rewrite((query) => withTerm(query, shownTerm(query, prefix), prefix, value));
}

export function CriteriaPanel({ app }: { app: App }) {
  const { query } = app.reading;
  const bare = withoutCriteria(query);
  const others = onlyInText(query);
  const error = app.draftError?.field === 'contents' ? app.draftError.message : '';
  const removeAll = () => {
    app.rewrite(withoutCriteria);
    app.edit({ ...NO_CRITERIA, pattern: app.draft.pattern, folders: app.draft.folders });
  };
  return (
    <section class="criteria" id="criteria" aria-label="Criteria">
      <Kinds app={app} />
      <Text app={app} prefix="ext" />
      <Size app={app} />
      {(Object.keys(TIMES) as (keyof typeof TIMES)[]).map((prefix) => (
        <Time key={prefix} app={app} prefix={prefix} />
      ))}
      <Text app={app} prefix="owner" />
      <Text app={app} prefix="group" />
      <Contents app={app} />
      <ExcludeChoice app={app} />
      <footer>
        <p class="hint" role={error ? 'alert' : undefined}>
          {error ? <span class="wrong">{error}</span> : others.length > 0 ? <OnlyInText terms={others} /> : 'Write a size as 1.5 GB, and a time of your own as 2 weeks, 2026-07 or <2025.'}
        </p>
        <button
          type="button"
          class="quiet"
          disabled={!hasCriteria(app.draft) && bare.text === query.text}
          onClick={removeAll}
        >
          Remove all criteria
        </button>
      </footer>
    </section>
  );
}

function OnlyInText({ terms }: { terms: string[] }) {
  return (
    <>
      Only in the text:{' '}
      {terms.map((term, i) => (
        <>
          {i > 0 && ' '}
          <code>{visible(term)}</code>
        </>
      ))}
    </>
  );
}

function Kinds({ app }: { app: App }) {
  const { query } = app.reading;
  const chosen = shownValue(query, 'type');
  const other = chosen === '' && query.spans.some(({ prefix, alone }) => prefix === 'type' && alone);
  return (
    <fieldset class="kinds">
      <legend>Type</legend>
      <div class="segments">
        {KINDS.map(([kind, name]) => (
          <label key={kind}>
            <input
              type="radio"
              name="kind"
              checked={chosen === kind && !other}
              onChange={() => put(app, 'type', kind)}
            />
            <span>{name}</span>
          </label>
        ))}
      </div>
    </fieldset>
  );
}

function Contents({ app }: { app: App }) {
  return (
    <label class="choice contents">
      <input
        type="checkbox"
        checked={app.draft.contents}
        onChange={(event) => app.edit({ contents: event.currentTarget.checked })}
      />
      Also look inside files
    </label>
  );
}

interface TypedProps {
  app: App;
  prefix: string;
  value: string; // as the query has it
  put: (value: string) => string; // writes it, and gives what the query has then
  label?: string; // where no element around it has one
  placeholder?: string;
  list?: string; // of the element that holds what may be written
  offer?: (typed: string) => void; // is told of what is typed, and of the focus
}

// What is typed stays as it is typed while the query has it in its own form, or has not got it yet.
function Typed({ app, prefix, value, put: write, label, placeholder, list, offer }: TypedProps) {
  const [typed, setTyped] = useState({ text: value, before: value, value });
  const own = value === typed.value || value === typed.before;
  return (
    <input
      type="text"
      aria-label={label}
      value={own ? typed.text : value}
      placeholder={placeholder}
      list={list}
      spellcheck={false}
      autocapitalize="none"
      autocomplete="off"
      aria-invalid={shownTerm(app.reading.query, prefix)?.wrong !== undefined}
      onInput={(event) => {
        const text = event.currentTarget.value;
        setTyped({ text, before: value, value: write(text) });
        offer?.(text);
      }}
      onFocus={(event) => offer?.(event.currentTarget.value)}
      onBlur={() => setTyped({ text: value, before: value, value })}
      onKeyDown={(event) => event.key === 'Enter' && !event.isComposing && app.submit()}
    />
  );
}

const unquoted = (value: string) => value.replaceAll('"', '');

function Text({ app, prefix }: { app: App; prefix: keyof typeof TEXTS }) {
  const [label, placeholder] = TEXTS[prefix];
  const [accounts, offer] = useAccounts(prefix);
  const write = (text: string) => {
    const value = written(prefix, text);
    put(app, prefix, value);
    return unquoted(value);
  };
  return (
    <label class={`labelled ${prefix}`}>
      <span>{label}</span>
      <Typed
        app={app}
        prefix={prefix}
        value={shownValue(app.reading.query, prefix)}
        put={write}
        placeholder={placeholder}
        list={prefix === 'ext' ? undefined : `accounts-${prefix}`}
        offer={prefix === 'ext' ? undefined : offer}
      />
      {prefix !== 'ext' && (
        <datalist id={`accounts-${prefix}`}>
          {accounts.map((name) => (
            <option key={name} value={name} />
          ))}
        </datalist>
      )}
    </label>
  );
}

// The accounts that begin with what is typed, as the query line offers them behind the prefix. The
// newest question wins; without an answer nothing is offered.
function useAccounts(prefix: string): [string[], (typed: string) => void] {
  const [accounts, setAccounts] = useState<string[]>([]);
  const asked = useRef(new AbortController());
  const offer = (typed: string) => {
    asked.current.abort();
    asked.current = new AbortController();
    const { signal } = asked.current;
    const pattern = `${prefix}:"${unquoted(typed).toWellFormed()}`;
    readQuery({ pattern, caret: pattern.length }, signal)
      .then(({ completion }) => completion?.items.map(({ text }) => unquoted(text)) ?? [])
      .then((names) => signal.aborted || setAccounts(names))
      .catch(() => {});
  };
  return [accounts, offer];
}

function Size({ app }: { app: App }) {
  const [from, to] = sizeEnds(shownValue(app.reading.query, 'size')) ?? ['', ''];
  const write = (first: string, last: string) => {
    const value = sizeBetween(first, last);
    put(app, 'size', value);
    return sizeEnds(unquoted(value)) ?? ['', ''];
  };
  return (
    <div class="pair" role="group" aria-label="Size">
      <label class="labelled">
        <span>Size from</span>
        <Typed app={app} prefix="size" value={from} put={(text) => write(text, to)[0]} placeholder="10 MB" />
      </label>
      <label class="labelled">
        <span>to</span>
        <Typed app={app} prefix="size" value={to} put={(text) => write(from, text)[1]} placeholder="2 GB" />
      </label>
    </div>
  );
}

function Time({ app, prefix }: { app: App; prefix: keyof typeof TIMES }) {
  const label = TIMES[prefix];
  const value = shownValue(app.reading.query, prefix);
  const [from, to] = splitCustom(value);
  const isWord = TIME_WORDS.some(([word]) => word === value);
  const [choice, setChoice] = useState('');
  const days = from + to !== '' && [from, to].every((end) => end === '' || isDay(end));
  const told = isWord ? value : days ? BETWEEN : value !== '' ? WRITTEN : choice;
  const kind = choice === WRITTEN ? choice : told;
  const write = (text: string) => {
    const next = written(prefix, text);
    put(app, prefix, next);
    return unquoted(next);
  };
  const setDays = (first: string, last: string) => write(first || last ? `${first}..${last}` : '');
  return (
    <div class={`labelled time ${kind === BETWEEN ? 'custom' : ''}`} role="group" aria-label={label}>
      <label>
        <span>{label}</span>
        <select
          value={kind}
          onChange={(event) => {
            const word = event.currentTarget.value;
            const own = word === BETWEEN || word === WRITTEN;
            setChoice(own ? word : '');
            write(own ? '' : word);
          }}
        >
          <option value="">Any time</option>
          {TIME_WORDS.map(([word, name]) => (
            <option key={word} value={word}>
              {name}
            </option>
          ))}
          <option value={BETWEEN}>Between days …</option>
          <option value={WRITTEN}>As written …</option>
        </select>
      </label>
      {kind === WRITTEN && (
        <Typed
          app={app}
          prefix={prefix}
          value={value}
          put={write}
          label={`${label}, as written`}
          placeholder="2 weeks, 2026-07, <2025"
        />
      )}
      {kind === BETWEEN && (
        <div class="days">
          <input
            type="date"
            aria-label={`${label} from`}
            max={LAST_DAY}
            value={from}
            onChange={(event) => setDays(event.currentTarget.value, to)}
          />
          <span aria-hidden="true">–</span>
          <input
            type="date"
            aria-label={`${label} to`}
            max={LAST_DAY}
            value={to}
            onChange={(event) => setDays(from, event.currentTarget.value)}
          />
        </div>
      )}
    </div>
  );
}

function ExcludeChoice({ app }: { app: App }) {
  const left = excludesOf(app.reading.query);
  return (
    <fieldset class="excludes">
      <legend>Leave out</legend>
      {USUAL_EXCLUDES.map((name) => (
        <button
          type="button"
          class="tool"
          key={name}
          aria-pressed={left.includes(name)}
          onClick={() =>
            app.rewrite((query) =>
              excludesOf(query).includes(name)
                ? withoutExclude(query, name)
                : withTerm(query, undefined, 'exclude', nameList([name])),
            )
          }
        >
          {name}
        </button>
      ))}
    </fieldset>
  );
}

function withoutExclude(query: Query, name: string): Query {
  const holds = ({ prefix, alone, values }: Span) => prefix === 'exclude' && alone && values?.includes(name);
  const term = query.spans.find(holds);
  if (!term) return query;
  const others = term.values!.filter((other) => other !== name);
  const next = withTerm(query, term, 'exclude', nameList(others));
  const spans = next.spans.map((span) => (span.begin === term.begin && holds(span) ? { ...span, values: others } : span));
  return withoutExclude({ ...next, spans }, name);
}

// One tag for each criterion, which says what it means; taking it off searches again when there is a
// search to repeat.
export function CriteriaTags({ app }: { app: App }) {
  const { query } = app.reading;
  const { contents, subfolders } = app.draft;
  const change = (edit: (query: Query) => Query) => app.rewrite(edit, () => app.search && app.submit());
  const drop = (back: { contents?: false; subfolders?: true }) => {
    if (app.search) app.submit(back);
    else app.edit(back);
  };
  const TEXT_PREFIXES = ['content', 'case', 'regex'];
  const terms = query.spans.filter(
    ({ prefix, alone, says }) => prefix && alone && says && !TEXT_PREFIXES.includes(prefix),
  );
  return (
    <>
      {terms.flatMap((span) =>
        span.prefix === 'exclude' && span.values
          ? span.values.map((name) => (
              <Tag key={`-${name}`} text={`without ${name}`} drop={() => change((now) => withoutExclude(now, name))} />
            ))
          : [
              <Tag
                key={span.begin}
                text={span.says!}
                drop={() => change((now) => dropped(now, span))}
              />,
            ],
      )}
      {contents && <Tag text="also inside files" drop={() => drop({ contents: false })} />}
      {/* Of a folder that lies open the way down to it says so. */}
      {!subfolders && !browses(app.draft) && <Tag text="not in subfolders" drop={() => drop({ subfolders: true })} />}
    </>
  );
}

// The same term of what the query is by now.
function dropped(query: Query, { prefix, begin }: Span): Query {
  const span = query.spans.find((one) => one.prefix === prefix && one.begin === begin);
  return span ? without(query, span) : query;
}

function Tag({ text, drop }: { text: string; drop: () => void }) {
  return (
    <span class="tag">
      <span class="ellipsis">{visible(text)}</span>
      <button type="button" class="quiet" aria-label={`Remove: ${visible(text)}`} onClick={drop}>
        <Icon name="close" size={10} />
      </button>
    </span>
  );
}
