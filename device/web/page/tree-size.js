// How much is in what is selected: counted on the device, for as long as somebody wants to know.
import { countTree } from './api.js';
import { treeText } from './format.js';

export class TreeSize {
  #target;
  #asked = new AbortController();

  constructor(target) {
    this.#target = target;
  }

  async ask(paths) {
    this.stop();
    if (paths.length === 0) return;
    const { signal } = this.#asked = new AbortController();
    this.#target.textContent = 'Counting…';
    const text = await countTree(paths, signal).then(treeText, () => '');
    if (!signal.aborted) this.#target.textContent = text;
  }

  stop() {
    this.#asked.abort();
    this.#target.textContent = '';
  }
}
