// The list of a folder's entries: a grid of rows, one of which takes the keyboard's focus.
import { byId, cutNameElement, element, icon } from './dom.js';
import { dateText, sizeText } from './format.js';
import { shown } from './names.js';
import { isHidden, isMetadata, matching, nextBeginning, sorted } from './order.js';
import { Rows } from './rows.js';
import { Selection } from './selection.js';

const ROWS_PER_PAGE = 10;
const HEADER_ROWS = 1;
const TYPING_MS = 1000;
const LARGEST_FIRST = ['size', 'modified'];

const KIND_WORDS = { folder: 'folder', file: 'file', link: 'link', other: 'special file' };

export class FileGrid {
  #root = byId('grid');
  #body = byId('grid-body');
  #selectAll = byId('select-all');
  #filter = byId('filter');
  #withHidden = byId('show-hidden');
  #selection = new Selection(() => this.#paint());
  #rows = new Rows(this.#body, (index) => this.#makeRow(index));
  #all = [];      // in the order of bytes, as they came
  #sorted = [];
  #entries = [];  // those on show
  #order = { by: 'name', isDescending: false };
  #typed = '';
  #typedAt = 0;
  #touched = false;
  #on;

  // Handlers: open gets an entry; menu the place of a click, if it was one; select and view nothing.
  constructor(handlers) {
    this.#on = handlers;
    this.#body.addEventListener('pointerdown', (event) => { this.#touched = event.pointerType === 'touch'; });
    this.#body.addEventListener('click', (event) => this.#click(event));
    this.#body.addEventListener('dblclick', (event) => {
      if (!event.target.matches('input')) this.#on.open(this.#entries[indexOf(event)]);
    });
    this.#body.addEventListener('keydown', (event) => this.#keyDown(event));
    this.#body.addEventListener('focusin', (event) => this.#keep(indexOf(event)));
    this.#body.addEventListener('contextmenu', (event) => this.#contextMenu(event));
    this.#selectAll.addEventListener('change', () => this.#toggleAll());
    this.#filter.addEventListener('input', () => this.#rearrange());
    this.#filter.addEventListener('keydown', (event) => {
      if (['ArrowDown', 'Enter'].includes(event.key)) this.focus();
    });
    this.#withHidden.addEventListener('change', () => this.#rearrange());
    for (const head of this.#root.querySelectorAll('[data-by]')) {
      head.querySelector('button').addEventListener('click', () => this.#sortBy(head.dataset.by));
    }
  }

  get selectedEntries() {
    return this.#sorted.filter((entry) => this.#selection.chosen.has(entry));
  }

  get selectedCount() {
    return this.#selection.chosen.size;
  }

  // Nothing that would be packed is left out, not even what is hidden.
  get isAllSelected() {
    const { chosen } = this.#selection;
    return chosen.size > 1 && this.#all.every((entry) => chosen.has(entry) || isMetadata(entry));
  }

  get count() {
    return this.#entries.length;
  }

  // Fills the grid for another folder; the row of the name active takes the focus.
  show(label, entries, active) {
    this.#filter.value = this.#typed = '';
    this.#fill(label, entries, new Set(), active);
    const row = this.#rows.at(this.#rows.kept);
    if (this.#rows.kept > 0) row.scrollIntoView({ block: 'center' });
    else window.scrollTo(0, 0);
  }

  // Fills the grid with what the same folder holds now: selection, focus and place stay.
  update(label, entries) {
    const selected = new Set(this.selectedEntries.map((entry) => entry.name));
    const hadFocus = this.#body.contains(document.activeElement);
    this.#fill(label, entries, selected, this.#entries[this.#rows.kept]?.name);
    if (hadFocus) this.#rows.at(this.#rows.kept)?.focus({ preventScroll: true });
  }

  focus() {
    this.#rows.at(this.#rows.kept)?.focus();
  }

  clearSelection() {
    this.#selection.set([]);
  }

  selectNames(names) {
    const wanted = new Set(names);
    this.#selection.set(this.#all.filter((entry) => wanted.has(entry.name)));
  }

  // Selects and focuses one entry, whatever hides it. False when there is none of that name.
  reveal(name) {
    const entry = this.#all.find((each) => each.name === name);
    if (!entry) return false;
    this.#filter.value = '';
    this.#withHidden.checked ||= isHidden(entry);
    this.#arrange(name);
    this.#selection.only(entry);
    this.focus();
    return true;
  }

  #fill(label, entries, selected, active) {
    this.#all = entries;
    this.#sorted = sorted(entries, this.#order);
    this.#root.setAttribute('aria-label', label);
    this.#arrange(active);
    this.#selection.set(entries.filter((entry) => selected.has(entry.name)), this.#entries[this.#rows.kept]);
  }

  #arrange(active) {
    this.#entries = matching(this.#sorted, this.#filter.value, this.#withHidden.checked);
    this.#root.setAttribute('aria-rowcount', this.#entries.length + HEADER_ROWS);
    this.#root.hidden = this.#entries.length === 0;
    this.#rows.fill(this.#entries.length, Math.max(0, this.#entries.findIndex((entry) => entry.name === active)));
  }

  // What is not on show any more is not selected either: nobody would see what is packed.
  #rearrange() {
    this.#arrange(this.#entries[this.#rows.kept]?.name);
    this.#selection.set(this.#entries.filter((entry) => this.#selection.chosen.has(entry)));
    this.#on.view();
  }

  #sortBy(by) {
    const isDescending = by === this.#order.by ? !this.#order.isDescending : LARGEST_FIRST.includes(by);
    this.#order = { by, isDescending };
    this.#sorted = sorted(this.#all, this.#order);
    for (const head of this.#root.querySelectorAll('[data-by]')) {
      if (head.dataset.by === by) head.setAttribute('aria-sort', isDescending ? 'descending' : 'ascending');
      else head.removeAttribute('aria-sort');
    }
    this.#rearrange();
  }

  #makeRow(index) {
    const entry = this.#entries[index];
    const name = shown(entry.name);
    const size = entry.kind === 'file' ? sizeText(entry.size) : '';
    const date = entry.modified ? dateText(entry.modified) : '';
    const isSelected = this.#selection.chosen.has(entry);
    const check = element('input', { type: 'checkbox', tabindex: '-1', 'aria-label': `Select ${name}` });
    check.checked = isSelected;
    return element('div', {
      role: 'row',
      class: 'row',
      'aria-label': name,
      'aria-description': [KIND_WORDS[entry.kind], size, date].filter(Boolean).join(', '),
      'aria-rowindex': index + 1 + HEADER_ROWS,
      'aria-selected': String(isSelected),
      tabindex: index === this.#rows.kept ? '0' : '-1',
    },
    element('div', { role: 'gridcell', class: 'cell-check' }, check),
    element('div', { role: 'gridcell', class: 'cell-name', title: name }, icon(entry.kind), cutNameElement(entry.name)),
    element('div', { role: 'gridcell', class: 'cell-size' }, size),
    element('div', { role: 'gridcell', class: 'cell-date' }, date));
  }

  #paint() {
    for (const [index, row] of this.#rows.made) {
      const isSelected = this.#selection.chosen.has(this.#entries[index]);
      row.setAttribute('aria-selected', String(isSelected));
      row.querySelector('input').checked = isSelected;
    }
    const { chosen } = this.#selection;
    const isAll = chosen.size >= this.#entries.length && this.#entries.every((entry) => chosen.has(entry));
    this.#selectAll.checked = chosen.size > 0 && isAll;
    this.#selectAll.indeterminate = chosen.size > 0 && !isAll;
    this.#on.select();
  }

  #toggleAll() {
    this.#selection.set(this.#selectAll.checked ? this.#entries : []);
  }

  #moveTo(index) {
    const row = this.#keep(Math.min(Math.max(index, 0), this.#entries.length - 1));
    row.focus({ preventScroll: true });
    row.scrollIntoView({ block: 'nearest' });
  }

  // The row that takes the focus from now on, and stays in the page wherever that is scrolled.
  #keep(index) {
    this.#rows.at(this.#rows.kept).tabIndex = -1;
    this.#rows.kept = index;
    const row = this.#rows.at(index);
    row.tabIndex = 0;
    return row;
  }

  #click(event) {
    const index = indexOf(event);
    const entry = this.#entries[index];
    const isCheck = event.target.closest('.cell-check') !== null;
    // A finger has no double click: a tap opens, and the checkbox selects.
    if (this.#touched && !isCheck && entry.kind === 'folder') {
      this.#on.open(entry);
      return;
    }
    if (event.shiftKey) this.#selection.rangeTo(this.#entries, index);
    else if (isCheck || this.#touched || event.ctrlKey || event.metaKey) this.#selection.toggle(entry);
    else this.#selection.only(entry);
    // The click has turned the checkbox by itself, even where the selection stays as it was.
    if (event.target.matches('input')) event.target.checked = this.#selection.chosen.has(entry);
    this.#moveTo(index);
  }

  // For all that is selected, or else for the row alone. The menu key has no place of its own.
  #contextMenu(event) {
    event.preventDefault();
    const index = indexOf(event);
    if (!this.#selection.chosen.has(this.#entries[index])) this.#selection.only(this.#entries[index]);
    this.#moveTo(index);
    this.#on.menu(event.clientX || event.clientY ? event : this.#rows.at(index).getBoundingClientRect());
  }

  #keyDown(event) {
    const active = this.#rows.kept;
    const entry = this.#entries[active];
    const isCommand = event.ctrlKey || event.metaKey;
    const target = this.#keyTarget(event.key);
    if (target !== undefined) {
      this.#moveTo(target);
      if (event.shiftKey) this.#selection.rangeTo(this.#entries, this.#rows.kept);
      else this.#selection.anchorAt(this.#entries[this.#rows.kept]);
    } else if (event.key === ' ' && !this.#isTyping) {
      if (event.shiftKey) this.#selection.rangeTo(this.#entries, active);
      else this.#selection.toggle(entry);
    } else if (event.key === 'Enter') {
      this.#on.open(entry);
    } else if (event.key === 'Escape') {
      this.#selection.set([]);
    } else if (event.key.toLowerCase() === 'a' && isCommand) {
      this.#selection.set(this.#entries);
    } else if ([...event.key].length === 1 && !isCommand && !event.altKey) {
      this.#typeAhead(event.key);
    } else {
      return;
    }
    event.preventDefault();
  }

  get #isTyping() {
    return this.#typed !== '' && performance.now() - this.#typedAt < TYPING_MS;
  }

  // One letter again and again goes through what begins with it.
  #typeAhead(key) {
    const typed = (this.#isTyping ? this.#typed : '') + key;
    const isRepeated = [...typed].every((each) => each === key);
    const from = this.#rows.kept + (isRepeated ? 1 : 0);
    const found = nextBeginning(this.#entries, isRepeated ? key : typed, from);
    this.#typed = typed;
    this.#typedAt = performance.now();
    if (found >= 0) this.#moveTo(found);
  }

  #keyTarget(key) {
    const { kept } = this.#rows;
    return {
      ArrowDown: kept + 1,
      ArrowUp: kept - 1,
      PageDown: kept + ROWS_PER_PAGE,
      PageUp: kept - ROWS_PER_PAGE,
      Home: 0,
      End: this.#entries.length - 1,
    }[key];
  }
}

function indexOf(event) {
  return Number(event.target.closest('.row').dataset.index);
}
