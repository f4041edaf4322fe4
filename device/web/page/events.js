// The events of the device, as one window gets them: while it is seen, out of a stream that it shares with
// the user's other windows.
import { currentSession } from './api.js';
import { Stream } from './stream.js';

const LOOK_MS = 5000;

export class Events {
  #handlers;
  #user = '';
  #look = 0;
  #stream;

  // Handlers: task, gone and notification get the event's data; connected gets whether the stream
  // stands; sessionEnd; hidden is called now and then while nobody sees the window.
  constructor(handlers) {
    this.#handlers = handlers;
    this.#stream = sharedStream((kind, data) => this.#user && handlers[kind](data));
    document.addEventListener('visibilitychange', () => this.#follow());
    window.addEventListener('online', () => this.retry());
    window.addEventListener('pagehide', () => this.#stream.close());
  }

  open(user) {
    this.#user = user;
    if (document.hidden) this.#follow();
    else this.#stream.open(user);
  }

  close() {
    this.#user = '';
    this.#follow();
  }

  retry() {
    if (this.#user && !document.hidden) this.#stream.open(this.#user, true);
  }

  // A window that comes to be seen again may be another user's by then.
  async #follow() {
    clearInterval(this.#look);
    if (!this.#user || document.hidden) {
      this.#stream.close();
      if (this.#user) this.#look = setInterval(this.#handlers.hidden, LOOK_MS);
      return;
    }
    const user = this.#user;
    const session = await currentSession().catch(() => undefined);
    if (this.#user !== user || document.hidden) return;
    if (session === null || (session && session.user !== user)) this.#handlers.sessionEnd();
    else this.#stream.open(user);
  }
}

// Without workers that windows share, each has a stream of its own.
function sharedStream(tell) {
  if (!globalThis.SharedWorker) return new Stream(tell);
  const { port } = new SharedWorker(new URL('stream-worker.js', import.meta.url), { type: 'module' });
  port.addEventListener('message', ({ data: { kind, data } }) => tell(kind, data));
  port.start();
  return {
    open: (user, isRetry) => port.postMessage({ user, isRetry }),
    close: () => port.postMessage({}),
  };
}
