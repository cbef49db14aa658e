// In place of the table: how to search, before the first search; what to try, when nothing is found.
import { Fragment } from 'preact';
import type { Misses as NearMisses } from '../api/types.ts';
import { browses, hasCriteria, NO_CRITERIA, type Criteria } from '../model/criteria.ts';
import { withoutCriteria } from '../model/terms.ts';
import { plural, visible } from '../model/text.ts';
import type { App } from '../state/app.ts';
import type { Search } from '../state/search.ts';
import { Name } from './Name.tsx';
import { PastSearches } from './PastSearches.tsx';

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

export function Welcome({ app }: { app: App }) {
  return (
    <div class="blank welcome">
      <PastSearches app={app} />
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
  if (browses(c) && search.status === 'done') {
    return (
      <div class="blank">
        <h2>This folder is empty</h2>
      </div>
    );
  }
  const offers: [string, () => void][] = [];
  const query = app.reading.of(c.pattern);
  const bare = query && withoutCriteria(query).text;
  const ofMore = bare !== null && bare !== c.pattern; // than names
  if (hasCriteria(c) || ofMore) {
    const pattern = bare ?? c.pattern;
    offers.push(['Search without the criteria', () => app.submit({ ...NO_CRITERIA, pattern, folders: c.folders })]);
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
            {ofMore ? 'Nothing' : c.contents ? 'No name and no file' : 'No name'} fits <q>{visible(c.pattern.trim())}</q>
          </>
        ) : (
          'Nothing fits'
        )}
        {hasCriteria(c) ? ' with these criteria.' : '.'}
      </p>
      {search.misses && <Misses app={app} criteria={c} misses={search.misses} />}
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

// Where it was looked, which part of what was asked for is in the way, and the names that come near.
function Misses({ app, criteria, misses }: { app: App; criteria: Criteria; misses: NearMisses }) {
  const several = misses.terms.length > 1;
  return (
    <div class="misses">
      <p class="aside">
        Looked at {misses.complete ? '' : 'more than '}
        {plural(misses.entries, 'name')} in {plural(misses.folders, 'folder')}
        {misses.left_out > 0 &&
          `; ${plural(misses.left_out, 'folder')} of the system’s own or of its temporary files ${
            misses.left_out === 1 ? 'is' : 'are'
          } never searched`}
        .
      </p>
      <ul>
        {misses.meant && (
          <li>
            Did you mean:{' '}
            <button type="button" class="example" onClick={() => app.submit({ pattern: misses.meant })}>
              <Name text={misses.meant} />
            </button>
          </li>
        )}
        {misses.terms.map(({ written, without, names }, i) => (
          <Fragment key={i}>
            {several && without > 0 && (
              <li>
                Without {written ? <q>{visible(written)}</q> : 'one of the criteria'} there would be{' '}
                {plural(without, 'match', 'matches')}.
              </li>
            )}
            {names.length > 0 && (
              <li>
                Near to <q>{visible(written)}</q>:{' '}
                {names.map((name) => (
                  <button
                    type="button"
                    class="example"
                    key={name}
                    onClick={() => app.submit({ pattern: criteria.pattern.replace(written, () => term(name)) })}
                  >
                    <Name text={name} />
                  </button>
                ))}
              </li>
            )}
          </Fragment>
        ))}
      </ul>
    </div>
  );
}

// A term of the query that looks for this name, with quotes where it needs them; none can be written
// in quotes.
function term(name: string): string {
  if (!/[\s|!"<>*?[\]{},\\:]/.test(name)) return name;
  return name.split('"').map((part) => part && `"${part}"`).join(' ');
}
