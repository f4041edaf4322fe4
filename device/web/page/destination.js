// Whether an archive can be made at a place, and what is there already.
import { Refusal, checkDestination, listArchive } from './api.js';
import { archiveText } from './archive-view.js';
import { byId, setText } from './dom.js';
import { dateText, sizeText } from './format.js';
import { shown } from './names.js';

const existing = byId('existing');
const facts = byId('existing-facts');

export class Destination {
  #asked = new AbortController();
  #later = 0;
  #isProtected = false;
  #onAnswer;

  // onAnswer gets what the device says of the place that was asked for last.
  constructor(onAnswer) {
    this.#onAnswer = onAnswer;
  }

  get isChoiceShown() {
    return !existing.hidden;
  }

  // By a password, as far as is known of what stands there.
  get isProtected() {
    return this.#isProtected;
  }

  askLater(path, milliseconds) {
    this.stop();
    this.#later = setTimeout(() => this.ask(path), milliseconds);
  }

  // Null when the device does not say, or a later question has overtaken this one.
  async ask(path) {
    this.stop();
    const { signal } = this.#asked = new AbortController();
    try {
      const answer = await checkDestination(path, signal);
      if (signal.aborted) return null;
      this.#show(answer, path, signal);
      this.#onAnswer(answer);
      return answer;
    } catch (refusal) {
      if (!(refusal instanceof Refusal)) throw refusal;
      return null;
    }
  }

  stop() {
    clearTimeout(this.#later);
    this.#asked.abort();
  }

  hide() {
    this.stop();
    existing.hidden = true;
    this.#isProtected = false;
  }

  async #show({ exists, error, size, modified, free_name: freeName }, path, signal) {
    existing.hidden = !exists || Boolean(error);
    if (existing.hidden) return;
    existing.querySelector('input').disabled = !freeName;
    byId('free-name').textContent = freeName ? shown(freeName) : 'no name, as with a number it would be too long';
    const known = `${sizeText(size)}, changed ${dateText(modified)}`;
    setText(facts, known);
    const archive = await listArchive(path, signal).catch(({ message }) => ({ message }));
    if (signal.aborted) return;
    this.#isProtected = Boolean(archive.encrypted);
    setText(facts, `${known}; ${archive.message ? `cannot be read: ${archive.message}` : archiveText(archive)}`);
  }
}
