// The task panel: every task of the user, as the stream of events tells it.
import { listTasks } from './api.js';
import { byId, removeItem, setText } from './dom.js';
import { shown } from './names.js';
import { notify } from './notices.js';
import { TaskItem } from './task.js';

const COMPLETED = 'filebrowser:filebrowser_compress_completed';
const FAILED = 'filebrowser:filebrowser_compress_failed';
const CONNECTION_LOST = 'The connection is lost. Trying again…';

const ENTITIES = { '&amp;': '&', '&lt;': '<', '&gt;': '>', '&quot;': '"', '&#39;': "'" };

export class Tasks {
  #list = byId('tasks');
  #items = new Map();
  #expected = new Set();
  #onEnd;
  #onChange;

  // onEnd gets the destination of a task that has ended just now.
  constructor({ onEnd, onChange }) {
    this.#onEnd = onEnd;
    this.#onChange = onChange;
  }

  get count() {
    return this.#items.size;
  }

  clear() {
    this.#items.clear();
    this.#expected.clear();
    this.#list.replaceChildren();
    this.#changed();
  }

  // A task that was started here: its end is told even if no event shows it running.
  expect(taskid) {
    this.#expected.add(taskid);
    const item = this.#items.get(taskid);
    if (item && !item.isRunning) this.#tellEnd(item);
  }

  update(task) {
    let item = this.#items.get(task.taskid);
    const wasRunning = item?.isRunning ?? false;
    if (!item) {
      item = new TaskItem(task, () => this.remove(task.taskid));
      this.#items.set(task.taskid, item);
      this.#list.prepend(item.element);
    }
    item.update(task);
    if (!item.isRunning && (wasRunning || this.#expected.has(task.taskid))) this.#tellEnd(item);
    this.#changed();
  }

  remove(taskid) {
    const item = this.#items.get(taskid);
    if (!item) return;
    this.#items.delete(taskid);
    removeItem(item.element, byId('tasks-title'));
    this.#changed();
  }

  // The stream begins with the tasks there are; those that went while it was down are dropped.
  async connected(isConnected) {
    setText(byId('connection'), isConnected ? '' : CONNECTION_LOST);
    const known = [...this.#items.keys()];
    if (!isConnected || known.length === 0) return;
    const tasks = await listTasks().catch(() => null);
    if (!tasks) return;
    const present = new Set(tasks.map((task) => task.taskid));
    for (const taskid of known.filter((each) => !present.has(each))) this.remove(taskid);
  }

  tellNotification({ taskid, message, arguments: encoded }) {
    const [path, reason] = encoded.map(decodeEntities);
    if (message === COMPLETED) notify(taskid, completedText(path));
    else if (message === FAILED) notify(taskid, failedText(path, reason), true);
    else notify(taskid, shown([message, ...encoded.map(decodeEntities)].join(' ')));
  }

  #tellEnd(item) {
    this.#expected.delete(item.taskid);
    if (item.isFailed) notify(item.taskid, failedText(item.destination), true);
    else notify(item.taskid, completedText(item.destination));
    this.#onEnd(item.destination);
  }

  #changed() {
    byId('tasks-empty').hidden = this.#items.size > 0;
    this.#onChange();
  }
}

function completedText(path) {
  return `${shown(path)} is ready.`;
}

function failedText(path, reason) {
  return `${shown(path)} could not be made${reason ? `: ${shown(reason)}` : ''}.`;
}

function decodeEntities(text) {
  return text.replace(/&(?:amp|lt|gt|quot|#39);/g, (entity) => ENTITIES[entity]);
}
