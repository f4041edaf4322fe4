// The list of a folder's entries: a grid of rows, one of which takes the keyboard's focus.
import { byId, element, icon, nameElement } from './dom.js';
import { dateText, sizeText } from './format.js';
import { shown } from './names.js';
import { Selection } from './selection.js';

const ROWS_PER_BLOCK = 250;
const AHEAD = '1500px';
const ROWS_PER_PAGE = 10;
const HEADER_ROWS = 1;

const KIND_WORDS = { folder: 'folder', file: 'file', link: 'link', other: 'special file' };

export class FileGrid {
  #root = byId('grid');
  #body = byId('grid-body');
  #selectAll = byId('select-all');
  #selection = new Selection((turned) => this.#paint(turned));
  #entries = [];
  #rows = [];
  #blocks = [];
  #active = 0;
  #touched = false;
  #observer = new IntersectionObserver((seen) => this.#fillSeen(seen), { root: this.#root, rootMargin: AHEAD });
  #onOpen;
  #onSelect;

  constructor({ onOpen, onSelect }) {
    this.#onOpen = onOpen;
    this.#onSelect = onSelect;
    this.#body.addEventListener('pointerdown', (event) => { this.#touched = event.pointerType === 'touch'; });
    this.#body.addEventListener('click', (event) => this.#click(event));
    this.#body.addEventListener('dblclick', (event) => this.#doubleClick(event));
    this.#body.addEventListener('keydown', (event) => this.#keyDown(event));
    this.#selectAll.addEventListener('change', () => this.#toggleAll());
  }

  get selectedEntries() {
    return [...this.#selection.chosen].sort((one, other) => one - other).map((index) => this.#entries[index]);
  }

  // Fills the grid for another folder; the row of the name active takes the focus.
  show(label, entries, active) {
    this.#fill(label, entries, new Set(), active);
    this.#root.scrollTop = 0;
    this.#rowAt(this.#active)?.scrollIntoView({ block: 'nearest' });
  }

  // Fills the grid with what the same folder holds now: selection, focus and place stay.
  update(label, entries) {
    const selected = new Set(this.selectedEntries.map((entry) => entry.name));
    const hadFocus = this.#body.contains(document.activeElement);
    const scrolled = this.#root.scrollTop;
    const filled = this.#blocks.filter((block) => block.hasChildNodes()).map((block) => block.dataset.first);
    this.#fill(label, entries, selected, this.#entries[this.#active]?.name);
    for (const first of filled) this.#rowAt(Number(first));
    this.#root.scrollTop = scrolled;
    if (hadFocus) this.#rowAt(this.#active)?.focus({ preventScroll: true });
  }

  #fill(label, entries, selected, active) {
    this.#entries = entries;
    this.#rows = [];
    this.#blocks = [];
    this.#active = Math.max(0, entries.findIndex((entry) => entry.name === active));
    this.#selection.reset([...entries.keys()].filter((index) => selected.has(entries[index].name)), this.#active);
    this.#root.setAttribute('aria-label', label);
    this.#root.setAttribute('aria-rowcount', entries.length + HEADER_ROWS);
    this.#root.hidden = entries.length === 0;
    this.#observer.disconnect();
    for (let first = 0; first < entries.length; first += ROWS_PER_BLOCK) {
      const block = element('div', { role: 'rowgroup', class: 'block', 'data-first': first });
      block.style.setProperty('--rows', Math.min(ROWS_PER_BLOCK, entries.length - first));
      this.#blocks.push(block);
      this.#observer.observe(block);
    }
    this.#body.replaceChildren(...this.#blocks);
    this.#rowAt(this.#active);
    this.#afterChange();
  }

  focus() {
    this.#rowAt(this.#active)?.focus();
  }

  clearSelection() {
    this.#selection.clear();
  }

  // A block of rows is filled when it comes near the view, or one of its rows is wanted.
  #fillSeen(seen) {
    for (const { isIntersecting, target } of seen) {
      if (isIntersecting) this.#rowAt(Number(target.dataset.first));
    }
  }

  #rowAt(index) {
    if (index < this.#entries.length && !this.#rows[index]) {
      const block = this.#blocks[Math.floor(index / ROWS_PER_BLOCK)];
      const first = Number(block.dataset.first);
      const rows = this.#entries.slice(first, first + ROWS_PER_BLOCK)
        .map((entry, offset) => this.#makeRow(entry, first + offset));
      rows.forEach((row, offset) => { this.#rows[first + offset] = row; });
      block.append(...rows);
      this.#observer.unobserve(block);
    }
    return this.#rows[index];
  }

  #makeRow(entry, index) {
    const name = shown(entry.name);
    const size = entry.kind === 'file' ? sizeText(entry.size) : '';
    const date = entry.modified ? dateText(entry.modified) : '';
    const isSelected = this.#selection.chosen.has(index);
    const check = element('input', { type: 'checkbox', tabindex: '-1', 'aria-label': `Select ${name}` });
    check.checked = isSelected;
    const cells = [
      element('div', { role: 'gridcell', class: 'cell-check' }, check),
      element('div', { role: 'gridcell', class: 'cell-name', title: name }, icon(entry.kind), nameElement(entry.name)),
      element('div', { role: 'gridcell', class: 'cell-size' }, size),
      element('div', { role: 'gridcell', class: 'cell-date' }, date),
    ];
    return element('div', {
      role: 'row',
      class: 'row',
      'aria-label': name,
      'aria-description': [KIND_WORDS[entry.kind], size, date].filter(Boolean).join(', '),
      'aria-rowindex': index + 1 + HEADER_ROWS,
      'aria-selected': String(isSelected),
      'data-index': index,
      tabindex: index === this.#active ? '0' : '-1',
    }, ...cells);
  }

  #paint(indexes) {
    for (const index of indexes.filter((each) => this.#rows[each])) {
      const isSelected = this.#selection.chosen.has(index);
      this.#rows[index].setAttribute('aria-selected', String(isSelected));
      this.#rows[index].querySelector('input').checked = isSelected;
    }
    this.#afterChange();
  }

  #afterChange() {
    const count = this.#selection.chosen.size;
    this.#selectAll.checked = count > 0 && count === this.#entries.length;
    this.#selectAll.indeterminate = count > 0 && count < this.#entries.length;
    this.#onSelect();
  }

  #toggleAll() {
    if (this.#selectAll.checked) this.#selection.all(this.#entries.length);
    else this.#selection.clear();
  }

  #moveTo(index) {
    const target = Math.min(Math.max(index, 0), this.#entries.length - 1);
    this.#rowAt(this.#active).tabIndex = -1;
    this.#active = target;
    const row = this.#rowAt(target);
    row.tabIndex = 0;
    row.focus();
  }

  #open(index) {
    if (this.#entries[index].kind === 'folder') this.#onOpen(this.#entries[index].name);
  }

  #indexOf(event) {
    return Number(event.target.closest('.row').dataset.index);
  }

  #click(event) {
    const index = this.#indexOf(event);
    const isCheck = event.target.matches('input');
    // A finger has no double click: a tap opens, and the checkbox selects.
    if (this.#touched && !isCheck && this.#entries[index].kind === 'folder') {
      this.#open(index);
      return;
    }
    if (event.shiftKey) this.#selection.rangeTo(index);
    else if (isCheck || this.#touched || event.ctrlKey || event.metaKey) this.#selection.toggle(index);
    else this.#selection.only(index);
    // The click has turned the checkbox by itself, even where the selection stays as it was.
    if (isCheck) event.target.checked = this.#selection.chosen.has(index);
    this.#moveTo(index);
  }

  #doubleClick(event) {
    if (!event.target.matches('input')) this.#open(this.#indexOf(event));
  }

  #keyDown(event) {
    const target = this.#keyTarget(event.key);
    if (target !== undefined) {
      this.#moveTo(target);
      if (event.shiftKey) this.#selection.rangeTo(this.#active);
      else this.#selection.anchorAt(this.#active);
    } else if (event.key === ' ') {
      if (event.shiftKey) this.#selection.rangeTo(this.#active);
      else this.#selection.toggle(this.#active);
    } else if (event.key === 'Enter') {
      this.#open(this.#active);
    } else if (event.key === 'Escape') {
      this.#selection.clear();
    } else if (event.key.toLowerCase() === 'a' && (event.ctrlKey || event.metaKey)) {
      this.#selection.all(this.#entries.length);
    } else {
      return;
    }
    event.preventDefault();
  }

  #keyTarget(key) {
    switch (key) {
      case 'ArrowDown': return this.#active + 1;
      case 'ArrowUp': return this.#active - 1;
      case 'PageDown': return this.#active + ROWS_PER_PAGE;
      case 'PageUp': return this.#active - ROWS_PER_PAGE;
      case 'Home': return 0;
      case 'End': return this.#entries.length - 1;
      default: return undefined;
    }
  }
}
