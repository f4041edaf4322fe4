// The folder on show: what the location names, its breadcrumb, its entries or why there are none.
import { Refusal, listFolder } from './api.js';
import { byId, element, nameElement, setText } from './dom.js';
import { FileGrid } from './grid.js';
import { ROOT, decodePath, encodePath, join, lastName, parentOf, shown } from './names.js';

const ROOT_TITLE = 'Shared folders';
const PAGE_TITLE = 'Files';
const FORBIDDEN = 403;

const HASH = '#';

export class Files {
  #main = byId('files');
  #state = byId('folder-state');
  #up = byId('up');
  #grid;
  #path = '';
  #wanted = ROOT;
  #writable = false;
  #request = 0;

  constructor({ onSelect }) {
    this.#grid = new FileGrid({ onOpen: (name) => this.#go(join(this.#path, name)), onSelect });
    this.#up.addEventListener('click', () => this.#goUp());
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

  get isWritable() {
    return this.#writable;
  }

  get selectedPaths() {
    return this.#grid.selectedEntries.map((entry) => join(this.#path, entry.name));
  }

  clearSelection() {
    this.#grid.clearSelection();
  }

  // Leaves nothing on show, for the next user.
  clear() {
    this.#request += 1;
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
    if (await this.#list() && document.activeElement === document.body) this.focus();
  }

  // Lists the folder as it is now.
  async reload() {
    await this.#list();
  }

  // False when a later request has overtaken this one.
  async #list() {
    const request = ++this.#request;
    this.#main.setAttribute('aria-busy', 'true');
    const listing = await listFolder(this.#wanted).catch((refusal) => {
      if (refusal instanceof Refusal) return { entries: [], refusal };
      throw refusal;
    });
    if (request !== this.#request) return false;
    this.#main.removeAttribute('aria-busy');
    this.#show(listing);
    return true;
  }

  #show({ entries, writable = false, refusal }) {
    const left = this.#path;
    this.#path = this.#wanted;
    this.#writable = writable;
    this.#drawPath();
    const label = `Contents of ${this.#title()}`;
    if (left === this.#path) this.#grid.update(label, entries);
    else this.#grid.show(label, entries, parentOf(left) === this.#path ? lastName(left) : '');
    this.#drawState(entries.length, refusal);
  }

  #go(path) {
    location.hash = HASH + encodePath(path);
  }

  #goUp() {
    if (this.#path.length > ROOT.length) this.#go(parentOf(this.#path));
  }

  #title() {
    return this.#path === ROOT ? ROOT_TITLE : shown(lastName(this.#path));
  }

  #drawPath() {
    const title = this.#title();
    document.title = `${title} – ${PAGE_TITLE}`;
    byId('folder-title').replaceChildren(element('bdi', {}, title));
    this.#up.disabled = this.#path === ROOT;
    const steps = [ROOT];
    for (const part of this.#path.split('/').filter(Boolean)) steps.push(join(steps.at(-1), part));
    byId('breadcrumb').replaceChildren(...steps.map((step) => element('li', {}, element('a', {
      href: HASH + encodePath(step),
      'aria-current': step === this.#path && 'page',
    }, step === ROOT ? ROOT_TITLE : nameElement(lastName(step))))));
  }

  #drawState(count, refusal) {
    this.#state.hidden = count > 0;
    if (count > 0) return;
    const heading = refusal ? 'This folder cannot be shown' : 'This folder is empty';
    const words = element('p', {});
    setText(words, refusal ? this.#reason(refusal) : '');
    this.#state.replaceChildren(element('h2', {}, heading), words);
  }

  #reason(refusal) {
    return refusal.status === FORBIDDEN ? `You may not list it: ${refusal.message}.` : `${refusal.message}.`;
  }
}
