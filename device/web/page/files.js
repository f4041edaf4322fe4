// The folder on show: what the location names, its breadcrumb, its entries or why there are none.
import { Refusal, listFolder } from './api.js';
import { byId, element, icon, nameElement, setText } from './dom.js';
import { FileGrid } from './grid.js';
import { ROOT, decodePath, encodePath, join, lastName, parentOf, shown } from './names.js';
import { notify } from './notices.js';

const ROOT_TITLE = 'Shared folders';
const FORBIDDEN = 403;
const PATIENCE_MS = 150;

const HASH = '#';
const titleOf = (path) => (path === ROOT ? ROOT_TITLE : shown(lastName(path)));

const locationOf = (path) => HASH + encodePath(path);

export class Files {
  #main = byId('files');
  #state = byId('folder-state');
  #up = byId('up');
  #grid;
  #path = '';
  #wanted = ROOT;
  #writable = false;
  #refusal = null;
  #count = 0;
  #asked = new AbortController();
  #revealed = '';  // to be selected when the folder is there
  #onShow;

  constructor({ onOpen, onMenu, onSelect, onShow }) {
    this.#onShow = onShow;
    this.#grid = new FileGrid({
      open: (entry) => (entry.kind === 'folder' ? this.#go(join(this.#path, entry.name)) : onOpen(entry)),
      menu: onMenu,
      select: onSelect,
      view: () => this.#drawState(),
    });
    this.#up.addEventListener('click', () => this.#goUp());
    byId('refresh').append(icon('refresh'));
    byId('refresh').addEventListener('click', () => this.reload());
    this.#main.addEventListener('keydown', (event) => {
      if (event.key === 'Backspace' && !event.target.matches('input:not([type=checkbox])')) {
        event.preventDefault();
        this.#goUp();
      }
    });
  }

  get path() {
    return this.#path;
  }

  get title() {
    return titleOf(this.#path);
  }

  get isWritable() {
    return this.#writable;
  }

  get isRefused() {
    return this.#refusal !== null;
  }

  get selectedEntries() {
    return this.#grid.selectedEntries;
  }

  get selectedCount() {
    return this.#grid.selectedCount;
  }

  // A whole folder is named as one; the shared folders have no path of their own.
  get selectedPaths() {
    if (this.#grid.isAllSelected && this.#path !== ROOT) return [this.#path];
    return this.selectedEntries.map((entry) => join(this.#path, entry.name));
  }

  clearSelection() {
    this.#grid.clearSelection();
  }

  // What was selected before in the folder that is going to be shown.
  selectNames(names) {
    this.#grid.selectNames(names);
  }

  // Leaves nothing on show, for the next user.
  clear() {
    this.#asked.abort();
    this.#path = '';
    this.#grid.show('', [], '');
    this.#state.hidden = true;
  }

  focus() {
    if (this.#state.hidden) this.#grid.focus();
    else this.#state.focus();
  }

  // Shows the folder that the location names.
  async openLocation() {
    const hash = location.hash.slice(HASH.length);
    this.#wanted = hash.startsWith(ROOT) ? decodePath(hash).replace(/(.)\/+$/s, '$1') : ROOT;
    if (await this.reload() && document.activeElement === document.body) this.focus();
  }

  // Shows a file in its folder, selected and with the focus.
  async reveal(path) {
    this.#revealed = path;
    if (parentOf(path) === this.#path) await this.reload();
    else this.#go(parentOf(path));
  }

  // Lists the folder as it is now. False when a later request has overtaken this one.
  async reload() {
    this.#asked.abort();
    const asked = this.#asked = new AbortController();
    const late = setTimeout(() => this.#drawLoading(), PATIENCE_MS);
    const listing = await listFolder(this.#wanted).catch((refusal) => {
      if (refusal instanceof Refusal) return { entries: [], refusal };
      throw refusal;
    });
    clearTimeout(late);
    await new Promise((resolve) => { setTimeout(resolve); });  // reading and showing are long enough by themselves
    if (asked.signal.aborted) return false;
    this.#main.removeAttribute('aria-busy');
    this.#show(listing);
    return true;
  }

  #show({ entries, writable = false, refusal = null }) {
    const left = this.#path;
    this.#path = this.#wanted;
    this.#writable = writable;
    this.#refusal = refusal;
    this.#count = entries.length;
    this.#drawPath();
    const label = `Contents of ${this.title}`;
    if (left === this.#path) this.#grid.update(label, entries);
    else this.#grid.show(label, entries, parentOf(left) === this.#path ? lastName(left) : '');
    this.#drawState();
    this.#onShow();
    this.#showRevealed();
  }

  #showRevealed() {
    const path = this.#revealed;
    this.#revealed = '';
    if (!path || parentOf(path) !== this.#path || this.#grid.reveal(lastName(path))) return;
    notify(path, `${shown(path)} is not there any more.`, { isFailure: true });
  }

  #go(path) {
    location.hash = locationOf(path);
  }

  #goUp() {
    if (this.#path.length > ROOT.length) this.#go(parentOf(this.#path));
  }

  #drawPath() {
    byId('folder-title').replaceChildren(element('bdi', {}, this.title));
    this.#up.disabled = this.#path === ROOT;
    const steps = [ROOT];
    for (const part of this.#path.split('/').filter(Boolean)) steps.push(join(steps.at(-1), part));
    byId('breadcrumb').replaceChildren(...steps.map((step) => element('li', {}, element('a', {
      href: locationOf(step),
      'aria-current': step === this.#path && 'page',
    }, step === ROOT ? ROOT_TITLE : nameElement(lastName(step))))));
  }

  // What is on show of another folder goes when the one that is wanted takes its time.
  #drawLoading() {
    this.#main.setAttribute('aria-busy', 'true');
    if (this.#wanted === this.#path) return;
    byId('grid').hidden = true;
    this.#tell('Opening', `${titleOf(this.#wanted)}…`);
  }

  #drawState() {
    const isEmpty = this.#grid.count === 0;
    this.#state.hidden = !isEmpty;
    if (!isEmpty) return;
    if (this.#refusal) this.#tell('This folder cannot be shown', this.#reason());
    else if (this.#count > 0) this.#tell('Nothing to show', 'What is in this folder is hidden or does not match the filter.');
    else this.#tell('This folder is empty', '');
  }

  #tell(heading, text) {
    const words = element('p', {});
    setText(words, text);
    this.#state.hidden = false;
    this.#state.replaceChildren(element('h2', {}, heading), words);
  }

  #reason() {
    const { status, message } = this.#refusal;
    return status === FORBIDDEN ? `You may not list it: ${message}.` : `${message}.`;
  }
}
