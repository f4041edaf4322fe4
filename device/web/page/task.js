// One task of the panel: its destination, how far it has got, and what came of it.
import { Refusal, downloadUrl, stopTask, taskStatus, wordsOf } from './api.js';
import { button, element, nameElement, setText } from './dom.js';
import { counted, momentText, percentText, sizeText, timeLeftText } from './format.js';
import { keptJob } from './keep.js';
import { shown } from './names.js';

const RATE_WINDOW_MS = 20_000;
const RATE_LEAST_MS = 1500;
const NO_SUCH_TASK = 599;

const STATE_WORDS = { waiting: 'Waiting', finished: 'Done', failed: 'Failed' };

export class TaskItem {
  task = {};
  #samples = [];
  #bar = element('progress', { max: '1' });
  #state = element('span', { class: 'state' });
  #meta = element('p', { class: 'meta' });
  #file = element('p', { class: 'meta' });
  #times = element('p', { class: 'meta' });
  #errors = element('ul', { class: 'task-errors', role: 'list' });
  #refusal = element('p', { class: 'alert', role: 'alert', hidden: true });
  #buttons = element('div', { class: 'task-buttons' });
  #on;

  // Handlers: gone is told when the device has no such task any more, and whether it was stopped; show
  // and look get the archive's path; retry what the job was started with.
  constructor(task, handlers) {
    this.#on = handlers;
    const path = shown(task.dest_file_path);
    this.#bar.setAttribute('aria-label', `Progress of ${path}`);
    this.#errors.setAttribute('aria-label', `Errors of ${path}`);
    this.element = element('li', { class: 'task', tabindex: '-1' },
      nameElement(task.dest_file_path),
      element('div', { class: 'task-progress' }, this.#bar, this.#state),
      this.#file, this.#meta, this.#errors, this.#times, this.#refusal, this.#buttons);
    this.update(task);
  }

  get isAtWork() {
    return ['running', 'waiting'].includes(this.task.state);
  }

  update(task) {
    const { state } = this.task;
    this.task = task;
    this.element.dataset.state = task.state;
    this.#bar.value = task.progress;
    this.#bar.hidden = !this.isAtWork;
    this.#state.textContent = STATE_WORDS[task.state] ?? percentText(task.progress);
    setText(this.#meta, this.#facts().filter(Boolean).join(' · '));
    this.#file.replaceChildren(...(task.file ? ['Packing ', nameElement(task.file)] : []));
    const times = [['Started', task.started], ['ended', task.ended]].filter(([, seconds]) => seconds);
    setText(this.#times, times.map(([word, seconds]) => `${word} ${momentText(seconds)}`).join(', '));
    if (state === task.state) return;
    this.#drawButtons();
    this.#drawErrors();
  }

  #facts() {
    const { state, before = 0, progress, total_size: total, archive_size: size } = this.task;
    if (state === 'waiting') return [before > 0 ? `${counted(before, 'job')} before it` : 'It is the next one'];
    if (state === 'finished') return [size !== undefined && `Archive of ${sizeText(size)}`, total > 0 && `${sizeText(total)} packed`];
    if (state === 'failed') return [];
    const { speed, secondsLeft } = this.#pace();
    return [
      total > 0 && `${sizeText(progress * total)} of ${sizeText(total)}`,
      speed > 0 && total > 0 && `${sizeText(speed * total)}/s`,
      speed > 0 && timeLeftText(secondsLeft),
    ];
  }

  // From the last moments, as the pace differs from file to file.
  #pace() {
    const now = performance.now();
    const { progress } = this.task;
    this.#samples.push({ now, progress });
    while (now - this.#samples[0].now > RATE_WINDOW_MS && this.#samples.length > 2) this.#samples.shift();
    const [first] = this.#samples;
    const elapsed = now - first.now;
    const speed = elapsed < RATE_LEAST_MS ? 0 : 1000 * (progress - first.progress) / elapsed;
    return { speed, secondsLeft: (1 - progress) / speed };
  }

  #drawButtons() {
    const hadFocus = this.#buttons.contains(document.activeElement);
    const { dest_file_path: path, state, taskid } = this.task;
    const make = (label, run) => button(label, { 'aria-label': `${label} ${shown(path)}` }, run);
    const job = state === 'failed' && keptJob(taskid);
    this.#buttons.replaceChildren(...(state === 'finished' ? [
      element('a', { class: 'button', href: downloadUrl(path), download: true, 'aria-label': `Download ${shown(path)}` }, 'Download'),
      make('Show in folder', () => this.#on.show(path)),
      make('Look inside', () => this.#on.look(path)),
    ] : []), ...(job ? [make('Retry', () => this.#on.retry(job))] : []),
    this.isAtWork ? make('Stop', () => this.#end(stopTask, true)) : make('Dismiss', () => this.dismiss()));
    if (hadFocus) this.#buttons.firstElementChild.focus();
  }

  // The archiver's own reason, and what the codes say of each path.
  async #drawErrors() {
    const { errors = [], reason } = this.task.state === 'failed' ? this.task : {};
    const lines = await Promise.all(errors.map(async ({ path, code }) => element('li', {},
      nameElement(path), ` – ${await wordsOf(code).catch(() => `error ${code}`)}`)));
    if (reason) lines.push(element('li', { class: 'reason' }, shown(reason)));
    this.#errors.replaceChildren(...lines);
    this.#errors.hidden = lines.length === 0;
  }

  // The report of an ended task removes it from the device.
  dismiss() {
    return this.#end(taskStatus, false);
  }

  async #end(call, isStopped) {
    try {
      await call(this.task.taskid);
    } catch (refusal) {
      if (!(refusal instanceof Refusal)) throw refusal;
      if (refusal.code !== NO_SUCH_TASK) {
        setText(this.#refusal, `That did not work: ${refusal.message}.`);
        return;
      }
    }
    this.#on.gone(isStopped);
  }
}
