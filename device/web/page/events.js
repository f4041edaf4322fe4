// The stream of events. A break is mended by the browser; a stream that was refused is asked for
// again here, unless the session has ended.
import { currentSession } from './api.js';

const RETRY_MS = 5000;
const KINDS = ['task', 'gone', 'notification'];

export class Events {
  #source = null;
  #retry = 0;
  #handlers;

  // Handlers: task, gone and notification get the event's data; connected gets whether the stream
  // stands; sessionEnd.
  constructor(handlers) {
    this.#handlers = handlers;
  }

  open() {
    this.close();
    const source = new EventSource('/events');
    this.#source = source;
    source.addEventListener('open', () => this.#handlers.connected(true));
    source.addEventListener('error', () => this.#broken(source));
    for (const kind of KINDS) {
      source.addEventListener(kind, (event) => this.#handlers[kind](JSON.parse(event.data)));
    }
  }

  close() {
    clearTimeout(this.#retry);
    this.#source?.close();
    this.#source = null;
  }

  async #broken(source) {
    this.#handlers.connected(false);
    if (source.readyState !== EventSource.CLOSED) return;
    const session = await currentSession().catch(() => undefined);
    if (this.#source !== source) return;
    if (session === null) this.#handlers.sessionEnd();
    else this.#retry = setTimeout(() => this.open(), RETRY_MS);
  }
}
