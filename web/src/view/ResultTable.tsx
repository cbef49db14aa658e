// The table of results. Only the rows that can be seen are drawn, whatever their number; the scroll
// model says where they stand. The table is one stop for the Tab key and the arrow keys move in it.
import { useCallback, useEffect, useLayoutEffect, useMemo, useRef, useState } from 'preact/hooks';
import type { FileRow } from '../api/types.ts';
import { Highlighter } from '../model/highlight.ts';
import type { ScrollModel } from '../model/scroll.ts';
import type { App } from '../state/app.ts';
import type { Shown } from '../state/shown.ts';
import { COLUMNS } from './columns.ts';
import { Icon } from './icons.tsx';
import { Row } from './Row.tsx';

// Drawn beyond the edges, so that a fast finger does not see them.
const OVERSCAN = 6;
const SETTLE_MS = 160;

export interface RowActions {
  open: (row: FileRow) => void;
  download: (row: FileRow) => void;
  copy: (row: FileRow) => void;
}

export function ResultTable({ app, search, actions }: { app: App; search: Shown; actions: RowActions }) {
  const root = useRef<HTMLDivElement>(null);
  const scroller = useRef<HTMLDivElement>(null);
  const model = search.scroll;
  const [, redraw] = useState(0);
  const pattern = search.criteria?.pattern ?? '';
  const highlighter = useMemo(() => new Highlighter(pattern), [pattern]);
  const rows = search.found;
  const { rowHeight, viewport } = useMeasures(scroller);
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
  useEffect(app.placed, [model.above, app.active]);

  const goTo = useCallback(
    (index: number) => {
      const row = Math.min(Math.max(index, 0), total.current - 1);
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
    const copies = (event.ctrlKey || event.metaKey) && event.key === 'c' && getSelection()?.isCollapsed;
    if (event.key in steps && !event.ctrlKey && !event.metaKey && !event.altKey) {
      if (event.key === 'ArrowUp' && app.active <= 0) focusField();
      else goTo(steps[event.key]!);
    } else if (row && copies) {
      actions.copy(row);
    } else if (event.ctrlKey || event.metaKey || event.altKey) {
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
      if (app.detailed) app.hideDetails();
      else focusField();
    } else {
      return;
    }
    event.preventDefault();
  };

  const first = Math.max(0, model.first - OVERSCAN);
  const last = Math.min(rows - 1, model.last + OVERSCAN);
  const indexes = Array.from({ length: Math.max(0, last - first + 1) }, (_, i) => first + i);
  const activeSeen = app.active >= first && app.active <= last;
  return (
    <div
      ref={root}
      class="table"
      role="grid"
      tabIndex={0}
      aria-label="Results"
      aria-rowcount={rows + 1}
      aria-colcount={COLUMNS.length}
      aria-busy={!search.over}
      aria-activedescendant={activeSeen ? `row-${app.active}` : undefined}
      onKeyDown={onKeyDown}
      onFocus={() => app.active < 0 && rows > 0 && app.set({ active: model.first })}
    >
      <Head app={app} search={search} />
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
        <div class="spacer" role="presentation" style={{ height: `${model.height}px` }}>
          {indexes.map((index) => (
            <Row
              key={index}
              index={index}
              top={model.placeOf(index)}
              row={search.pages.row(index)}
              active={index === app.active}
              highlighter={highlighter}
              choose={(row) => {
                root.current?.focus({ preventScroll: true });
                goTo(index);
                app.showDetails(row);
              }}
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

function Head({ app, search }: { app: App; search: Shown }) {
  const { sort } = search;
  const click = (column: (typeof COLUMNS)[number]) => {
    const first = Boolean(column.mostFirst);
    if (sort?.column !== column.column) app.setSort({ column: column.column, descending: first });
    else if (sort.descending === first) app.setSort({ column: column.column, descending: !first });
    else app.setSort(null);
  };
  return (
    <div class="head" role="row" aria-rowindex={1}>
      {COLUMNS.map((column) => {
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

// The height of a row is the style sheet's to say; it differs on a phone.
function useMeasures(scroller: { current: HTMLElement | null }) {
  const [measures, setMeasures] = useState({ rowHeight: 30, viewport: 600 });
  useLayoutEffect(() => {
    const element = scroller.current!;
    const measure = () => {
      const rowHeight = parseFloat(getComputedStyle(element).getPropertyValue('--row')) || 30;
      setMeasures((old) =>
        old.rowHeight === rowHeight && old.viewport === element.clientHeight
          ? old
          : { rowHeight, viewport: element.clientHeight },
      );
    };
    measure();
    const observer = new ResizeObserver(measure);
    observer.observe(element);
    return () => observer.disconnect();
  }, []);
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
