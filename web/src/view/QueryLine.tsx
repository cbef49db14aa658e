// Below the field: what is wrong with the query, or what the term at the caret asks for. It is
// spoken once one rests.
import { useEffect, useState } from 'preact/hooks';
import { asSentence } from '../api/errors.ts';
import { spanAt, type Span } from '../model/query.ts';
import { visible } from '../model/text.ts';
import type { App } from '../state/app.ts';

const REST_MS = 900;

// What is wrong with a term that is being written at its end is no fault yet, unless it was searched
// for.
export function unfinished({ draftError, caret, reading }: App): Span | undefined {
  if (draftError?.field === 'pattern') return undefined;
  return reading.query.spans.find(({ wrong, end }) => wrong !== undefined && end === caret);
}

interface Told {
  text: string;
  wrong: boolean;
}

function toldOf(app: App): Told {
  const { query, wrong } = app.reading;
  const { draftError } = app;
  if (draftError?.field === 'pattern') return { text: draftError.message, wrong: true };
  const { caret } = app;
  const here = caret < 0 ? undefined : spanAt(query, caret);
  if (here?.wrong !== undefined) {
    return { text: asSentence(here.wrong), wrong: here !== unfinished(app) };
  }
  const other = query.spans.find((span) => span.wrong !== undefined);
  if (other) {
    const term = visible(query.text.slice(other.begin, other.end));
    return { text: `“${term}”: ${asSentence(other.wrong!)}`, wrong: true };
  }
  if (wrong) return { text: wrong, wrong: true };
  return { text: here?.says ? asSentence(here.says).replace(/\.$/, '') : '', wrong: false };
}

export function QueryLine({ app }: { app: App }) {
  const { text, wrong } = toldOf(app);
  const [spoken, setSpoken] = useState('');
  useEffect(() => {
    const timer = setTimeout(() => setSpoken(text), REST_MS);
    return () => clearTimeout(timer);
  }, [text]);
  if (app.draft.pattern.trim() === '') return null;
  const refused = app.draftError?.field === 'pattern';
  return (
    <div class={`queryline ${wrong ? 'wrong' : ''}`}>
      <p id="query-says" title={text} role={refused ? 'alert' : undefined}>
        {text}
      </p>
      <span class="visually-hidden" role="status">
        {refused ? '' : spoken}
      </span>
    </div>
  );
}
