// The one field: the query in its colours, what can be written next, and past searches. Those unfold
// on a click, on typing or with the arrow key, never by themselves; what can be written next unfolds
// when the beginning of a prefix or of a value stands there, or is asked for.
import type { RefObject } from 'preact';
import { useEffect, useMemo, useRef, useState } from 'preact/hooks';
import type { Completion } from '../api/types.ts';
import { titleOf, type Remembered } from '../model/history.ts';
import type { App } from '../state/app.ts';
import { Icon } from './icons.tsx';
import { Name } from './Name.tsx';
import { Painted } from './Painted.tsx';
import { aboutPast, PastIcon } from './PastSearches.tsx';
import { unfinished } from './QueryLine.tsx';

const MOST_SHOWN = 12;
// Fewer letters of a prefix may be anything.
const MOST_PLAIN_LETTERS = 1;

// What is unfolded: nothing, past searches, or what can be written next where one asked for that.
type Open = '' | 'past' | 'next';

export function SearchBar({ app }: { app: App }) {
  const input = useRef<HTMLInputElement>(null);
  const [open, setOpen] = useState<Open>('');
  const [at, setAt] = useState(-1);
  const [composing, setComposing] = useState(false);
  const running = app.search !== null && !app.search.over;
  const { pattern } = app.draft;
  const shown = useMemo(() => suggestions(app.past.list, pattern), [app.past.list, pattern]);
  const next = nextOf(app, open);
  const past = !next && open !== '' && shown.length > 0;
  const unfolded = past || next !== null;
  const { query } = app.reading;
  const forgiven = unfinished(app);
  const mistaken = query.spans.some((span) => span.wrong !== undefined && span !== forgiven);

  useEffect(() => input.current?.focus(), []);
  useCaret(app, input);

  const fold = () => {
    setOpen('');
    setAt(-1);
  };
  const submit = () => {
    fold();
    app.submit();
  };
  const choose = (one: Remembered) => {
    fold();
    app.submit(one.criteria);
  };
  // As if it were typed, so that it can be taken back.
  const write = ({ begin, end }: Completion, text: string) => {
    const field = input.current!;
    field.focus();
    field.setSelectionRange(begin, end);
    document.execCommand('insertText', false, text);
    // What begins goes on; a value is whole.
    setOpen(/[:/]$/.test(text) ? 'past' : '');
    setAt(-1);
  };
  const ask = () => {
    setOpen('next');
    setAt(-1);
    app.reading.complete(input.current?.selectionEnd ?? pattern.length);
  };
  const onArrow = (step: 1 | -1) => {
    const nothing = app.past.known && shown.length === 0;
    const begun = app.reading.completion && app.reading.completion.begin < app.reading.caret;
    if (!unfolded && step === 1) {
      if (begun) return setOpen('next');
      if (nothing || app.search?.pages.total) {
        document.querySelector<HTMLElement>('[role=grid]')?.focus();
        return;
      }
    }
    if (!next) {
      setOpen('past');
      if (!app.past.known) return setAt(0); // they unfold as soon as they have come
    }
    const count = (next ? next.items.length : shown.length) + 1; // one place is the field itself
    setAt(((at + 1 + step + count) % count) - 1);
  };
  const onKeyDown = (event: KeyboardEvent) => {
    if (event.isComposing) return;
    const item = next?.items[at];
    if (event.key === 'Enter') {
      event.preventDefault();
      const one = past ? shown[at] : undefined;
      if (next && item) write(next, item.text);
      else if (one) choose(one);
      else submit();
    } else if (event.key === 'Tab' && next && !event.shiftKey) {
      // Of what is begun the first will do.
      const first = next.begin < app.reading.caret ? next.items[0] : undefined;
      const taken = item ?? first;
      if (!taken) return fold();
      event.preventDefault();
      write(next, taken.text);
    } else if (event.key === ' ' && event.ctrlKey) {
      event.preventDefault();
      ask();
    } else if (event.key === 'ArrowDown' || event.key === 'ArrowUp') {
      event.preventDefault();
      onArrow(event.key === 'ArrowDown' ? 1 : -1);
    } else if (event.key === 'Delete' && past && shown[at]) {
      event.preventDefault();
      void app.past.remove(shown[at]);
      setAt(Math.min(at, shown.length - 2));
    } else if (event.key === 'Escape') {
      if (unfolded) {
        app.reading.completion = null;
        fold();
      } else if (running) void app.search?.stop();
      else app.edit({ pattern: '' });
    }
  };

  return (
    <form class="searchbar" role="search" onSubmit={(event) => (event.preventDefault(), submit())}>
      <div class={`field ${composing ? 'composing' : ''}`} onFocusOut={(event) => leaves(event) && fold()}>
        <Icon name="search" size={18} />
        <Painted
          input={input}
          query={query.text === pattern ? query : { text: pattern, spans: [] }}
          forgiven={forgiven}
        />
        <input
          ref={input}
          id="pattern"
          type="text"
          enterkeyhint="search"
          autocomplete="off"
          autocapitalize="none"
          spellcheck={false}
          placeholder="Name of a file or folder"
          aria-label="Search for"
          role="combobox"
          aria-invalid={mistaken || app.draftError?.field === 'pattern'}
          aria-describedby={pattern.trim() ? 'query-says' : undefined}
          aria-expanded={unfolded}
          aria-controls="suggestions"
          aria-autocomplete="list"
          aria-activedescendant={unfolded && at >= 0 ? `suggestion-${at}` : undefined}
          value={pattern}
          onInput={(event) => {
            const { value, selectionEnd } = event.currentTarget;
            app.caret = selectionEnd ?? value.length;
            app.edit({ pattern: value }, app.caret);
            setOpen('past');
            setAt(-1);
          }}
          onCompositionStart={() => setComposing(true)}
          onCompositionEnd={() => setComposing(false)}
          onClick={() => setOpen('past')}
          onKeyDown={onKeyDown}
        />
        {pattern && (
          <button
            type="button"
            class="quiet clear"
            aria-label="Empty the field"
            onClick={() => {
              app.edit({ pattern: '' });
              input.current?.focus();
            }}
          >
            <Icon name="close" size={14} />
          </button>
        )}
        {next && <Next next={next} at={at} write={(text) => write(next, text)} />}
        {past && <PastList app={app} shown={shown} at={at} choose={choose} fold={fold} />}
      </div>
      {running ? (
        <button type="button" class="primary stop" onClick={() => void app.search?.stop()}>
          Stop
        </button>
      ) : (
        <button type="submit" class="primary">
          Search
        </button>
      )}
    </form>
  );
}

// Has the page know where the caret is, while the field has the focus.
function useCaret(app: App, input: RefObject<HTMLInputElement | null>): void {
  useEffect(() => {
    const look = () => {
      const field = input.current;
      const caret = field && document.activeElement === field ? (field.selectionEnd ?? -1) : -1;
      if (caret !== app.caret) app.set({ caret });
    };
    // Some of these come before it has moved.
    const later = () => setTimeout(look);
    const events = ['selectionchange', 'focusin', 'focusout', 'keyup'];
    events.forEach((name) => document.addEventListener(name, later));
    return () => events.forEach((name) => document.removeEventListener(name, later));
  }, [app]);
}

// What can be written where the caret is, when that is to be shown.
function nextOf(app: App, open: Open): Completion | null {
  const { completion, caret } = app.reading;
  if (!completion || open === '' || app.caret !== caret) return null;
  const begun = caret - completion.begin;
  const asked = open === 'next' || completion.of === 'value';
  if (!asked && begun <= (completion.of === 'prefix' ? MOST_PLAIN_LETTERS : 0)) return null;
  const items = completion.of === 'share' ? shares(app, completion) : completion.items;
  return items.length > 0 ? { ...completion, items } : null;
}

// The page knows them without asking.
function shares(app: App, { begin }: Completion): Completion['items'] {
  const typed = app.draft.pattern.slice(begin, app.reading.caret).toLowerCase();
  return app.everywhere
    .map((path) => path.slice(1))
    .filter((name) => name.toLowerCase().startsWith(typed) && !/[\s|"<>*?[\]{}\\]/.test(name))
    .map((name) => ({ text: name + '/', about: name === 'home' ? 'my home folder' : 'a share' }));
}

interface NextProps {
  next: Completion;
  at: number;
  write: (text: string) => void;
}

function Next({ next, at, write }: NextProps) {
  const list = useRef<HTMLUListElement>(null);
  useEffect(() => {
    list.current?.children[at]?.scrollIntoView({ block: 'nearest' });
  }, [at]);
  return (
    <div class="panel suggestions">
      <ul id="suggestions" role="listbox" aria-label="What can be written here" ref={list}>
        {next.items.map(({ text, about }, index) => (
          <li
            key={text}
            id={`suggestion-${index}`}
            role="option"
            aria-selected={index === at}
            onPointerDown={(event) => event.preventDefault()}
            onClick={() => write(text)}
          >
            <span class="past term">{text}</span>
            <span class="about">{about}</span>
          </li>
        ))}
      </ul>
    </div>
  );
}

interface PastProps {
  app: App;
  shown: Remembered[];
  at: number;
  choose: (one: Remembered) => void;
  fold: () => void;
}

function PastList({ app, shown, at, choose, fold }: PastProps) {
  return (
    <div class="panel suggestions">
      <ul id="suggestions" role="listbox" aria-label="Past searches">
        {shown.map((one, index) => (
          <li
            key={one.search}
            id={`suggestion-${index}`}
            role="option"
            aria-selected={index === at}
            onPointerDown={(event) => event.preventDefault()}
            onClick={() => choose(one)}
          >
            <PastIcon past={one} />
            <span class="past">
              <Name text={titleOf(one)} />
            </span>
            <span class="about">{aboutPast(one)}</span>
            <Tools app={app} past={one} />
          </li>
        ))}
      </ul>
      <button
        type="button"
        class="quiet forget"
        onPointerDown={(event) => event.preventDefault()}
        onClick={() => {
          fold();
          void app.forgetHistory();
        }}
      >
        Clear history
      </button>
    </div>
  );
}

function leaves(event: FocusEvent): boolean {
  return !(event.currentTarget as Node).contains(event.relatedTarget as Node | null);
}

// For the mouse, as an option can hold nothing to press: the key Delete removes it too, and the start
// page has both as buttons.
function Tools({ app, past }: { app: App; past: Remembered }) {
  const pinned = past.name !== '';
  const click = (act: () => Promise<void>) => (event: MouseEvent) => {
    event.stopPropagation();
    void act();
  };
  return (
    <span class="tools" aria-hidden="true">
      <span
        class="quiet"
        title={pinned ? 'Unpin' : 'Pin'}
        onClick={click(() => app.past.pin(past, pinned ? '' : titleOf(past)))}
      >
        <Icon name="pin" size={14} />
      </span>
      <span class="quiet" title="Remove (Delete)" onClick={click(() => app.past.remove(past))}>
        <Icon name="close" size={12} />
      </span>
    </span>
  );
}

// Those that hold what is typed; all of them when it is one of them, as after a search.
function suggestions(past: Remembered[], typed: string): Remembered[] {
  const wanted = typed.trim().toLowerCase();
  const exact = past.some((one) => one.criteria.pattern === typed);
  const holds = (text: string) => text.toLowerCase().includes(wanted);
  const fitting = past.filter((one) => exact || holds(one.criteria.pattern) || holds(one.name));
  return fitting.slice(0, MOST_SHOWN);
}
