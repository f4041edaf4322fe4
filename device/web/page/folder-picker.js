// Chooses a folder: a list of folders to go through by keyboard or pointer.
import { Refusal, listFolder } from './api.js';
import { byId, cutNameElement, element, icon, setText } from './dom.js';
import { ROOT, join, lastName, parentOf, shown } from './names.js';
import { isHidden, nextBeginning, sorted } from './order.js';
import { Rows } from './rows.js';

const dialog = byId('folder-picker');
const list = byId('picker-folders');
const error = byId('picker-error');
const up = byId('picker-up');
const choose = byId('choose-folder');

export class FolderPicker {
  #rows = new Rows(list, (index) => this.#makeOption(index));
  #folders = [];
  #path = ROOT;
  #asked = new AbortController();
  #onChoose = () => {};

  constructor() {
    list.addEventListener('click', (event) => this.#open(event.target.closest('[role=option]')?.dataset.index));
    list.addEventListener('keydown', (event) => this.#keyDown(event));
    up.addEventListener('click', () => this.#go(parentOf(this.#path), lastName(this.#path)));
    choose.addEventListener('click', () => {
      dialog.close();
      this.#onChoose(this.#path);
    });
    byId('cancel-picker').addEventListener('click', () => dialog.close());
    dialog.addEventListener('close', () => {
      this.#asked.abort();
      this.#fill([], '');
    });
  }

  open(path, onChoose) {
    this.#onChoose = onChoose;
    dialog.showModal();
    this.#go(path);
  }

  // A folder that is not there leads to the one above it.
  async #go(path, active = '') {
    this.#asked.abort();
    const { signal } = this.#asked = new AbortController();
    try {
      const { entries, writable } = await listFolder(path, signal);
      if (signal.aborted) return;
      this.#path = path;
      setText(error, writable ? '' : 'You cannot put an archive here. Open one of its folders.');
      choose.disabled = !writable;
      this.#fill(entries.filter((entry) => entry.kind === 'folder' && !isHidden(entry)), active);
    } catch (refusal) {
      if (!(refusal instanceof Refusal)) throw refusal;
      if (signal.aborted) return;
      if (refusal.status > 0 && path !== ROOT) this.#go(parentOf(path));
      else setText(error, `It cannot be shown: ${refusal.message}.`);
    }
  }

  #fill(folders, active) {
    this.#folders = sorted(folders, { by: 'name' });
    byId('picker-path').replaceChildren(cutNameElement(this.#path === ROOT ? 'Shared folders' : this.#path));
    up.disabled = this.#path === ROOT;
    choose.textContent = this.#path === ROOT ? 'Choose' : `Choose ${shown(lastName(this.#path))}`;
    const kept = Math.max(0, this.#folders.findIndex((folder) => folder.name === active));
    this.#rows.fill(this.#folders.length, kept);
    list.hidden = folders.length === 0;
    if (dialog.open) (this.#rows.at(kept) ?? (choose.disabled ? up : choose)).focus();
  }

  #makeOption(index) {
    return element('div', {
      role: 'option',
      class: 'row',
      'aria-label': shown(this.#folders[index].name),
      'aria-selected': String(index === this.#rows.kept),
      'aria-setsize': this.#folders.length,
      'aria-posinset': index + 1,
      tabindex: index === this.#rows.kept ? '0' : '-1',
    }, element('div', { class: 'cell-name' }, icon('folder'), cutNameElement(this.#folders[index].name)));
  }

  #open(index) {
    if (index !== undefined) this.#go(join(this.#path, this.#folders[index].name));
  }

  #keyDown(event) {
    const { kept } = this.#rows;
    const target = { ArrowDown: kept + 1, ArrowUp: kept - 1, Home: 0, End: this.#folders.length - 1 }[event.key];
    const isLetter = [...event.key].length === 1 && !event.ctrlKey && !event.metaKey && !event.altKey;
    if (target !== undefined) this.#moveTo(target);
    else if (event.key === 'Enter') this.#open(kept);
    else if (event.key === 'Backspace') up.click();
    else if (isLetter) this.#moveTo(nextBeginning(this.#folders, event.key, kept + 1));
    else return;
    event.preventDefault();
  }

  #moveTo(index) {
    if (!this.#folders[index]) return;
    const mark = (row, isIt) => {
      row.tabIndex = isIt ? 0 : -1;
      row.setAttribute('aria-selected', String(isIt));
    };
    mark(this.#rows.at(this.#rows.kept), false);
    this.#rows.kept = index;
    mark(this.#rows.at(index), true);
    this.#rows.at(index).focus();
  }
}
