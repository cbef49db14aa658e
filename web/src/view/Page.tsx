// The page as a whole, and what the keyboard does anywhere on it.
import { useEffect, useMemo, useState } from 'preact/hooks';
import { checkFile, fileAddress } from '../api/client.ts';
import { ApiError } from '../api/errors.ts';
import type { FileRow } from '../api/types.ts';
import type { Spans } from '../model/choice.ts';
import { browses, type CriterionError } from '../model/criteria.ts';
import { previewKind } from '../model/preview.ts';
import { copied, plural, visible } from '../model/text.ts';
import type { App } from '../state/app.ts';
import { chosenRows, downloadRows } from '../state/chosen.ts';
import { copyText, follow } from '../state/save.ts';
import { Search } from '../state/search.ts';
import { nextTheme, themeName } from '../state/theme.ts';
import { Failed, Nothing, Welcome } from './Blank.tsx';
import { CriteriaPanel, CriteriaTags } from './CriteriaPanel.tsx';
import { Crumbs } from './Crumbs.tsx';
import { Details } from './Details.tsx';
import { FolderPicker } from './FolderPicker.tsx';
import { Gate } from './Gate.tsx';
import { Help } from './Help.tsx';
import { Icon, Wordmark } from './icons.tsx';
import { Popover } from './Popover.tsx';
import { ResultTable, type RowActions } from './ResultTable.tsx';
import { QueryLine } from './QueryLine.tsx';
import { SearchBar } from './SearchBar.tsx';
import { InstantLine, StatusLine } from './StatusLine.tsx';

export function Page({ app }: { app: App }) {
  const [help, setHelp] = useState(false);
  useEffect(() => {
    const onKeyDown = (event: KeyboardEvent) => pageKey(app, event, () => setHelp(true));
    addEventListener('keydown', onKeyDown);
    return () => removeEventListener('keydown', onKeyDown);
  }, [app]);
  const actions = useMemo(() => rowActions(app), [app]);
  if (app.gate !== 'ready') return <Gate app={app} />;
  return (
    <>
      <header class="top">
        <h1>
          <a
            class="home"
            href="#"
            aria-label="Arbory Search, start"
            onClick={(event) => {
              event.preventDefault();
              app.home();
            }}
          >
            <Wordmark />
          </a>
        </h1>
        <SearchBar app={app} />
        <Menu app={app} help={() => setHelp(true)} />
      </header>
      <section class="toolbar" aria-label="Folders and criteria">
        <FolderPicker app={app} />
        <button
          type="button"
          class="tool"
          aria-expanded={app.unfolded}
          aria-controls="criteria"
          onClick={() => app.set({ unfolded: !app.unfolded })}
        >
          <Icon name="sliders" size={15} />
          Criteria
          <Icon name={app.unfolded ? 'up' : 'down'} size={11} />
        </button>
        <CriteriaTags app={app} />
        <QueryLine app={app} />
      </section>
      {app.draftError && !inPlace(app.draftError) && (
        <p class="wrong band" role="alert">
          {app.draftError.message}
        </p>
      )}
      {app.unfolded && <CriteriaPanel app={app} />}
      <Result app={app} actions={actions} />
      {app.notice && (
        <p class="notice" role="status">
          {app.notice}
        </p>
      )}
      {help && <Help close={() => setHelp(false)} />}
    </>
  );
}

// Told beside the field that it is about.
const inPlace = ({ field }: CriterionError) => field !== 'folders';

function Result({ app, actions }: { app: App; actions: RowActions }) {
  const { search } = app;
  if (app.showsInstant) return <AtOnce app={app} actions={actions} />;
  if (!search) {
    return (
      <main>
        <Welcome app={app} />
      </main>
    );
  }
  const failed = search.status === 'failed' && search.found === 0;
  const nothing = search.over && !failed && search.found === 0 && search.filter === '';
  return (
    <main>
      {browses(search.criteria) && <Crumbs app={app} folder={search.criteria.folders[0]!} />}
      {!failed && <StatusLine app={app} search={search} actions={actions} />}
      {(search.error || search.trouble) && !failed && (
        <p class="wrong band" role="alert">
          {search.error || search.trouble}
        </p>
      )}
      {failed && <Failed app={app} search={search} />}
      {nothing && <Nothing app={app} search={search} />}
      {!failed && !nothing && (
        <div class={`result ${app.detailed ? 'with-details' : ''}`}>
          <ResultTable key={search} app={app} search={search} actions={actions} />
          {app.detailed && (
            <Details app={app} row={app.detailed} pattern={search.criteria.pattern} actions={actions} />
          )}
        </div>
      )}
    </main>
  );
}

// What is shown while one types.
function AtOnce({ app, actions }: { app: App; actions: RowActions }) {
  const { instant } = app;
  return (
    <main>
      <InstantLine app={app} />
      <div class={`result ${app.detailed ? 'with-details' : ''}`}>
        <ResultTable app={app} search={instant} actions={actions} />
        {app.detailed && (
          <Details
            app={app}
            row={app.detailed}
            pattern={instant.criteria?.pattern ?? ''}
            actions={actions}
          />
        )}
      </div>
    </main>
  );
}

function Menu({ app, help }: { app: App; help: () => void }) {
  const [theme, setTheme] = useState(themeName());
  return (
    <Popover
      className="quiet menubutton"
      title="Menu"
      panelLabel="Menu"
      panelClass="menu right"
      label={<Icon name="more" size={18} />}
    >
      {(close) => (
        <>
          {app.session && (
            <p class="who">
              {visible(app.session.user)}
              {app.session.version && <span class="aside"> · version {app.session.version}</span>}
            </p>
          )}
          <button type="button" onClick={() => setTheme(nextTheme())}>
            Colours <span class="aside">{theme}</span>
          </button>
          <button type="button" onClick={() => (close(), help())}>
            Keyboard <span class="aside">?</span>
          </button>
          {app.session?.mode === 'login' && (
            <button type="button" onClick={() => void app.signOut()}>
              Sign out
            </button>
          )}
        </>
      )}
    </Popover>
  );
}

function pageKey(app: App, event: KeyboardEvent, help: () => void): void {
  if (event.ctrlKey || event.metaKey || event.altKey || event.defaultPrevented) return;
  const target = event.target as HTMLElement;
  if (target.closest('input, select, textarea, dialog') || app.gate !== 'ready') return;
  if (event.key === '/') {
    const field = document.querySelector<HTMLInputElement>('#pattern');
    field?.focus();
    field?.select();
  } else if (event.key === 'n') {
    document.querySelector<HTMLInputElement>('#narrow')?.focus();
  } else if (event.key === '?') {
    help();
  } else if (event.key === 'f') {
    app.set({ unfolded: !app.unfolded });
  } else {
    return;
  }
  event.preventDefault();
}

function rowActions(app: App): RowActions {
  const whenReadable = (row: FileRow, act: () => void) =>
    void checkFile(row).then(act, (error: unknown) => {
      if (error instanceof ApiError && error.signedOut) app.signedOut();
      else app.tell(error instanceof Error ? error.message : String(error));
    });
  const downloadAll = async (spans: Spans) => {
    if (!(app.shown instanceof Search)) return app.tell('Press Enter first, to have them all found.');
    const refused = await downloadRows(app.shown, spans);
    if (refused) app.tell(refused);
  };
  const download = (row?: FileRow) => {
    const { shown } = app;
    if (shown && shown.choice.count > 0) void downloadAll(shown.choice.spans);
    else if (row) downloadOne(row);
  };
  const downloadOne = (row: FileRow) => {
    // A folder comes as an archive of the one row, which is the one that is acted on.
    if (row.is_dir) void downloadAll([[app.active, app.active]]);
    else whenReadable(row, () => follow(fileAddress(row), row.name));
  };
  return {
    download,
    open: (row) => {
      if (row.is_dir) app.browse(row.path);
      else if (previewKind(row.name) === 'none') downloadOne(row);
      else whenReadable(row, () => window.open(fileAddress(row, true), '_blank', 'noopener'));
    },
    copy: async (row) => {
      const { shown } = app;
      const chosen = shown !== null && shown.choice.count > 0;
      const rows = chosen ? await chosenRows(shown, shown.choice.spans) : row ? [row] : [];
      if (rows.length === 0) return;
      const done = await copyText(rows.map(copied).join('\n'));
      const quoted = rows.some((one) => copied(one) !== one.path);
      const what = chosen ? `${plural(rows.length, 'path')} copied` : 'The path is copied';
      if (!done) app.tell('The browser did not let it be copied.');
      else if (quoted) app.tell(`${what} as a shell writes it: it holds bytes that are no text.`);
      else app.tell(`${what}.`);
    },
  };
}
