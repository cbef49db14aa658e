// The criteria beside the name. Folded away they are shown as tags that can be taken off.
import { useState } from 'preact/hooks';
import {
  browses,
  CRITERIA,
  describe,
  FIELDS,
  hasCriteria,
  KINDS,
  NO_CRITERIA,
  type Field,
  type TextField,
} from '../model/criteria.ts';
import { isDay, splitCustom, TIME_WORDS } from '../model/times.ts';
import { visible } from '../model/text.ts';
import type { App } from '../state/app.ts';
import { ExcludeChoice } from './Excludes.tsx';
import { Icon } from './icons.tsx';

const LAST_DAY = '2038-01-18'; // the last whole day that a search can compare
const BETWEEN = 'between';
const WRITTEN = 'written';

// The two sizes stand side by side; the rest as they come in the table.
const AFTER_SIZE = FIELDS.slice(FIELDS.indexOf('sizeTo') + 1);

export function CriteriaPanel({ app }: { app: App }) {
  const error = app.draftError;
  return (
    <section class="criteria" id="criteria" aria-label="Criteria">
      <Input app={app} field="kind" />
      <Input app={app} field="extension" />
      <div class="pair" role="group" aria-label="Size">
        <Input app={app} field="sizeFrom" />
        <Input app={app} field="sizeTo" />
      </div>
      {AFTER_SIZE.map((field) => (
        <Input key={field} app={app} field={field} />
      ))}
      <ExcludeChoice app={app} />
      <footer>
        <p class="hint" role="alert">
          {error && error.field in CRITERIA ? <span class="wrong">{error.message}</span> : 'Write a size as 1.5 GB, and a time of your own as 2 weeks, 2026-07 or <2025.'}
        </p>
        <button
          type="button"
          class="quiet"
          disabled={!hasCriteria(app.draft)}
          onClick={() => app.edit({ ...NO_CRITERIA, pattern: app.draft.pattern, folders: app.draft.folders })}
        >
          Remove all criteria
        </button>
      </footer>
    </section>
  );
}

function Input({ app, field }: { app: App; field: Field }) {
  switch (CRITERIA[field].input) {
    case 'kind':
      return <Kinds app={app} />;
    case 'text':
      return <Text app={app} field={field as TextField} />;
    case 'time':
      return <Time app={app} field={field as TextField} />;
    case 'choice':
      return <Choice app={app} field={field} />;
    case 'folders':
      return null;
  }
}

function Kinds({ app }: { app: App }) {
  return (
    <fieldset class="kinds">
      <legend>{CRITERIA.kind.label}</legend>
      <div class="segments">
        {KINDS.map(([kind, name]) => (
          <label key={kind}>
            <input
              type="radio"
              name="kind"
              checked={app.draft.kind === kind}
              onChange={() => app.edit({ kind })}
            />
            <span>{name}</span>
          </label>
        ))}
      </div>
    </fieldset>
  );
}

function Choice({ app, field }: { app: App; field: Field }) {
  return (
    <label class={`choice ${field}`}>
      <input
        type="checkbox"
        checked={app.draft[field] === true}
        onChange={(event) => app.edit({ [field]: event.currentTarget.checked })}
      />
      {CRITERIA[field].label}
    </label>
  );
}

function searchOnEnter(app: App): (event: KeyboardEvent) => void {
  return (event) => {
    if (event.key === 'Enter' && !event.isComposing) app.submit();
  };
}

// `label`: where no element around it has one.
function Typed(props: { app: App; field: TextField; label?: string; placeholder?: string }) {
  const { app, field, label, placeholder } = props;
  return (
    <input
      type="text"
      aria-label={label}
      value={app.draft[field]}
      placeholder={placeholder}
      spellcheck={false}
      autocapitalize="none"
      autocomplete="off"
      aria-invalid={app.draftError?.field === field}
      onInput={(event) => app.edit({ [field]: event.currentTarget.value })}
      onKeyDown={searchOnEnter(app)}
    />
  );
}

function Text({ app, field }: { app: App; field: TextField }) {
  const { label, placeholder } = CRITERIA[field];
  return (
    <label class={`labelled ${field}`}>
      <span>{label}</span>
      <Typed app={app} field={field} placeholder={placeholder} />
    </label>
  );
}

function Time({ app, field }: { app: App; field: TextField }) {
  const { label } = CRITERIA[field];
  const value = app.draft[field];
  const [from, to] = splitCustom(value);
  const isWord = TIME_WORDS.some(([word]) => word === value);
  const [choice, setChoice] = useState('');
  const days = from + to !== '' && [from, to].every((end) => end === '' || isDay(end));
  const told = isWord ? value : days ? BETWEEN : value !== '' ? WRITTEN : choice;
  const kind = choice === WRITTEN ? choice : told;
  const setDays = (first: string, last: string) =>
    app.edit({ [field]: first || last ? `${first}..${last}` : '' });
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
            app.edit({ [field]: own ? '' : word });
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
          field={field}
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

// One tag for each criterion; taking it off searches again when there is a search to repeat.
export function CriteriaTags({ app }: { app: App }) {
  // Of a folder that lies open the way down to it says so.
  const told = browses(app.draft) ? FIELDS.filter((field) => field !== 'subfolders') : FIELDS;
  const tags = told.flatMap((field) => {
    const alone = { ...NO_CRITERIA, [field]: app.draft[field] };
    return describe(alone).map((text) => ({ field, text }));
  });
  const drop = (field: Field) => {
    const change = { [field]: NO_CRITERIA[field] };
    if (app.search) app.submit(change);
    else app.edit(change);
  };
  return (
    <>
      {tags.map(({ field, text }) => (
        <span class="tag" key={field}>
          <span class="ellipsis">{visible(text)}</span>
          <button type="button" class="quiet" aria-label={`Remove: ${visible(text)}`} onClick={() => drop(field)}>
            <Icon name="close" size={10} />
          </button>
        </span>
      ))}
    </>
  );
}
