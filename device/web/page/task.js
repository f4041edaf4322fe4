// One task of the panel: its destination, how far it has got, and what came of it.
import { Refusal, stopTask, taskStatus, wordsOf } from './api.js';
import { button, element, nameElement, setText } from './dom.js';
import { percentText, sizeText, timeLeftText } from './format.js';
import { shown } from './names.js';

const RATE_WINDOW_MS = 20_000;
const RATE_LEAST_MS = 1500;
const NO_SUCH_TASK = 599;

const STATE_WORDS = { finished: 'Done', failed: 'Failed' };

export class TaskItem {
  #task;
  #samples = [];
  #bar = element('progress', { max: '1' });
  #percent = element('span', { class: 'percent' });
  #meta = element('p', { class: 'meta' });
  #errors = element('ul', { class: 'task-errors', role: 'list' });
  #refusal = element('p', { class: 'alert', role: 'alert', hidden: true });
  #button;

  // onGone is told when the device has no such task any more.
  constructor(task, onGone) {
    this.#task = task;
    const path = shown(task.dest_file_path);
    this.#bar.setAttribute('aria-label', `Progress of ${path}`);
    this.#errors.setAttribute('aria-label', `Errors of ${path}`);
    this.#button = button('', {}, () => this.#end(onGone));
    this.element = element('li', { class: 'task' },
      element('div', { class: 'task-head' }, nameElement(task.dest_file_path), this.#button),
      element('div', { class: 'task-progress' }, this.#bar, this.#percent),
      this.#meta, this.#errors, this.#refusal);
  }

  get taskid() {
    return this.#task.taskid;
  }

  get destination() {
    return this.#task.dest_file_path;
  }

  get isRunning() {
    return this.#task.state === 'running';
  }

  get isFailed() {
    return this.#task.state === 'failed';
  }

  update(task) {
    this.#task = task;
    this.element.dataset.state = task.state;
    this.#bar.value = task.progress;
    this.#bar.hidden = !this.isRunning;
    this.#percent.textContent = STATE_WORDS[task.state] ?? percentText(task.progress);
    const action = this.isRunning ? 'Stop' : 'Dismiss';
    this.#button.textContent = action;
    this.#button.setAttribute('aria-label', `${action} ${shown(task.dest_file_path)}`);
    const size = task.total_size > 0 ? sizeText(task.total_size) : '';
    setText(this.#meta, [size, this.#timeLeft()].filter(Boolean).join(' · '));
    this.#drawErrors();
  }

  // From the pace of the last moments, as the pace differs from file to file.
  #timeLeft() {
    if (!this.isRunning) return '';
    const now = performance.now();
    const { progress } = this.#task;
    this.#samples.push({ now, progress });
    while (now - this.#samples[0].now > RATE_WINDOW_MS && this.#samples.length > 2) this.#samples.shift();
    const [first] = this.#samples;
    const elapsed = now - first.now;
    const gained = progress - first.progress;
    if (elapsed < RATE_LEAST_MS || gained <= 0) return '';
    return timeLeftText((elapsed / gained) * (1 - progress) / 1000);
  }

  async #drawErrors() {
    const errors = this.isFailed ? this.#task.errors ?? [] : [];
    const lines = await Promise.all(errors.map(async ({ path, code }) => element('li', {},
      nameElement(path), ` – ${await wordsOf(code).catch(() => `error ${code}`)}`)));
    this.#errors.replaceChildren(...lines);
    this.#errors.hidden = lines.length === 0;
  }

  // A running task is stopped; the report of an ended one removes it from the device.
  async #end(onGone) {
    try {
      await (this.isRunning ? stopTask(this.taskid) : taskStatus(this.taskid));
    } catch (refusal) {
      if (!(refusal instanceof Refusal)) throw refusal;
      if (refusal.code !== NO_SUCH_TASK) {
        setText(this.#refusal, `That did not work: ${refusal.message}.`);
        return;
      }
    }
    onGone();
  }
}
