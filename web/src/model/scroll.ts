// Where the rows of a long table stand. Browsers cap the height of an element at some 17 to 33
// million pixels, which a million rows exceed, so the scrolled element is never higher than
// `MOST_PIXELS` and the place in the table is kept apart from the place of the scroll bar: small
// movements (wheel, finger, arrow) move the table pixel by pixel, large ones (dragging the bar, a
// jump) move it to the same fraction of the table. When the movement ends, `settle` puts the bar
// back to where it belongs, which is not visible in the rows.
export const MOST_PIXELS = 8_000_000;

export interface Size {
  rows: number;
  rowHeight: number;
  viewport: number; // pixels of it that can be seen
}

export class ScrollModel {
  private size: Size = { rows: 0, rowHeight: 1, viewport: 0 };
  // Pixels of the whole table above what is seen, and the bar's position that was last seen.
  private top = 0;
  private bar = 0;
  // Where it was before, which there may not be rows enough for yet; null when somebody has moved it.
  private wanted: number | null = null;

  // Whether the table has moved towards where it was before: the bar is to be settled then.
  resize(size: Size): boolean {
    this.size = size;
    const before = this.top;
    this.top = Math.min(this.wanted ?? this.top, this.mostTop);
    if (this.top === this.wanted) this.wanted = null;
    return this.top > before;
  }

  // Pixels of the whole table above what is seen.
  get above(): number {
    return this.wanted ?? this.top;
  }
  restore(above: number): void {
    this.wanted = above;
  }

  get height(): number {
    return Math.min(this.full, MOST_PIXELS);
  }
  private get full(): number {
    return this.size.rows * this.size.rowHeight;
  }
  private get mostTop(): number {
    return Math.max(0, this.full - this.size.viewport);
  }
  private get mostBar(): number {
    return Math.max(0, this.height - this.size.viewport);
  }
  private get scaled(): boolean {
    return this.full > MOST_PIXELS;
  }

  // The bar is now at `bar`.
  scrolled(bar: number): void {
    const moved = bar - this.bar;
    if (moved === 0) return;
    this.bar = bar;
    this.wanted = null;
    const jump = !this.scaled || Math.abs(moved) > 2 * this.size.viewport;
    this.top = jump ? this.topFor(bar) : Math.min(Math.max(this.top + moved, 0), this.mostTop);
  }

  private topFor(bar: number): number {
    if (!this.scaled || this.mostBar === 0) return Math.min(bar, this.mostTop);
    return Math.round((bar / this.mostBar) * this.mostTop);
  }

  // The bar's position that belongs to the rows seen.
  settle(): number {
    this.bar = this.barFor(this.top);
    return this.bar;
  }

  private barFor(top: number): number {
    if (!this.scaled || this.mostTop === 0) return top;
    const bar = Math.round((top / this.mostTop) * this.mostBar);
    // Never at an end unless the table is: there would be no room left to scroll the rest.
    const room = this.size.viewport;
    if (top > 0 && bar < room) return Math.min(top, room);
    if (top < this.mostTop && bar > this.mostBar - room) {
      return this.mostBar - Math.min(this.mostTop - top, room);
    }
    return bar;
  }

  // Moves the table so that the row can be seen whole; false when it already can.
  reveal(row: number): boolean {
    const start = row * this.size.rowHeight;
    const end = start + this.size.rowHeight;
    let top = this.top;
    if (start < top) top = start;
    else if (end > top + this.size.viewport) top = end - this.size.viewport;
    if (top === this.top) return false;
    this.top = Math.max(0, top);
    this.wanted = null;
    return true;
  }

  toTop(): void {
    this.top = 0;
    this.wanted = null;
  }

  // Rows that can be seen, even in part.
  get first(): number {
    return Math.floor(this.top / this.size.rowHeight);
  }
  get last(): number {
    const end = Math.ceil((this.top + this.size.viewport) / this.size.rowHeight) - 1;
    return Math.min(Math.max(end, 0), this.size.rows - 1);
  }

  // Where a row stands in the scrolled element, while the bar is where it was last seen.
  placeOf(row: number): number {
    return this.bar + row * this.size.rowHeight - this.top;
  }
}
