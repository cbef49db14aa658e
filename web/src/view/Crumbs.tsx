// The way down to the folder that lies open; each folder on it can be opened.
import type { App } from '../state/app.ts';
import { Icon } from './icons.tsx';
import { Name } from './Name.tsx';

export function Crumbs({ app, folder }: { app: App; folder: string }) {
  const names = folder.split('/').slice(1);
  const pathTo = (at: number) => '/' + names.slice(0, at + 1).join('/');
  return (
    <nav class="crumbs" aria-label="Folder">
      <Icon name="folder" size={15} />
      <ol>
        {names.map((name, at) => {
          const shown = at === 0 && name === 'home' ? 'My home folder' : name;
          return (
            <li key={pathTo(at)}>
              {at + 1 < names.length ? (
                <button type="button" class="example" onClick={() => app.browse(pathTo(at))}>
                  <Name text={shown} />
                </button>
              ) : (
                <span aria-current="page">
                  <Name text={shown} />
                </span>
              )}
            </li>
          );
        })}
      </ol>
    </nav>
  );
}
