// The one field, with past searches as suggestions: they unfold on a click, on typing or with the
// arrow key, never by themselves.
import { useEffect, useMemo, useRef, useState } from 'preact/hooks';
import { describe } from '../model/criteria.ts';
import { visible } from '../model/text.ts';
import type { App, Remembered } from '../state/app.ts';
import { Icon } from './icons.tsx';
import { Name } from './Name.tsx';

const MOST_SHOWN = 12;

export function SearchBar({ app }: { app: App }) {
  const input = useRef<HTMLInputElement>(null);
  const [open, setOpen] = useState(false);
  const [at, setAt] = useState(-1);
  const running = app.search !== null && !app.search.over;
  const shown = useMemo(
    () => suggestions(app.history, app.draft.pattern),
    [app.history, app.draft.pattern],
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
      const nothing = app.historyKnown && shown.length === 0;
      if (!unfolded && step === 1 && (nothing || app.search?.pages.total)) {
        document.querySelector<HTMLElement>('[role=grid]')?.focus();
        return;
      }
      setOpen(true);
      if (!app.historyKnown) {
        setAt(0); // they unfold as soon as they have come
        return;
      }
      const count = shown.length + 1; // one place is the field itself
      setAt(((at + 1 + step + count) % count) - 1);
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
                  key={one}
                  id={`suggestion-${index}`}
                  role="option"
                  aria-selected={index === at}
                  onPointerDown={(event) => event.preventDefault()}
                  onClick={() => choose(one)}
                >
                  <Icon name={one.advanced ? 'sliders' : 'clock'} size={14} />
                  <span class="past">
                    <Name text={one.criteria.pattern} />
                  </span>
                  <span class="about">{about(one)}</span>
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

// Those that hold what is typed; all of them when it is one of them, as after a search.
function suggestions(history: Remembered[], typed: string): Remembered[] {
  const wanted = typed.trim().toLowerCase();
  const exact = history.some((one) => one.criteria.pattern === typed);
  const fitting = history.filter(
    (one) => exact || one.criteria.pattern.toLowerCase().includes(wanted),
  );
  return fitting.slice(0, MOST_SHOWN);
}

function about({ criteria }: Remembered): string {
  const where = criteria.folders.length > 0 ? ['in ' + criteria.folders.map(visible).join(', ')] : [];
  return [...describe(criteria), ...where].join(' · ');
}
