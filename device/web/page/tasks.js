// The task panel: every task of the user, the newest first, as the stream of events tells it.
import { listTasks } from './api.js';
import { byId, removeItem } from './dom.js';
import { percentText } from './format.js';
import { dropJobs } from './keep.js';
import { lastName, shown } from './names.js';
import { announce, notify } from './notices.js';
import { TaskItem } from './task.js';

const COMPLETED = 'filebrowser:filebrowser_compress_completed';
const FAILED = 'filebrowser:filebrowser_compress_failed';

const ENTITIES = { '&amp;': '&', '&lt;': '<', '&gt;': '>', '&quot;': '"', '&#39;': "'" };

export class Tasks {
  #list = byId('tasks');
  #clear = byId('clear-finished');
  #items = new Map();
  #expected = new Set();
  #told = new Set();  // tasks that an event told of since all were asked for
  #on;

  // Handlers: change; end gets the destination of a task that has ended just now; show and look an
  // archive's path; seen a task's element that is to come into view; retry what a job was started with.
  constructor(handlers) {
    this.#on = handlers;
    this.#clear.addEventListener('click', async () => {
      byId('tasks-title').focus();
      for (const item of this.#in('finished')) await item.dismiss();
    });
  }

  get count() {
    return this.#items.size;
  }

  // What is being packed, in words, and how far it has got; null when nothing is.
  get work() {
    const items = [...this.#in('running'), ...this.#in('waiting')];
    if (items.length === 0) return null;
    const progress = items.reduce((sum, item) => sum + item.task.progress, 0) / items.length;
    const name = items.length === 1 ? shown(lastName(items[0].task.dest_file_path)) : `${items.length} archives`;
    return { progress, name, percent: percentText(progress) };
  }

  clear() {
    this.#items.clear();
    this.#expected.clear();
    this.#list.replaceChildren();
    this.#changed();
  }

  // A task that was started here: its end is told even if no event shows it running.
  expect(taskid, destination) {
    announce(`Packing of ${shown(destination)} has started.`);
    this.#expected.add(taskid);
    const item = this.#items.get(taskid);
    if (item && !item.isAtWork) this.#tellEnd(item);
  }

  tell(task) {
    this.#told.add(task.taskid);
    this.#update(task);
  }

  tellGone({ taskid, stopped = false }) {
    this.#told.add(taskid);
    this.#remove(taskid, stopped);
  }

  // What there is now, but for what events have told meanwhile: that is newer.
  async refresh() {
    this.#told.clear();
    const tasks = await listTasks().catch(() => null);
    if (!tasks) return;
    for (const task of tasks) if (!this.#told.has(task.taskid)) this.#update(task);
    const present = new Set([...this.#told, ...tasks.map((task) => task.taskid)]);
    for (const taskid of this.#items.keys()) if (!present.has(taskid)) this.#remove(taskid, false);
    dropJobs((taskid) => !present.has(taskid) && !this.#expected.has(taskid));
  }

  tellNotification({ taskid, message, arguments: encoded }) {
    const [path] = encoded.map(decodeEntities);
    if (message === COMPLETED) this.#tellCompleted(taskid, path);
    else if (message === FAILED) this.#tellFailed(taskid, path);
    else notify(taskid, shown([message, ...encoded.map(decodeEntities)].join(' ')));
  }

  #in(state) {
    return [...this.#items.values()].filter((item) => item.task.state === state);
  }

  #update(task) {
    const known = this.#items.get(task.taskid);
    const wasAtWork = known?.isAtWork ?? false;
    const item = known ?? this.#add(task);
    if (known) item.update(task);
    if (!item.isAtWork && (wasAtWork || this.#expected.has(task.taskid))) this.#tellEnd(item);
    this.#changed();
  }

  #add(task) {
    const item = new TaskItem(task, {
      ...this.#on,
      gone: (isStopped) => this.#remove(task.taskid, isStopped),
    });
    const older = [...this.#items.values()].filter((each) => isOlder(each.task, task)).map((each) => each.element);
    this.#list.insertBefore(item.element, [...this.#list.children].find((each) => older.includes(each)) ?? null);
    this.#items.set(task.taskid, item);
    return item;
  }

  #remove(taskid, isStopped) {
    const item = this.#items.get(taskid);
    if (!item) return;
    if (isStopped) notify(taskid, `${shown(item.task.dest_file_path)} was stopped.`);
    this.#items.delete(taskid);
    this.#expected.delete(taskid);
    removeItem(item.element, byId('tasks-title'));
    this.#changed();
  }

  #tellEnd({ task: { taskid, state, dest_file_path: path } }) {
    this.#expected.delete(taskid);
    if (state === 'failed') this.#tellFailed(taskid, path);
    else this.#tellCompleted(taskid, path);
    this.#on.end(path);
  }

  #tellCompleted(taskid, path) {
    notify(taskid, `${shown(path)} is ready.`, { go: () => this.#on.show(path) });
  }

  // Its reason stands with the task.
  #tellFailed(taskid, path) {
    const go = () => this.#on.seen(this.#items.get(taskid)?.element ?? byId('tasks-title'));
    notify(taskid, `${shown(path)} could not be made.`, { isFailure: true, go });
  }

  #changed() {
    byId('tasks-empty').hidden = this.#items.size > 0;
    this.#clear.hidden = this.#in('finished').length === 0;
    this.#on.change();
  }
}

// Of the same second, the later in the queue is the newer.
function isOlder({ started, before = -1 }, than) {
  return started < than.started || (started === than.started && before <= (than.before ?? -1));
}

function decodeEntities(text) {
  return text.replace(/&(?:amp|lt|gt|quot|#39);/g, (entity) => ENTITIES[entity]);
}
