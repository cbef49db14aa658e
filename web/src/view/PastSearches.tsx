// Past searches on the start page, where each can be pinned, named and removed.
import { useState } from 'preact/hooks';
import { describe, hasCriteria } from '../model/criteria.ts';
import { titleOf, type Remembered } from '../model/history.ts';
import { visible } from '../model/text.ts';
import type { App } from '../state/app.ts';
import { Icon } from './icons.tsx';
import { Name } from './Name.tsx';

// Beside all that are pinned.
const RECENT = 8;

export function aboutPast({ name, criteria }: Remembered): string {
  const words = name && name !== criteria.pattern.trim() ? [visible(criteria.pattern.trim())] : [];
  const where = criteria.folders.length > 0 ? ['in ' + criteria.folders.map(visible).join(', ')] : [];
  const told = name || criteria.pattern.trim() ? describe(criteria) : []; // otherwise its title
  return [...words, ...told, ...where].filter(Boolean).join(' · ');
}

export function PastIcon({ past }: { past: Remembered }) {
  const name = past.name ? 'pin' : hasCriteria(past.criteria) ? 'sliders' : 'clock';
  return <Icon name={name} size={14} />;
}

export function PastSearches({ app }: { app: App }) {
  const pinned = app.past.list.filter((one) => one.name);
  const recent = app.past.list.filter((one) => !one.name).slice(0, RECENT);
  return (
    <>
      <Section id="pinned" title="Pinned" app={app} list={pinned} />
      <Section id="recent" title="Searched before" app={app} list={recent} />
    </>
  );
}

function Section({ id, title, app, list }: { id: string; title: string; app: App; list: Remembered[] }) {
  if (list.length === 0) return null;
  return (
    <section aria-labelledby={id}>
      <h2 id={id}>{title}</h2>
      <ul class="pastlist">
        {list.map((one) => (
          <Line key={one.search} app={app} past={one} />
        ))}
      </ul>
    </section>
  );
}

function Line({ app, past }: { app: App; past: Remembered }) {
  const [naming, setNaming] = useState(false);
  const title = titleOf(past);
  const save = (name: string) => {
    setNaming(false);
    if (name.trim()) void app.past.pin(past, name.trim());
  };
  return (
    <li>
      <PastIcon past={past} />
      {naming ? (
        <input
          type="text"
          aria-label="Name of the pinned search"
          value={title}
          maxLength={60}
          ref={(field) => field?.focus()}
          onKeyDown={(event) => {
            if (event.key === 'Enter') save(event.currentTarget.value);
            if (event.key === 'Escape') setNaming(false);
          }}
          onBlur={() => setNaming(false)}
        />
      ) : (
        <button type="button" class="example" onClick={() => app.submit(past.criteria)}>
          <Name text={title} />
        </button>
      )}
      <span class="aside ellipsis">{aboutPast(past)}</span>
      <span class="tools">
        {past.name && (
          <button type="button" class="quiet" title="Name" aria-label={`Name ${visible(title)}`} onClick={() => setNaming(true)}>
            <Icon name="pencil" size={14} />
          </button>
        )}
        <button
          type="button"
          class="quiet"
          title={past.name ? 'Unpin' : 'Pin'}
          aria-label={`${past.name ? 'Unpin' : 'Pin'} ${visible(title)}`}
          aria-pressed={past.name !== ''}
          onClick={() => void app.past.pin(past, past.name ? '' : title)}
        >
          <Icon name="pin" size={14} />
        </button>
        <button
          type="button"
          class="quiet"
          title="Remove"
          aria-label={`Remove ${visible(title)}`}
          onClick={() => void app.past.remove(past)}
        >
          <Icon name="close" size={12} />
        </button>
      </span>
    </li>
  );
}
