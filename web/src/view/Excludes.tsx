// What a search leaves out: tags that can be taken off, and in the panel what is left out often.
import { excludesOf, USUAL_EXCLUDES, withExclude, withoutExclude } from '../model/excludes.ts';
import { visible } from '../model/text.ts';
import type { App } from '../state/app.ts';
import { Icon } from './icons.tsx';

export function ExcludeTags({ app }: { app: App }) {
  const drop = (name: string) => {
    const change = { pattern: withoutExclude(app.draft.pattern, name) };
    if (app.search) app.submit(change);
    else app.edit(change);
  };
  return (
    <>
      {excludesOf(app.draft.pattern).map((name) => (
        <span class="tag" key={name}>
          <span class="ellipsis">without {visible(name)}</span>
          <button type="button" class="quiet" aria-label={`Remove: without ${visible(name)}`} onClick={() => drop(name)}>
            <Icon name="close" size={10} />
          </button>
        </span>
      ))}
    </>
  );
}

export function ExcludeChoice({ app }: { app: App }) {
  const { pattern } = app.draft;
  const left = excludesOf(pattern);
  return (
    <fieldset class="excludes">
      <legend>Leave out</legend>
      {USUAL_EXCLUDES.map((name) => {
        const out = left.includes(name);
        return (
          <button
            type="button"
            class="tool"
            key={name}
            aria-pressed={out}
            onClick={() => app.edit({ pattern: out ? withoutExclude(pattern, name) : withExclude(pattern, name) })}
          >
            {name}
          </button>
        );
      })}
    </fieldset>
  );
}
