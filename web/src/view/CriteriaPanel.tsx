// The criteria beside the name. Folded away they are shown as tags that can be taken off.
import { useState } from 'preact/hooks';
import { hasCriteria, KINDS, NO_CRITERIA, type Criteria } from '../model/criteria.ts';
import { describe } from '../model/history.ts';
import { splitCustom, TIME_WORDS } from '../model/times.ts';
import { visible } from '../model/text.ts';
import type { App } from '../state/app.ts';
import { Icon } from './icons.tsx';

const LAST_DAY = '2038-01-18'; // the last whole day that a search can compare
const CUSTOM = 'between';

export function CriteriaPanel({ app }: { app: App }) {
  const error = app.draftError;
  return (
    <section class="criteria" id="criteria" aria-label="Criteria">
      <fieldset class="kinds">
        <legend>Type</legend>
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
      <Text app={app} field="extension" label="Extension" placeholder="jpg, png, tar.gz" />
      <div class="pair" role="group" aria-label="Size">
        <Text app={app} field="sizeFrom" label="Size from" placeholder="10 MB" />
        <Text app={app} field="sizeTo" label="to" placeholder="2 GB" />
      </div>
      <Time app={app} field="modified" label="Modified" />
      <Time app={app} field="created" label="Created" />
      <Time app={app} field="accessed" label="Last opened" />
      <Text app={app} field="owner" label="Owner" placeholder="account name" />
      <Text app={app} field="group" label="Group" placeholder="group name" />
      <label class="choice contents">
        <input
          type="checkbox"
          checked={app.draft.contents}
          onChange={(event) => app.edit({ contents: event.currentTarget.checked })}
        />
        Also look inside files
      </label>
      <footer>
        <p class="hint" role="alert">
          {error ? <span class="wrong">{error.message}</span> : 'An owner or group that does not exist restricts nothing.'}
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

interface TextProps {
  app: App;
  field: 'extension' | 'sizeFrom' | 'sizeTo' | 'owner' | 'group';
  label: string;
  placeholder: string;
}

function searchOnEnter(app: App): (event: KeyboardEvent) => void {
  return (event) => {
    if (event.key === 'Enter' && !event.isComposing) app.submit();
  };
}

function Text({ app, field, label, placeholder }: TextProps) {
  return (
    <label class={`labelled ${field}`}>
      <span>{label}</span>
      <input
        type="text"
        value={app.draft[field]}
        placeholder={placeholder}
        spellcheck={false}
        autocapitalize="none"
        autocomplete="off"
        aria-invalid={app.draftError?.field === field}
        onInput={(event) => app.edit({ [field]: event.currentTarget.value })}
        onKeyDown={searchOnEnter(app)}
      />
    </label>
  );
}

function Time({ app, field, label }: { app: App; field: 'modified' | 'created' | 'accessed'; label: string }) {
  const value = app.draft[field];
  const [from, to] = splitCustom(value);
  const isWord = TIME_WORDS.some(([word]) => word === value);
  const [choosing, setChoosing] = useState(false);
  const custom = !isWord && (value !== '' || choosing);
  const setDays = (first: string, last: string) =>
    app.edit({ [field]: first || last ? `${first}..${last}` : '' });
  return (
    <div class={`labelled time ${custom ? 'custom' : ''}`} role="group" aria-label={label}>
      <label>
        <span>{label}</span>
        <select
          value={custom ? CUSTOM : value}
          onChange={(event) => {
            const word = event.currentTarget.value;
            setChoosing(word === CUSTOM);
            app.edit({ [field]: word === CUSTOM ? '' : word });
          }}
        >
          <option value="">Any time</option>
          {TIME_WORDS.map(([word, name]) => (
            <option key={word} value={word}>
              {name}
            </option>
          ))}
          <option value={CUSTOM}>Between days …</option>
        </select>
      </label>
      {custom && (
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
  const tags = (Object.keys(NO_CRITERIA) as (keyof Criteria)[]).flatMap((field) => {
    if (field === 'pattern' || field === 'folders') return [];
    const alone = { ...NO_CRITERIA, [field]: app.draft[field] };
    return describe(alone).map((text) => ({ field, text }));
  });
  const drop = (field: keyof Criteria) => {
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
