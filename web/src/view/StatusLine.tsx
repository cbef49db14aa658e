// How the search goes: the count, the time, what could not be read; and what can be done with the
// whole result.
import type { ComponentChildren } from 'preact';
import { useEffect, useRef, useState } from 'preact/hooks';
import type { Sort, SortColumn } from '../model/address.ts';
import { browses } from '../model/criteria.ts';
import { count, elapsed, plural } from '../model/text.ts';
import type { App } from '../state/app.ts';
import { exportResults, type ExportFormat } from '../state/export.ts';
import type { Search } from '../state/search.ts';
import { COLUMNS } from './columns.ts';
import { Icon } from './icons.tsx';
import { Popover } from './Popover.tsx';
import type { RowActions } from './ResultTable.tsx';

const TICK_MS = 100;
// A pause in typing that ends a word.
const TYPING_MS = 80;
// How often a screen reader is told of the count while a search runs.
const SPOKEN_MS = 5000;

export function StatusLine({ app, search, actions }: { app: App; search: Search; actions: RowActions }) {
  const running = !search.over;
  const chooses = app.choosing || search.choice.count > 0;
  const notText = search.walk.files.not_text;
  return (
    <div class={`status ${running ? 'running' : ''}`}>
      <p class="figures">
        <strong>{found(search)}</strong>
        {search.status === 'stopped' && <span class="word">stopped</span>}
        {search.status === 'failed' && <span class="word">failed</span>}
        <span class="aside">
          {running && search.walk.phase === 'contents' ? 'reading files' : 'in'} <Elapsed search={search} />
        </span>
        <span class="aside seen">
          {search.walk.fleet && `${search.walk.fleet.answered} of ${plural(search.walk.fleet.total, 'machine')} answered`}
          {(!search.walk.fleet || search.walk.entries > 0) && (
            <>
              {search.walk.fleet && '; '}
              {plural(search.walk.entries, 'name')} seen in {plural(search.walk.folders, 'folder')}
              {from(search)}
            </>
          )}
          {notText > 0 && `; ${plural(notText, 'file is', 'files are')} not text`}
        </span>
      </p>
      <Skipped search={search} />
      <Silent search={search} />
      <span class="grow" />
      {(search.filter !== '' || search.found > 1) && !chooses && <Narrow search={search} />}
      {chooses && <Chosen app={app} count={search.choice.count} actions={actions} />}
      {!chooses && search.pages.total > 0 && (
        <button type="button" class="tool touch" onClick={() => app.choose(true)}>
          Choose
        </button>
      )}
      <SortChoice app={app} search={search} />
      <ColumnChoice app={app} />
      {search.pages.total > 0 && <Export app={app} search={search} />}
      {running && <div class="bar" role="progressbar" aria-label="Searching" />}
      <Spoken search={search} />
    </div>
  );
}

function found(search: Search): string {
  const all = browses(search.criteria) ? plural(search.matches, 'item') : plural(search.matches, 'match', 'matches');
  // What a machine that did not answer has is among neither.
  const least = search.walk.fleet?.boxes.length ? 'at least ' : '';
  return search.filter === '' ? least + all : `${count(search.found)} of ${least}${all}`;
}

// Narrows the rows that were found to some of them; nothing is searched anew.
function Narrow({ search }: { search: Search }) {
  const timer = useRef(0);
  const [text, setText] = useState(search.filter);
  useEffect(() => setText(search.filter), [search]);
  const narrow = (value: string, pause: number) => {
    setText(value);
    clearTimeout(timer.current);
    timer.current = window.setTimeout(() => search.narrow(value), pause);
  };
  return (
    <input
      id="narrow"
      type="text"
      class="narrow"
      placeholder="Narrow"
      aria-label="Narrow these results"
      title="Show those that fit this too (n)"
      autocomplete="off"
      autocapitalize="none"
      spellcheck={false}
      aria-invalid={search.filterWrong}
      value={text}
      onInput={(event) => narrow(event.currentTarget.value, TYPING_MS)}
      onKeyDown={(event) => {
        if (event.key === 'Escape') narrow('', 0);
        else if (event.key !== 'Enter' && event.key !== 'ArrowDown') return;
        else document.querySelector<HTMLElement>('.table')?.focus();
        event.preventDefault();
      }}
    />
  );
}

// The name is always there; on a narrow screen what fits is.
function ColumnChoice({ app }: { app: App }) {
  return (
    <Popover className="tool columnchoice" panelClass="menu right" panelLabel="Columns" title="Columns" label={<Icon name="columns" size={14} />}>
      {() => [
        ...COLUMNS.slice(1).map(({ column, title }) => (
          <label class="choice" key={column}>
            <input
              type="checkbox"
              checked={app.columns.includes(column)}
              onChange={(event) => app.showColumn(column, event.currentTarget.checked)}
            />
            {title}
          </label>
        )),
        <label class="choice pictures" key="pictures">
          <input
            type="checkbox"
            checked={app.pictures}
            onChange={(event) => app.showPictures(event.currentTarget.checked)}
          />
          Small pictures
        </label>,
      ]}
    </Popover>
  );
}

// What can be done with the rows that are chosen.
function Chosen({ app, count, actions }: { app: App; count: number; actions: RowActions }) {
  return (
    <span class="chosenbar" role="group" aria-label="Chosen rows">
      <strong role="status">{plural(count, 'row')} chosen</strong>
      <button type="button" class="tool" disabled={count === 0} onClick={() => actions.download()}>
        <Icon name="archive" size={14} /> Zip
      </button>
      <button type="button" class="tool" disabled={count === 0} onClick={() => actions.copy()}>
        <Icon name="copy" size={14} /> Copy paths
      </button>
      <button type="button" class="quiet" aria-label="Choose nothing" title="Choose nothing (Esc)" onClick={() => app.choose(null)}>
        <Icon name="close" size={14} />
      </button>
    </span>
  );
}

// In the words of the terminal; nothing where there is no index at all.
function from(search: Search): string {
  const { source, index } = search.walk;
  if (source === 'index') return `, from the index, ${index}`;
  if (source === 'both') return `, from the index and by walking (${index})`;
  return source === 'walk' && index !== 'no index' ? `, by walking (${index})` : '';
}

// Above the answers while one types.
export function InstantLine({ app }: { app: App }) {
  const { instant } = app;
  const known = plural(instant.known, 'match', 'matches');
  const best = instant.known > instant.found ? `the best ${instant.found} first` : '';
  return (
    <div class="status">
      <p class="figures" role="status">
        <strong>{instant.complete ? known : `more than ${known}`}</strong>
        {best && <span class="aside">{best}</span>}
        <span class="aside">from the index</span>
      </p>
      <span class="grow" />
      <span class="hint keyed">
        <kbd>Enter</kbd> searches for all of them
      </span>
    </div>
  );
}

function Elapsed({ search }: { search: Search }) {
  const [, tick] = useState(0);
  useEffect(() => {
    if (search.over) return;
    const timer = setInterval(() => tick((n) => n + 1), TICK_MS);
    return () => clearInterval(timer);
  }, [search, search.over]);
  return <time class="elapsed">{elapsed(search.elapsed, search.over)}</time>;
}

// The only part that is announced; it changes seldom enough to be listened to.
function Spoken({ search }: { search: Search }) {
  const said = useRef({ at: 0, text: '', search });
  const told = found(search);
  const now = performance.now();
  if (said.current.search !== search) said.current = { at: 0, text: '', search };
  if (search.over || now - said.current.at > SPOKEN_MS) {
    const state = search.over ? { done: 'Finished', stopped: 'Stopped', failed: 'Failed' } : {};
    const word = (state as Record<string, string>)[search.status] ?? 'Searching';
    said.current = { at: now, text: `${word}: ${told}`, search };
  }
  return (
    <span class="visually-hidden" role="status">
      {said.current.text}
    </span>
  );
}

// What is missing from the result, in a few words that open to more.
function Caution({ title, children }: { title: string; children: ComponentChildren }) {
  return (
    <Popover
      className="tool caution"
      panelLabel={title}
      panelClass="note"
      label={
        <>
          <Icon name="warning" size={14} />
          {title}
        </>
      }
    >
      {() => <>{children}</>}
    </Popover>
  );
}

function Skipped({ search }: { search: Search }) {
  const { permission, other } = search.walk.skipped;
  const folders = permission + other;
  const files = search.walk.files.unreadable;
  if (folders + files === 0) return null;
  const what = [
    ...(folders > 0 ? [plural(folders, 'folder')] : []),
    ...(files > 0 ? [plural(files, 'file')] : []),
  ];
  const title = `${what.join(' and ')} could not be read`;
  return (
    <Caution title={title}>
      <p>The result may not be complete.</p>
      {files > 0 && <p>The contents of {plural(files, 'file')} could not be looked into.</p>}
      {permission > 0 && (
        <p>
          {plural(permission, 'folder')} {permission === 1 ? 'is' : 'are'} closed to you. Ask the owner for
          permission to read.
        </p>
      )}
      {other > 0 && (
        <p>
          {plural(other, 'folder')} could not be read for another reason, such as a faulty disk. Search
          again; if it stays, tell who runs the server.
        </p>
      )}
    </Caution>
  );
}

// Machines of a fleet whose files are missing from the result, or some of them.
function Silent({ search }: { search: Search }) {
  const boxes = search.walk.fleet?.boxes ?? [];
  if (boxes.length === 0) return null;
  const title = `${plural(boxes.length, 'machine')} did not answer`;
  return (
    <Caution title={title}>
      <p>There are at least as many matches as are shown; what these have is missing:</p>
      <ul>
        {boxes.map(({ name, why }) => (
          <li key={name}>
            {name}: {why}
          </li>
        ))}
      </ul>
    </Caution>
  );
}

// For narrow screens, where the table has no head.
function SortChoice({ app, search }: { app: App; search: Search }) {
  const { sort } = search;
  const change = (column: SortColumn | '', descending: boolean) =>
    app.setSort(column ? ({ column, descending } satisfies Sort) : null);
  return (
    <span class="sortchoice">
      <select
        aria-label="Sort by"
        value={sort?.column ?? ''}
        onChange={(event) => {
          const column = event.currentTarget.value as SortColumn | '';
          change(column, column === 'mtime' || column === 'size');
        }}
      >
        <option value="">As found</option>
        {COLUMNS.map(({ column, title }) => (
          <option key={column} value={column}>
            {title}
          </option>
        ))}
      </select>
      {sort && (
        <button
          type="button"
          class="quiet"
          aria-label={sort.descending ? 'Sort ascending' : 'Sort descending'}
          onClick={() => change(sort.column, !sort.descending)}
        >
          <Icon name={sort.descending ? 'down' : 'up'} size={12} />
        </button>
      )}
    </span>
  );
}

function Export({ app, search }: { app: App; search: Search }) {
  const [part, setPart] = useState<number | null>(null);
  const cancelled = useRef(false);
  const run = async (format: ExportFormat) => {
    cancelled.current = false;
    setPart(0);
    try {
      const done = await exportResults(search, format, setPart, () => cancelled.current);
      if (done) app.tell(search.over ? 'The result is saved.' : 'What was found so far is saved.');
    } catch (error) {
      app.tell(error instanceof Error ? error.message : String(error));
    }
    setPart(null);
  };
  if (part !== null) {
    return (
      <button type="button" class="tool" onClick={() => (cancelled.current = true)}>
        Saving {Math.min(100, Math.floor(part * 100))} % · Cancel
      </button>
    );
  }
  return (
    <Popover
      className="tool save"
      panelClass="menu right"
      panelLabel="Save the result"
      title="Save result"
      label={
        <>
          <Icon name="download" size={14} />
          <span class="long">Save result</span>
        </>
      }
    >
      {(close) =>
        (
          [
            ['csv', 'CSV', 'for spreadsheets'],
            ['jsonl', 'JSON lines', 'for programs'],
          ] as const
        ).map(([format, name, use]) => (
          <button type="button" key={format} onClick={() => (close(), void run(format))}>
            {name} <span class="aside">{use}</span>
          </button>
        ))
      }
    </Popover>
  );
}
