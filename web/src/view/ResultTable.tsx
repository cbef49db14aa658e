// The table of results. Only the rows that can be seen are drawn, whatever their number; the scroll
// model says where they stand. The table is one stop for the Tab key and the arrow keys move in it.
import { useCallback, useEffect, useLayoutEffect, useMemo, useRef, useState } from 'preact/hooks';
import type { FileRow } from '../api/types.ts';
import { holds } from '../model/choice.ts';
import { Highlighter } from '../model/highlight.ts';
import type { ScrollModel } from '../model/scroll.ts';
import type { App } from '../state/app.ts';
import type { Shown } from '../state/shown.ts';
import { fittingColumns, type Column } from './columns.ts';
import { Icon } from './icons.tsx';
import { Row } from './Row.tsx';

// Drawn beyond the edges, so that a fast finger does not see them.
const OVERSCAN = 6;
const SETTLE_MS = 160;

export interface RowActions {
  open: (row: FileRow) => void;
  // Of what is chosen, or else of the row.
  download: (row?: FileRow) => void;
  copy: (row?: FileRow) => void;
}

export function ResultTable({ app, search, actions }: { app: App; search: Shown; actions: RowActions }) {
  const root = useRef<HTMLDivElement>(null);
  const scroller = useRef<HTMLDivElement>(null);
  const model = search.scroll;
  const [, redraw] = useState(0);
  const words = app.reading.wordsOf(search.criteria?.pattern ?? '');
  const highlighter = useMemo(() => new Highlighter(words), [words]);
  const { choice } = search;
  const { spans } = choice;
  const rows = search.found;
  const looks = `${app.pictures ? 'with-pictures' : ''} ${search.lines ? 'with-lines' : ''}`;
  const { rowHeight, viewport, width } = useMeasures(scroller, looks);
  const columns = useMemo(() => fittingColumns(app.columns, width), [app.columns, width]);
  const returns = useRef(0);
  if (model.resize({ rows, rowHeight, viewport })) ++returns.current;
  const returned = returns.current;
  const total = useRef(rows);
  total.current = rows;

  useSettling(scroller, model, redraw);
  useLayoutEffect(() => {
    if (scroller.current) scroller.current.scrollTop = model.settle();
    redraw((n) => n + 1);
  }, [search, search.sort, returned]);
  useEffect(() => search.pages.show(model.first, model.last));
  useEffect(() => {
    const { first, last } = model;
    search.lines?.want(Array.from({ length: Math.max(0, last - first + 1) }, (_, i) => search.pages.row(first + i)));
  });
  useEffect(app.placed, [model.above, app.active]);

  // `how` it changes what is chosen: that row alone, a span up to it, or nothing.
  const goTo = useCallback(
    (index: number, how: 'alone' | 'span' | 'spans' | 'kept' = 'alone') => {
      const row = Math.min(Math.max(index, 0), total.current - 1);
      if (how === 'alone') search.choice.start(row);
      else if (how !== 'kept') search.choice.extend(row, how === 'spans');
      if (model.reveal(row) && scroller.current) scroller.current.scrollTop = model.settle();
      const detailed = app.detailed ? (search.pages.row(row) ?? app.detailed) : null;
      app.set({ active: row, detailed });
    },
    [app, search, model],
  );

  const onKeyDown = (event: KeyboardEvent) => {
    const page = Math.max(1, Math.floor(viewport / rowHeight) - 1);
    const steps: Record<string, number> = {
      ArrowDown: app.active + 1,
      ArrowUp: app.active - 1,
      PageDown: app.active + page,
      PageUp: app.active - page,
      Home: 0,
      End: rows - 1,
    };
    const row = search.pages.row(app.active);
    const control = event.ctrlKey || event.metaKey;
    const copies = control && event.key === 'c' && getSelection()?.isCollapsed;
    if (event.key in steps && !event.altKey) {
      const how = event.shiftKey ? (control ? 'spans' : 'span') : control ? 'kept' : 'alone';
      if (event.key === 'ArrowUp' && app.active <= 0 && how === 'alone') focusField();
      else goTo(steps[event.key]!, how);
    } else if (control && event.key === 'a') {
      choice.all(rows);
      app.changed();
    } else if (control && event.key === ' ') {
      choice.toggle(app.active);
      app.changed();
    } else if (row && copies) {
      actions.copy(row);
    } else if (control || event.altKey) {
      return;
    } else if (row && event.key === 'Enter') {
      actions.open(row);
    } else if (row && event.key === ' ') {
      if (app.detailed) app.hideDetails();
      else app.showDetails(row);
    } else if (row && event.key === 'd') {
      actions.download(row);
    } else if (row && event.key === 'c') {
      actions.copy(row);
    } else if (event.key === 'Escape') {
      if (choice.count > 0) app.choose(null);
      else if (app.detailed) app.hideDetails();
      else focusField();
    } else {
      return;
    }
    event.preventDefault();
  };

  const onClick = useCallback(
    (event: MouseEvent, index: number, row: FileRow) => {
      root.current?.focus({ preventScroll: true });
      const control = event.ctrlKey || event.metaKey;
      if (event.shiftKey) {
        getSelection()?.removeAllRanges(); // of text, which the browser has drawn meanwhile
        goTo(index, control ? 'spans' : 'span');
      } else if (control || app.choosing) {
        search.choice.toggle(index);
        goTo(index, 'kept');
      } else {
        goTo(index);
        app.showDetails(row);
      }
    },
    [app, search, goTo],
  );
  const pictureOf = (row: FileRow | undefined) => (app.pictures && row ? app.thumbnails.of(row) : null);
  const first = Math.max(0, model.first - OVERSCAN);
  const last = Math.min(rows - 1, model.last + OVERSCAN);
  const indexes = Array.from({ length: Math.max(0, last - first + 1) }, (_, i) => first + i);
  const activeSeen = app.active >= first && app.active <= last;
  return (
    <div
      ref={root}
      class={`table ${looks}`}
      role="grid"
      tabIndex={0}
      aria-label="Results"
      aria-rowcount={rows + 1}
      aria-colcount={columns.length}
      style={{ '--columns': columns.map((column) => column.width).join(' ') }}
      aria-multiselectable
      aria-busy={!search.over}
      aria-activedescendant={activeSeen ? `row-${app.active}` : undefined}
      onKeyDown={onKeyDown}
      onFocus={() => app.active < 0 && rows > 0 && app.set({ active: model.first })}
    >
      <Head app={app} search={search} columns={columns} />
      <div
        class="scroller"
        ref={scroller}
        tabIndex={-1}
        role="rowgroup"
        onScroll={(event) => {
          model.scrolled(event.currentTarget.scrollTop);
          redraw((n) => n + 1);
        }}
      >
        {rows === 0 && search.over && <p class="nopreview">No row fits.</p>}
        <div class="spacer" role="presentation" style={{ height: `${model.height}px` }}>
          {indexes.map((index) => (
            <Row
              key={index}
              index={index}
              top={model.placeOf(index)}
              row={search.pages.row(index)}
              active={index === app.active}
              chosen={holds(spans, index)}
              columns={columns}
              picture={pictureOf(search.pages.row(index))}
              highlighter={highlighter}
              line={search.lines?.of(search.pages.row(index))}
              choose={onClick}
              open={actions.open}
            />
          ))}
        </div>
      </div>
    </div>
  );
}

function focusField(): void {
  const field = document.querySelector<HTMLInputElement>('#pattern');
  field?.focus();
  field?.select();
}

function Head({ app, search, columns }: { app: App; search: Shown; columns: readonly Column[] }) {
  const { sort } = search;
  const click = (column: Column) => {
    const first = Boolean(column.mostFirst);
    if (sort?.column !== column.column) app.setSort({ column: column.column, descending: first });
    else if (sort.descending === first) app.setSort({ column: column.column, descending: !first });
    else app.setSort(null);
  };
  return (
    <div class="head" role="row" aria-rowindex={1}>
      {columns.map((column) => {
        const sorted = sort?.column === column.column;
        const direction = sort?.descending ? 'descending' : 'ascending';
        return (
          <div
            key={column.column}
            role="columnheader"
            class={`cell ${column.column}`}
            aria-sort={sorted ? direction : 'none'}
          >
            <button type="button" onClick={() => click(column)}>
              {column.title}
              {sorted && <Icon name={sort?.descending ? 'down' : 'up'} size={11} />}
            </button>
          </div>
        );
      })}
    </div>
  );
}

// The height of a row is the style sheet's to say; it differs on a phone, and with how the table looks.
function useMeasures(scroller: { current: HTMLElement | null }, looks: string) {
  const [measures, setMeasures] = useState({ rowHeight: 30, viewport: 600, width: 1000 });
  useLayoutEffect(() => {
    const element = scroller.current!;
    const measure = () => {
      const rowHeight = parseFloat(getComputedStyle(element).getPropertyValue('--row')) || 30;
      const { clientHeight: viewport, clientWidth: width } = element;
      setMeasures((old) =>
        old.rowHeight === rowHeight && old.viewport === viewport && old.width === width
          ? old
          : { rowHeight, viewport, width },
      );
    };
    measure();
    const observer = new ResizeObserver(measure);
    observer.observe(element);
    return () => observer.disconnect();
  }, [looks]);
  return measures;
}

// Puts the scroll bar back to its place once a movement has ended; during one it would break it.
function useSettling(
  scroller: { current: HTMLElement | null },
  model: ScrollModel,
  redraw: (step: (n: number) => number) => void,
): void {
  useEffect(() => {
    const element = scroller.current!;
    let timer = 0;
    let touched = false;
    const settle = () => {
      if (touched) return;
      const bar = model.settle();
      if (Math.abs(element.scrollTop - bar) >= 1) {
        element.scrollTop = bar;
        redraw((n) => n + 1);
      }
    };
    const later = () => {
      clearTimeout(timer);
      timer = window.setTimeout(settle, SETTLE_MS);
    };
    const hold = (event: Event) => {
      touched = event.type === 'pointerdown' || event.type === 'touchstart';
      if (!touched) later();
    };
    const holds = ['pointerdown', 'pointerup', 'pointercancel', 'touchstart', 'touchend', 'touchcancel'];
    element.addEventListener('scroll', later);
    holds.forEach((name) => addEventListener(name, hold, { passive: true, capture: true }));
    return () => {
      clearTimeout(timer);
      element.removeEventListener('scroll', later);
      holds.forEach((name) => removeEventListener(name, hold, { capture: true }));
    };
  }, [model]);
}
