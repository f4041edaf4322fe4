// The tray: paths collected from any folders, in the order in which they were put in.
import { button, byId, element, icon, nameElement, removeItem } from './dom.js';
import { shown } from './names.js';

export class Tray {
  #list = byId('tray');
  #title = byId('tray-title');
  #clear = byId('clear-tray');
  #items = new Map();
  #onChange;

  constructor({ onChange }) {
    this.#onChange = onChange;
    this.#clear.addEventListener('click', () => {
      this.clear();
      this.#title.focus();
    });
  }

  get paths() {
    return [...this.#items.keys()];
  }

  add(paths) {
    for (const path of paths.filter((each) => !this.#items.has(each))) {
      const item = element('li', {}, nameElement(path),
        button(icon('close'), { class: 'quiet', 'aria-label': `Remove ${shown(path)} from the tray` },
          () => this.#remove(path)));
      this.#items.set(path, item);
      this.#list.append(item);
    }
    this.#changed();
  }

  clear() {
    this.#items.clear();
    this.#list.replaceChildren();
    this.#changed();
  }

  #remove(path) {
    removeItem(this.#items.get(path), this.#title);
    this.#items.delete(path);
    this.#changed();
  }

  #changed() {
    this.#clear.hidden = this.#items.size === 0;
    byId('tray-empty').hidden = this.#items.size > 0;
    this.#onChange();
  }
}
