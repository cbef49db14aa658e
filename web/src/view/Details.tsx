// One result beside the table: a preview where the browser can show it safely, what is known about
// it, and what can be done with it.
import { useEffect, useMemo, useRef, useState } from 'preact/hooks';
import { fileAddress, foundLine } from '../api/client.ts';
import type { FileRow, FoundLine } from '../api/types.ts';
import { Highlighter } from '../model/highlight.ts';
import { previewKind, textPieces } from '../model/preview.ts';
import type { Word } from '../model/query.ts';
import { formatSize } from '../model/size.ts';
import { count, folderOf, visible } from '../model/text.ts';
import { formatTime } from '../model/times.ts';
import type { App } from '../state/app.ts';
import { Icon } from './icons.tsx';
import { FoundText, Name, Path } from './Name.tsx';
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
      {!row.is_dir && <Preview key={row.path} row={row} pattern={pattern} words={app.reading.wordsOf(pattern)} />}
      <div class="actions">
        {row.is_dir && (
          <button type="button" class="tool" onClick={() => app.browse(row.path)}>
            <Icon name="folder" size={14} /> Open
          </button>
        )}
        <button type="button" class="tool" onClick={() => actions.download(row)}>
          <Icon name={row.is_dir ? 'archive' : 'download'} size={14} /> Download
        </button>
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

interface PreviewProps {
  row: FileRow;
  pattern: string;
  words: Word[];
}

function Preview({ row, pattern, words }: PreviewProps) {
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
  return <TextPreview row={row} pattern={pattern} words={words} fail={() => setFailed(true)} />;
}

// In whatever encoding it is written, with the first line in sight that holds what was asked for.
function TextPreview({ row, pattern, words, fail }: PreviewProps & { fail: () => void }) {
  const [found, setFound] = useState<FoundLine | null>(null);
  const box = useRef<HTMLDivElement>(null);
  useEffect(() => {
    const abort = new AbortController();
    foundLine(row, pattern, true, abort.signal).then(
      (reply) => (reply.text ? setFound(reply) : fail()),
      () => abort.signal.aborted || fail(),
    );
    return () => abort.abort();
  }, [row.path, pattern]);
  const text = found?.text;
  // Of a long file its lines are highlighted from where they are shown.
  const lines = useMemo(() => {
    if (!text) return [];
    return textPieces(text.text, new Highlighter(words, 'contents'));
  }, [text, words]);
  useEffect(() => {
    if (!box.current || !found?.text) return;
    const { line, text } = found;
    const mark = box.current.querySelector('mark');
    const height = box.current.querySelector('pre')!.offsetHeight / Math.max(1, text.text.split('\n').length);
    const top = line === null ? mark?.offsetTop : (line - text.first_line) * height;
    const near = [...box.current.querySelectorAll('mark')].find((one) => one.offsetTop + height >= (top ?? 0));
    const place = (line === null ? mark : (near ?? mark))?.offsetTop ?? top;
    if (place !== undefined) box.current.scrollTop = place - box.current.clientHeight / 3;
  }, [found]);
  return (
    <>
      {found && found.line !== null && (
        <p class="found">
          <span class="aside">Line {count(found.line)}:</span> <FoundText parts={found.parts} />
        </p>
      )}
      <div class="preview text" ref={box} tabIndex={0} aria-label="Text of the file" role="region">
        {text?.before && <p class="hint">From line {count(text.first_line)} on.</p>}
        <pre>{lines.map((piece) => (piece.marked ? <mark>{piece.text}</mark> : piece.text))}</pre>
        {text?.after && <p class="hint">The file goes on.</p>}
      </div>
    </>
  );
}
