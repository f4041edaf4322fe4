// The tray: paths collected from any folders, in the order in which they were put in.
import { button, byId, element, icon, nameElement, removeItem } from './dom.js';
import { counted } from './format.js';
import { shown } from './names.js';
import { TreeSize } from './tree-size.js';

const MOST_LISTED = 200;

export class Tray {
  #list = byId('tray');
  #details = byId('tray-details');
  #title = byId('tray-title');
  #clear = byId('clear-tray');
  #size = new TreeSize(byId('tray-size'));
  #paths = new Set();
  #onChange;

  constructor({ onChange }) {
    this.#onChange = onChange;
    this.#clear.addEventListener('click', () => {
      this.clear();
      this.#title.focus();
    });
    this.#details.addEventListener('toggle', () => this.#drawList());
  }

  get paths() {
    return [...this.#paths];
  }

  add(paths) {
    paths.forEach((path) => this.#paths.add(path));
    this.#drawList();
    this.#changed();
  }

  clear() {
    this.#paths.clear();
    this.#details.open = false;
    this.#drawList();
    this.#changed();
  }

  #drawList() {
    const paths = this.#details.open ? this.paths : [];
    this.#list.replaceChildren(...paths.slice(0, MOST_LISTED).map((path) => this.#makeItem(path)));
    if (paths.length > MOST_LISTED) this.#list.append(element('li', {}, `and ${counted(paths.length - MOST_LISTED, 'more item')}`));
  }

  #makeItem(path) {
    const item = element('li', {}, nameElement(path),
      button(icon('close'), { class: 'quiet', 'aria-label': `Remove ${shown(path)} from the tray` }, () => {
        this.#paths.delete(path);
        removeItem(item, this.#title);
        this.#changed();
      }));
    return item;
  }

  #changed() {
    byId('tray-count').textContent = counted(this.#paths.size, 'item');
    this.#size.ask(this.paths);
    this.#details.hidden = this.#clear.hidden = this.#paths.size === 0;
    byId('tray-empty').hidden = this.#paths.size > 0;
    this.#onChange();
  }
}
