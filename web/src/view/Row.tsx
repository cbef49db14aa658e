import type { ComponentChildren } from 'preact';
import { memo } from 'preact/compat';
import type { FileRow, FoundLine } from '../api/types.ts';
import type { SortColumn } from '../model/address.ts';
import type { Highlighter } from '../model/highlight.ts';
import { formatSize } from '../model/size.ts';
import { folderOf, visible } from '../model/text.ts';
import { formatTime } from '../model/times.ts';
import type { Thumbnail } from '../state/thumbnails.ts';
import type { Column } from './columns.ts';
import { Icon, iconOf } from './icons.tsx';
import { FoundText, Name, Path } from './Name.tsx';

interface Props {
  index: number;
  top: number;
  row: FileRow | undefined;
  active: boolean;
  chosen: boolean;
  columns: readonly Column[];
  picture: Thumbnail | undefined; // null: none is shown
  highlighter: Highlighter;
  line: FoundLine | undefined;
  choose: (event: MouseEvent, index: number, row: FileRow) => void;
  open: (row: FileRow) => void;
}

function DrawnRow({ index, top, row, active, chosen, columns, picture, highlighter, line, choose, open }: Props) {
  return (
    <div
      id={`row-${index}`}
      role="row"
      class={`row ${active ? 'active' : ''} ${chosen ? 'chosen' : ''} ${row ? '' : 'waiting'}`}
      aria-rowindex={index + 2}
      aria-selected={chosen}
      style={{ transform: `translateY(${top}px)` }}
      onClick={(event) => row && choose(event, index, row)}
      onDblClick={(event) => row && !event.ctrlKey && !event.metaKey && !event.shiftKey && open(row)}
    >
      {row ? <Cells row={row} chosen={chosen} columns={columns} picture={picture} highlighter={highlighter} line={line} /> : <div class="cell name" role="gridcell">…</div>}
    </div>
  );
}

type CellsProps = Pick<Props, 'chosen' | 'columns' | 'picture' | 'highlighter' | 'line'> & { row: FileRow };

function Cells({ row, chosen, columns, picture, highlighter, line }: CellsProps) {
  return (
    <>
      {columns.map(({ column }) => (
        <div class={`cell ${column}`} role="gridcell" key={column} title={titleOf(row, column)}>
          {column === 'name' ? (
            <>
              {(chosen || !picture) && <Icon name={chosen ? 'check' : iconOf(row.name, row.is_dir)} />}
              {picture && <img class="thumbnail" src={picture} alt="" decoding="async" />}
              <span class="ellipsis">
                <Name text={row.name} ranges={highlighter.ranges(row.name)} />
                {line && (
                  <span class="found">
                    <span class="number">{line.line}</span> <FoundText parts={line.parts} />
                  </span>
                )}
              </span>
            </>
          ) : (
            cellOf(row, column)
          )}
        </div>
      ))}
    </>
  );
}

// What may be cut off.
function titleOf(row: FileRow, column: SortColumn): string | undefined {
  if (column === 'name') return visible(row.name);
  if (column === 'path') return visible(row.path);
  return column === 'user' ? visible(row.owner?.user ?? '') : undefined;
}

function cellOf(row: FileRow, column: Exclude<SortColumn, 'name'>): ComponentChildren {
  switch (column) {
    case 'path':
      return (
        <span class="ellipsis">
          <Path path={folderOf(row.path)} />
        </span>
      );
    case 'type':
      return row.is_dir ? 'Folder' : <Name text={row.type ?? ''} />;
    case 'size':
      return row.is_dir || row.size === undefined ? '' : formatSize(row.size);
    case 'mtime':
      return row.time ? formatTime(row.time.mtime) : '';
    case 'crtime':
      return row.time?.crtime ? formatTime(row.time.crtime) : '';
    case 'user':
      return <Name text={row.owner?.user ?? ''} />;
  }
}

export const Row = memo(
  DrawnRow,
  (a, b) =>
    a.row === b.row &&
    a.line === b.line &&
    a.top === b.top &&
    a.active === b.active &&
    a.chosen === b.chosen &&
    a.columns === b.columns &&
    a.picture === b.picture &&
    a.index === b.index &&
    a.highlighter === b.highlighter,
);
