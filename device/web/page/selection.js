// Which rows of a list are selected: by index, with the anchor that a range starts from.

export class Selection {
  #onChange;
  #base = new Set();
  anchor = 0;
  chosen = new Set();

  // onChange gets the indexes whose state has turned.
  constructor(onChange) {
    this.#onChange = onChange;
  }

  only(index) {
    this.#change(new Set([index]));
    this.anchorAt(index);
  }

  toggle(index) {
    const next = new Set(this.chosen);
    if (!next.delete(index)) next.add(index);
    this.#change(next);
    this.anchorAt(index);
  }

  all(count) {
    this.#change(new Set(Array(count).keys()));
    this.anchorAt(this.anchor);
  }

  clear() {
    this.#change(new Set());
    this.anchorAt(this.anchor);
  }

  // What is selected now stays so while ranges from this anchor grow and shrink.
  anchorAt(index) {
    this.anchor = index;
    this.#base = this.chosen;
  }

  rangeTo(index) {
    const next = new Set(this.#base);
    const last = Math.max(this.anchor, index);
    for (let each = Math.min(this.anchor, index); each <= last; ++each) next.add(each);
    this.#change(next);
  }

  // For a list that has been filled anew: nothing on it has been painted yet.
  reset(indexes, anchor) {
    this.chosen = new Set(indexes);
    this.anchorAt(anchor);
  }

  #change(next) {
    const turned = differing(this.chosen, next);
    this.chosen = next;
    this.#onChange(turned);
  }
}

function differing(one, other) {
  return [...[...one].filter((each) => !other.has(each)), ...[...other].filter((each) => !one.has(each))];
}
