// One result beside the table: a preview where the browser can show it safely, what is known about
// it, and what can be done with it.
import { useEffect, useRef, useState } from 'preact/hooks';
import { fileAddress } from '../api/client.ts';
import type { FileRow } from '../api/types.ts';
import { Highlighter } from '../model/highlight.ts';
import { previewKind, readStart, type TextStart } from '../model/preview.ts';
import { formatSize } from '../model/size.ts';
import { count, folderOf, visible } from '../model/text.ts';
import { formatTime } from '../model/times.ts';
import type { App } from '../state/app.ts';
import { Icon } from './icons.tsx';
import { Name, Path } from './Name.tsx';
import type { RowActions } from './ResultTable.tsx';

interface Props {
  app: App;
  row: FileRow;
  pattern: string;
  actions: RowActions;
}

export function Details({ app, row, pattern, actions }: Props) {
  const close = () => {
    app.hideDetails();
    document.querySelector<HTMLElement>('.table')?.focus();
  };
  return (
    <aside class="details" aria-label={`About ${visible(row.name)}`} onKeyDown={(event) => event.key === 'Escape' && close()}>
      <header>
        <h2>
          <Name text={row.name} />
        </h2>
        <button type="button" class="quiet" aria-label="Close" title="Close (Esc)" onClick={close}>
          <Icon name="close" size={15} />
        </button>
      </header>
      {!row.is_dir && <Preview key={row.path} row={row} pattern={pattern} />}
      <div class="actions">
        {row.is_dir && (
          <button type="button" class="tool" onClick={() => app.browse(row.path)}>
            <Icon name="folder" size={14} /> Open
          </button>
        )}
        {!row.is_dir && (
          <button type="button" class="tool" onClick={() => actions.download(row)}>
            <Icon name="download" size={14} /> Download
          </button>
        )}
        {!row.is_dir && previewKind(row.name) !== 'none' && (
          <a class="tool" href={fileAddress(row, true)} target="_blank" rel="noopener">
            <Icon name="open" size={14} /> Open
          </a>
        )}
        <button type="button" class="tool" onClick={() => actions.copy(row)}>
          <Icon name="copy" size={14} /> Copy path
        </button>
        {row.is_dir ? (
          <button type="button" class="tool" onClick={() => app.submit({ folders: [row.path], subfolders: true })}>
            <Icon name="search" size={14} /> Search in it
          </button>
        ) : (
          <button type="button" class="tool" onClick={() => app.browse(folderOf(row.path))}>
            <Icon name="folder" size={14} /> Open its folder
          </button>
        )}
      </div>
      <Facts row={row} />
    </aside>
  );
}

function Facts({ row }: { row: FileRow }) {
  const time = (second: number | undefined) => (second ? formatTime(second) : '');
  const facts: [string, string][] = [
    ['Size', row.is_dir || row.size === undefined ? '' : sizeFact(row.size)],
    ['Modified', time(row.time?.mtime)],
    ['Created', time(row.time?.crtime)],
    ['Last opened', time(row.time?.atime)],
    ['Owner', row.owner?.user ?? ''],
    ['Group', row.owner?.group ?? ''],
  ];
  return (
    <dl>
      <dt>Path</dt>
      <dd class="whole">
        <Path path={row.path} />
      </dd>
      {facts.map(([name, value]) =>
        value ? (
          <>
            <dt>{name}</dt>
            <dd>
              <Name text={value} />
            </dd>
          </>
        ) : null,
      )}
    </dl>
  );
}

function sizeFact(size: number): string {
  return size < 1000 ? `${size} bytes` : `${formatSize(size)} (${count(size)} bytes)`;
}

function Preview({ row, pattern }: { row: FileRow; pattern: string }) {
  const [failed, setFailed] = useState(false);
  const kind = previewKind(row.name);
  if (kind === 'none' || row.size === 0) {
    return <p class="nopreview">{row.size === 0 ? 'Empty file' : 'No preview'}</p>;
  }
  if (failed) {
    return <p class="nopreview">This file cannot be shown: it may be gone, closed to you, or damaged.</p>;
  }
  const address = fileAddress(row, true);
  if (kind === 'image') {
    return (
      <div class="preview">
        <img src={address} alt={`Preview of ${visible(row.name)}`} onError={() => setFailed(true)} />
      </div>
    );
  }
  if (kind === 'pdf') {
    return (
      <div class="preview page">
        <iframe src={address} title={`Preview of ${visible(row.name)}`} />
      </div>
    );
  }
  return <TextPreview address={address} pattern={pattern} fail={() => setFailed(true)} />;
}

function TextPreview({ address, pattern, fail }: { address: string; pattern: string; fail: () => void }) {
  const [start, setStart] = useState<TextStart | null>(null);
  const box = useRef<HTMLDivElement>(null);
  useEffect(() => {
    const abort = new AbortController();
    readStart(address, new Highlighter(pattern, 'contents'), abort.signal).then(setStart, () => {
      if (!abort.signal.aborted) fail();
    });
    return () => abort.abort();
  }, [address, pattern]);
  useEffect(() => {
    const mark = box.current?.querySelector('mark');
    if (mark && box.current) box.current.scrollTop = mark.offsetTop - box.current.clientHeight / 3;
  }, [start]);
  return (
    <div class="preview text" ref={box} tabIndex={0} aria-label="Text of the file" role="region">
      <pre>
        {start?.pieces.map((piece) => (piece.marked ? <mark>{piece.text}</mark> : piece.text))}
      </pre>
      {start?.cut && <p class="hint">Only the beginning is shown.</p>}
    </div>
  );
}
