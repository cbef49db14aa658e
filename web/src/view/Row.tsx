import { memo } from 'preact/compat';
import type { FileRow } from '../api/types.ts';
import type { Highlighter } from '../model/highlight.ts';
import { formatSize } from '../model/size.ts';
import { folderOf, visible } from '../model/text.ts';
import { formatTime } from '../model/times.ts';
import { Icon, iconOf } from './icons.tsx';
import { Name, Path } from './Name.tsx';

interface Props {
  index: number;
  top: number;
  row: FileRow | undefined;
  active: boolean;
  highlighter: Highlighter;
  choose: (row: FileRow) => void;
  open: (row: FileRow) => void;
}

function DrawnRow({ index, top, row, active, highlighter, choose, open }: Props) {
  return (
    <div
      id={`row-${index}`}
      role="row"
      class={`row ${active ? 'active' : ''} ${row ? '' : 'waiting'}`}
      aria-rowindex={index + 2}
      aria-selected={active}
      style={{ transform: `translateY(${top}px)` }}
      onClick={() => row && choose(row)}
      onDblClick={() => row && open(row)}
    >
      {row ? <Cells row={row} highlighter={highlighter} /> : <div class="cell name" role="gridcell">…</div>}
    </div>
  );
}

function Cells({ row, highlighter }: { row: FileRow; highlighter: Highlighter }) {
  return (
    <>
      <div class="cell name" role="gridcell" title={visible(row.name)}>
        <Icon name={iconOf(row.name, row.is_dir)} />
        <span class="ellipsis">
          <Name text={row.name} ranges={highlighter.ranges(row.name)} />
        </span>
      </div>
      <div class="cell path" role="gridcell" title={visible(row.path)}>
        <span class="ellipsis">
          <Path path={folderOf(row.path)} />
        </span>
      </div>
      <div class="cell type" role="gridcell">
        {row.is_dir ? 'Folder' : <Name text={row.type ?? ''} />}
      </div>
      <div class="cell size" role="gridcell">
        {row.is_dir || row.size === undefined ? '' : formatSize(row.size)}
      </div>
      <div class="cell mtime" role="gridcell">
        {row.time ? formatTime(row.time.mtime) : ''}
      </div>
    </>
  );
}

export const Row = memo(
  DrawnRow,
  (a, b) =>
    a.row === b.row &&
    a.top === b.top &&
    a.active === b.active &&
    a.index === b.index &&
    a.highlighter === b.highlighter,
);
