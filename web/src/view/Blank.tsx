// In place of the table: how to search, before the first search; what to try, when nothing is found.
import { describe, hasCriteria, NO_CRITERIA } from '../model/criteria.ts';
import { visible } from '../model/text.ts';
import type { App } from '../state/app.ts';
import type { Search } from '../state/search.ts';
import { Name } from './Name.tsx';

const WAYS = [
  ['report 2024', 'both words, anywhere in the name'],
  ['*.pdf', 'the whole name, with * for anything and ? for one character'],
  ['jpg|png', 'one or the other'],
  ['invoice !draft', 'without the second word'],
  ['"final version"', 'exactly this, spaces and signs included'],
  ['*.{jpg,png} size:>1MB', 'one of several, and larger than that'],
  ['modified:last-7-days type:document', 'what a file is, beside its name'],
  ['holiday/img', 'the path, not the name alone'],
  ['regex:^img_\\d{4}', 'a regular expression'],
] as const;

const RECENT = 6;

export function Welcome({ app }: { app: App }) {
  const recent = app.history.slice(0, RECENT);
  return (
    <div class="blank welcome">
      <section aria-labelledby="ways">
        <h2 id="ways">Ways to ask</h2>
        <table>
          <tbody>
            {WAYS.map(([pattern, meaning]) => (
              <tr key={pattern}>
                <td>
                  <button type="button" class="example" onClick={() => tryPattern(app, pattern)}>
                    {pattern}
                  </button>
                </td>
                <td>{meaning}</td>
              </tr>
            ))}
          </tbody>
        </table>
        <p class="hint">
          Upper and lower case are the same, and so are letters with and without an accent that you do
          not type.
          <span class="keyed">
            {' '}
            Press <kbd>?</kbd> for the keyboard.
          </span>
        </p>
      </section>
      {recent.length > 0 && (
        <section aria-labelledby="recent">
          <h2 id="recent">Searched before</h2>
          <ul>
            {recent.map((one) => (
              <li key={one}>
                <button type="button" class="example" onClick={() => app.submit(one.criteria)}>
                  <Name text={one.criteria.pattern} />
                </button>{' '}
                <span class="aside">{describe(one.criteria).join(' · ')}</span>
              </li>
            ))}
          </ul>
        </section>
      )}
    </div>
  );
}

function tryPattern(app: App, pattern: string): void {
  app.edit({ pattern });
  document.querySelector<HTMLInputElement>('#pattern')?.focus();
}

export function Failed({ app, search }: { app: App; search: Search }) {
  return (
    <div class="blank">
      <h2>The search failed</h2>
      <p>{search.error}</p>
      <button type="button" class="tool" onClick={() => app.submit(search.criteria)}>
        Search again
      </button>
    </div>
  );
}

export function Nothing({ app, search }: { app: App; search: Search }) {
  const c = search.criteria;
  const offers: [string, () => void][] = [];
  if (hasCriteria(c)) {
    const bare = { ...NO_CRITERIA, pattern: c.pattern, folders: c.folders };
    offers.push(['Search without the criteria', () => app.submit(bare)]);
  }
  if (c.folders.length > 0) offers.push(['Search all folders', () => app.submit({ ...c, folders: [] })]);
  if (!c.contents && c.pattern.trim()) {
    offers.push(['Look inside files too', () => app.submit({ ...c, contents: true })]);
  }
  return (
    <div class="blank">
      <h2>{search.status === 'stopped' ? 'Nothing found before it was stopped' : 'Nothing found'}</h2>
      <p>
        {c.pattern.trim() ? (
          <>
            No {c.contents ? 'name and no file' : 'name'} fits <q>{visible(c.pattern.trim())}</q>
          </>
        ) : (
          'Nothing fits'
        )}
        {hasCriteria(c) ? ' with these criteria.' : '.'}
      </p>
      <div class="actions">
        {offers.map(([text, act]) => (
          <button type="button" class="tool" key={text} onClick={act}>
            {text}
          </button>
        ))}
      </div>
    </div>
  );
}
