// The stream of events of one user. One that breaks is asked for again, unless the session has ended.
import { currentSession } from './api.js';

const RETRY_MS = 1500;
const KINDS = ['task', 'gone', 'notification'];

export class Stream {
  #tell;
  #source = null;
  #retry = 0;
  #user = '';

  // Tells a kind of event and its data: those of the device, "connected" (whether the stream stands)
  // and "sessionEnd".
  constructor(tell) {
    this.#tell = tell;
  }

  // Whose it is, '' while it is closed.
  get user() {
    return this.#user;
  }

  get stands() {
    return this.#source?.readyState === EventSource.OPEN;
  }

  open(user) {
    this.close();
    this.#user = user;
    const source = new EventSource('/events');
    this.#source = source;
    source.addEventListener('open', () => this.#tell('connected', true));
    source.addEventListener('error', () => this.#broken(source));
    for (const kind of KINDS) {
      source.addEventListener(kind, (event) => this.#tell(kind, JSON.parse(event.data)));
    }
  }

  close() {
    clearTimeout(this.#retry);
    this.#source?.close();
    this.#source = null;
    this.#user = '';
  }

  // Another user's session is the end of this one too.
  async #broken(source) {
    source.close();
    this.#tell('connected', false);
    const session = await currentSession().catch(() => undefined);
    if (this.#source !== source) return;
    if (session === undefined || session?.user === this.#user) {
      this.#retry = setTimeout(() => this.open(this.#user), RETRY_MS);
    } else {
      this.close();
      this.#tell('sessionEnd');
    }
  }
}
