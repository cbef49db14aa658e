// The one field, with past searches as suggestions: they unfold on a click, on typing or with the
// arrow key, never by themselves.
import { useEffect, useMemo, useRef, useState } from 'preact/hooks';
import { titleOf, type Remembered } from '../model/history.ts';
import type { App } from '../state/app.ts';
import { Icon } from './icons.tsx';
import { Name } from './Name.tsx';
import { aboutPast, PastIcon } from './PastSearches.tsx';

const MOST_SHOWN = 12;

export function SearchBar({ app }: { app: App }) {
  const input = useRef<HTMLInputElement>(null);
  const [open, setOpen] = useState(false);
  const [at, setAt] = useState(-1);
  const running = app.search !== null && !app.search.over;
  const shown = useMemo(
    () => suggestions(app.past.list, app.draft.pattern),
    [app.past.list, app.draft.pattern],
  );
  const unfolded = open && shown.length > 0;

  useEffect(() => input.current?.focus(), []);

  const submit = () => {
    setOpen(false);
    setAt(-1);
    app.submit();
  };
  const choose = (one: Remembered) => {
    setOpen(false);
    setAt(-1);
    app.submit(one.criteria);
  };
  const onKeyDown = (event: KeyboardEvent) => {
    if (event.isComposing) return;
    if (event.key === 'Enter') {
      event.preventDefault();
      const one = unfolded ? shown[at] : undefined;
      if (one) choose(one);
      else submit();
    } else if (event.key === 'ArrowDown' || event.key === 'ArrowUp') {
      event.preventDefault();
      const step = event.key === 'ArrowDown' ? 1 : -1;
      const nothing = app.past.known && shown.length === 0;
      if (!unfolded && step === 1 && (nothing || app.search?.pages.total)) {
        document.querySelector<HTMLElement>('[role=grid]')?.focus();
        return;
      }
      setOpen(true);
      if (!app.past.known) {
        setAt(0); // they unfold as soon as they have come
        return;
      }
      const count = shown.length + 1; // one place is the field itself
      setAt(((at + 1 + step + count) % count) - 1);
    } else if (event.key === 'Delete' && unfolded && shown[at]) {
      event.preventDefault();
      void app.past.remove(shown[at]);
      setAt(Math.min(at, shown.length - 2));
    } else if (event.key === 'Escape') {
      if (unfolded) setOpen(false);
      else if (running) void app.search?.stop();
      else app.edit({ pattern: '' });
    }
  };

  return (
    <form class="searchbar" role="search" onSubmit={(event) => (event.preventDefault(), submit())}>
      <div class="field" onFocusOut={(event) => leaves(event) && setOpen(false)}>
        <Icon name="search" size={18} />
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
          aria-invalid={app.draftError?.field === 'pattern'}
          aria-expanded={unfolded}
          aria-controls="suggestions"
          aria-autocomplete="list"
          aria-activedescendant={unfolded && at >= 0 ? `suggestion-${at}` : undefined}
          value={app.draft.pattern}
          onInput={(event) => {
            app.edit({ pattern: event.currentTarget.value });
            setOpen(true);
            setAt(-1);
          }}
          onClick={() => setOpen(true)}
          onKeyDown={onKeyDown}
        />
        {app.draft.pattern && (
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
        {unfolded && (
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
                setOpen(false);
                void app.forgetHistory();
              }}
            >
              Clear history
            </button>
          </div>
        )}
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
