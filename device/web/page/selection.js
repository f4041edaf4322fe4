// Which entries of a list are selected, with the anchor that a range starts from.

export class Selection {
  #onChange;
  #base = new Set();
  #anchor;
  chosen = new Set();

  constructor(onChange) {
    this.#onChange = onChange;
  }

  only(entry) {
    this.set([entry], entry);
  }

  toggle(entry) {
    const next = new Set(this.chosen);
    if (!next.delete(entry)) next.add(entry);
    this.set(next, entry);
  }

  set(entries, anchor = this.#anchor) {
    this.#change(new Set(entries));
    this.anchorAt(anchor);
  }

  // What is selected now stays so while ranges from this anchor grow and shrink.
  anchorAt(entry) {
    this.#anchor = entry;
    this.#base = this.chosen;
  }

  // Entries are those on show, in their order; the anchor may not be among them any more.
  rangeTo(entries, index) {
    const found = entries.indexOf(this.#anchor);
    const from = found < 0 ? index : found;
    const range = entries.slice(Math.min(from, index), Math.max(from, index) + 1);
    this.#change(new Set([...this.#base, ...range]));
  }

  #change(next) {
    this.chosen = next;
    this.#onChange();
  }
}
