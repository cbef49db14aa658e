// Which folders to search: the shares, unfolding into their folders, and a line for a path that is
// known. Nothing chosen means everywhere.
import { useState } from 'preact/hooks';
import { plural, visible } from '../model/text.ts';
import type { App } from '../state/app.ts';
import { listSubfolders, type Subfolders } from '../state/folders.ts';
import { Icon } from './icons.tsx';
import { Name } from './Name.tsx';
import { Popover } from './Popover.tsx';

export function FolderPicker({ app }: { app: App }) {
  const chosen = app.draft.folders;
  const label = chosen.length === 0 ? 'All folders' : chosen.length === 1 ? visible(chosen[0]!) : plural(chosen.length, 'folder');
  return (
    <Popover
      className="tool folders"
      panelClass="picker"
      panelLabel="Folders to search"
      label={
        <>
          <Icon name="folder" size={15} />
          <span class="ellipsis">{label}</span>
          <Icon name="down" size={11} />
        </>
      }
    >
      {(close) => <Picker app={app} close={close} />}
    </Popover>
  );
}

function Picker({ app, close }: { app: App; close: () => void }) {
  const chosen = app.draft.folders;
  const toggle = (path: string) =>
    app.edit({
      folders: chosen.includes(path)
        ? chosen.filter((one) => one !== path)
        : // A folder inside another one that is chosen would be searched twice.
          [...chosen.filter((one) => !one.startsWith(path + '/')), path],
    });
  const strangers = chosen.filter((path) => !app.everywhere.some((top) => path === top));
  return (
    <>
      <label class="choice all">
        <input type="checkbox" checked={chosen.length === 0} onChange={() => app.edit({ folders: [] })} />
        All folders
      </label>
      <ul class="tree">
        {app.everywhere.map((path) => (
          <Branch key={path} path={path} chosen={chosen} toggle={toggle} covered={false} />
        ))}
      </ul>
      {strangers.length > 0 && (
        <ul class="tree chosen" aria-label="Also chosen">
          {strangers.map((path) => (
            <li key={path}>
              <label class="choice">
                <input type="checkbox" checked onChange={() => toggle(path)} />
                <span class="ellipsis">
                  <Name text={path} />
                </span>
              </label>
            </li>
          ))}
        </ul>
      )}
      <PathLine add={(path) => !chosen.includes(path) && toggle(path)} />
      <footer>
        <label class="choice">
          <input
            type="checkbox"
            checked={app.draft.subfolders}
            onChange={(event) => app.edit({ subfolders: event.currentTarget.checked })}
          />
          With subfolders
        </label>
        <button type="button" class="tool" onClick={() => (close(), app.submit())}>
          Search
        </button>
      </footer>
    </>
  );
}

interface BranchProps {
  path: string;
  chosen: string[];
  toggle: (path: string) => void;
  covered: boolean; // a folder above is chosen
}

function Branch({ path, chosen, toggle, covered }: BranchProps) {
  const [inside, setInside] = useState<Subfolders | 'reading' | string | null>(null);
  const name = path.slice(path.lastIndexOf('/') + 1);
  const own = chosen.includes(path);
  const shownName = path === '/home' ? 'My home folder' : name;
  const unfold = async () => {
    if (inside) return setInside(null);
    setInside('reading');
    try {
      setInside(await listSubfolders(path));
    } catch (error) {
      setInside(error instanceof Error ? error.message : String(error));
    }
  };
  return (
    <li>
      <div class="branch">
        <button
          type="button"
          class="quiet fold"
          aria-expanded={inside !== null}
          aria-label={`Folders in ${visible(name)}`}
          onClick={() => void unfold()}
        >
          <Icon name={inside ? 'down' : 'right'} size={11} />
        </button>
        <label class="choice">
          <input type="checkbox" checked={own || covered} disabled={covered} onChange={() => toggle(path)} />
          <span class="ellipsis">
            <Name text={shownName} />
          </span>
        </label>
      </div>
      {inside && typeof inside === 'string' && (
        <p class="hint">{inside === 'reading' ? 'Reading …' : inside}</p>
      )}
      {inside && typeof inside === 'object' && (
        <>
          {inside.paths.length === 0 && <p class="hint">No folders inside</p>}
          <ul>
            {inside.paths.map((below) => (
              <Branch key={below} path={below} chosen={chosen} toggle={toggle} covered={own || covered} />
            ))}
          </ul>
          {inside.more > 0 && (
            <p class="hint">{plural(inside.more, 'folder')} more: type the path below</p>
          )}
        </>
      )}
    </li>
  );
}

function PathLine({ add }: { add: (path: string) => void }) {
  const [path, setPath] = useState('');
  const tidy = '/' + path.trim().replace(/^\/+|\/+$/g, '');
  const submit = () => {
    if (tidy === '/') return;
    add(tidy);
    setPath('');
  };
  return (
    <div class="pathline">
      <input
        type="text"
        value={path}
        placeholder="/share/folder"
        aria-label="Path of a folder to add"
        spellcheck={false}
        autocapitalize="none"
        onInput={(event) => setPath(event.currentTarget.value)}
        onKeyDown={(event) => event.key === 'Enter' && (event.preventDefault(), submit())}
      />
      <button type="button" class="tool" disabled={tidy === '/'} onClick={submit}>
        Add
      </button>
    </div>
  );
}
