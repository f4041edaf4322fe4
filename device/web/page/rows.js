// A long list of rows of one height, of which only those near the view are in the page. Height and
// places come from the style: a list has --rows of them, a row has its --index.

const AHEAD = 15;

export class Rows {
  #list;
  #makeRow;
  #count = 0;
  #made = new Map();
  kept = 0;  // the row that stays, as it has the focus

  constructor(list, makeRow) {
    this.#list = list;
    this.#makeRow = makeRow;
    document.addEventListener('scroll', () => this.draw(), { capture: true, passive: true });
    new ResizeObserver(() => this.draw()).observe(list);
    window.addEventListener('resize', () => this.draw());
  }

  fill(count, kept = 0) {
    this.#count = count;
    this.kept = kept;
    this.#made.clear();
    this.#list.replaceChildren();
    this.#list.style.setProperty('--rows', count);
    this.draw();
  }

  // Those that are in the page.
  get made() {
    return this.#made.entries();
  }

  at(index) {
    if (index < this.#count && !this.#made.has(index)) {
      const row = this.#makeRow(index);
      row.dataset.index = index;
      row.style.setProperty('--index', index);
      const next = this.#made.get(index + 1)
        ?? [...this.#list.children].find((each) => Number(each.dataset.index) > index);
      this.#list.insertBefore(row, next ?? null);
      this.#made.set(index, row);
    }
    return this.#made.get(index);
  }

  draw() {
    const { top, height } = this.#list.getBoundingClientRect();
    if (!height || !this.#count) return;
    const rowHeight = height / this.#count;
    const first = Math.max(0, Math.floor(-top / rowHeight) - AHEAD);
    const end = Math.min(this.#count, Math.ceil((innerHeight - top) / rowHeight) + AHEAD);
    for (const [index, row] of this.#made) {
      if ((index < first || index >= end) && index !== this.kept) {
        row.remove();
        this.#made.delete(index);
      }
    }
    for (let index = first; index < end; ++index) this.at(index);
    this.at(this.kept);
  }
}
