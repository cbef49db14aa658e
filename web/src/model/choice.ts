// Which rows are chosen, by their places in the table: spans in order, apart from each other, so that
// a million chosen rows are one pair of numbers.
export type Span = readonly [first: number, last: number];
export type Spans = readonly Span[];

export function holds(spans: Spans, row: number): boolean {
  return spans.some(([first, last]) => first <= row && row <= last);
}

export function countOf(spans: Spans): number {
  return spans.reduce((sum, [first, last]) => sum + last - first + 1, 0);
}

export function withSpan(spans: Spans, a: number, b: number): Spans {
  let [first, last] = [Math.min(a, b), Math.max(a, b)];
  const apart: Span[] = [];
  for (const span of spans) {
    if (span[1] < first - 1 || span[0] > last + 1) apart.push(span);
    else [first, last] = [Math.min(first, span[0]), Math.max(last, span[1])];
  }
  return [...apart, [first, last] as const].sort((x, y) => x[0] - y[0]);
}

export function without(spans: Spans, row: number): Spans {
  return spans.flatMap(([first, last]): Span[] => {
    if (row < first || row > last) return [[first, last]];
    const parts: Span[] = [[first, row - 1], [row + 1, last]];
    return parts.filter(([from, to]) => from <= to);
  });
}

// "0-9,12", as the server reads them.
export function spansText(spans: Spans): string {
  return spans.map(([first, last]) => (first === last ? `${first}` : `${first}-${last}`)).join(',');
}

// What is chosen in one table. Places mean other rows once the order changes; nothing is chosen then.
export class Choice {
  private held: Spans = [];
  private anchor = -1; // where a span is drawn from
  private of = 0;

  // `order`: a number for each order that the rows have had.
  constructor(private readonly order: () => number) {}

  get spans(): Spans {
    return this.of === this.order() ? this.held : [];
  }
  get count(): number {
    return countOf(this.spans);
  }

  // That row alone, which is not called chosen as long as no other joins it.
  start(row: number): void {
    this.take([]);
    this.anchor = row;
  }
  toggle(row: number): void {
    const { spans } = this;
    const joined = spans.length === 0 && this.anchor >= 0 && this.anchor !== row && this.of === this.order();
    const before = joined ? withSpan([], this.anchor, this.anchor) : spans;
    this.take(holds(before, row) ? without(before, row) : withSpan(before, row, row));
    this.anchor = row;
  }
  // From where it was begun up to that row; `more`: beside what is chosen.
  extend(row: number, more: boolean): void {
    const from = this.of === this.order() && this.anchor >= 0 ? this.anchor : row;
    this.take(withSpan(more ? this.spans : [], from, row));
    this.anchor = from;
  }
  all(rows: number): void {
    if (rows > 0) this.take([[0, rows - 1]]);
  }
  clear(): void {
    this.take([]);
    this.anchor = -1;
  }

  private take(spans: Spans): void {
    this.held = spans;
    this.of = this.order();
  }
}
