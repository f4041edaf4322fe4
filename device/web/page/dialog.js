// The dialog that asks how to compress, checks what can be checked here, and starts the task.
import { Refusal, startTask } from './api.js';
import { byId, element, setText } from './dom.js';
import { counted } from './format.js';
import { ROOT, byteLength, join, lastName, parentOf, shown, typeable } from './names.js';

const HOME = '/home';
const DEFAULT_NAME = 'archive';
const NAME_BYTES = 255;
const NAME_TOO_LONG = 1301;
const ZIP = 'zip';
const ENDING = /\.(?:zip|7z)$/i;
const PRINTABLE_ASCII = /^[ -~]*$/;

const CODE_PAGES = [
  'UTF-8', 'CP437', 'CP850', 'CP852', 'CP866', 'CP874', 'CP932', 'CP936', 'CP949', 'CP950',
  'CP1250', 'CP1251', 'CP1252', 'CP1253', 'CP1254', 'ISO-8859-1', 'ISO-8859-2', 'ISO-8859-15',
];

const dialog = byId('compress-dialog');
const form = byId('compress-form');
const fields = {
  name: byId('archive-name'),
  folder: byId('archive-folder'),
  password: byId('archive-password'),
};
const format = byId('format');
const generalError = byId('compress-error');

export class CompressDialog {
  #sources = [];
  #folder = HOME;
  #isSending = false;
  #onStarted;

  constructor({ onStarted }) {
    this.#onStarted = onStarted;
    byId('codepages').append(...CODE_PAGES.map((value) => element('option', { value })));
    form.addEventListener('submit', (event) => {
      event.preventDefault();
      this.#submit();
    });
    form.addEventListener('input', (event) => showError(event.target, ''));
    format.addEventListener('change', () => this.#formatChanged());
    byId('cancel-compress').addEventListener('click', () => dialog.close());
    byId('show-password').addEventListener('click', () => showPassword(fields.password.type === 'password'));
    // A password does not stay in a form that nobody sees.
    dialog.addEventListener('close', () => form.reset());
  }

  open(sources, folder, isWritable, codepage) {
    this.#sources = sources;
    this.#folder = isWritable ? folder : HOME;
    form.reset();
    clearErrors();
    showPassword(false);
    byId('compress-title').textContent = `Compress ${counted(sources.length, 'item')}`;
    fields.name.value = `${proposedName(sources)}.${format.value}`;
    fields.folder.value = shown(this.#folder);
    byId('codepage').value = codepage;
    this.#formatChanged();
    dialog.showModal();
    fields.name.focus();
    fields.name.setSelectionRange(0, fields.name.value.replace(ENDING, '').length);
  }

  close() {
    dialog.close();
  }

  #formatChanged() {
    fields.name.value = fields.name.value.replace(ENDING, `.${format.value}`);
    byId('codepage-field').hidden = format.value !== ZIP;
    showError(fields.password, '');
  }

  async #submit() {
    clearErrors();
    if (this.#isSending || !this.#check()) return;
    this.#isSending = true;
    form.setAttribute('aria-busy', 'true');
    try {
      const taskid = await startTask(this.#sources, join(this.#destinationFolder(), fields.name.value), options());
      dialog.close();
      this.#onStarted(taskid);
    } catch (refusal) {
      if (!(refusal instanceof Refusal)) throw refusal;
      showRefusal(refusal);
    } finally {
      this.#isSending = false;
      form.removeAttribute('aria-busy');
    }
  }

  #check() {
    const name = fields.name.value;
    const password = fields.password.value;
    if (name === '') showError(fields.name, 'Give the archive a name.');
    else if (name.includes('/')) showError(fields.name, 'A name cannot hold a slash.');
    else if (name === '.' || name === '..') showError(fields.name, 'This is not a name for a file.');
    else if (byteLength(name) > NAME_BYTES) showError(fields.name, `The name is longer than ${NAME_BYTES} bytes.`);
    if (!this.#destinationFolder().startsWith(ROOT)) {
      showError(fields.folder, 'Give a folder from its shared folder on, such as /home.');
    }
    if (format.value === ZIP && !PRINTABLE_ASCII.test(password)) {
      showError(fields.password, 'A zip takes printable ASCII only.');
    }
    const invalid = Object.values(fields).find((field) => field.hasAttribute('aria-invalid'));
    invalid?.focus();
    return !invalid;
  }

  // A proposed folder that was left as it is keeps bytes that no text field could hold.
  #destinationFolder() {
    const text = fields.folder.value;
    return text === shown(this.#folder) ? this.#folder : text.replace(/(.)\/+$/, '$1');
  }
}

// Optional values that are empty are not sent: the device then takes the user's own setting.
function options() {
  const { level, mode, password, codepage } = Object.fromEntries(new FormData(form));
  const isZip = format.value === ZIP;
  return {
    format: format.value,
    level,
    mode,
    ...(password && { password }),
    ...(isZip && codepage && { codepage }),
  };
}

function proposedName(sources) {
  const [first] = sources;
  const isSingle = sources.length === 1;
  const name = isSingle ? lastName(first).replace(/(.)\.[^.]+$/s, '$1') : lastName(parentOf(first));
  return typeable(name) || DEFAULT_NAME;
}

function showPassword(isVisible) {
  fields.password.type = isVisible ? 'text' : 'password';
  byId('show-password').setAttribute('aria-pressed', String(isVisible));
}

function showRefusal(refusal) {
  const words = `${refusal.message}.`;
  if (refusal.code === NAME_TOO_LONG) {
    showError(fields.name, words);
    fields.name.focus();
  } else {
    setText(generalError, words);
  }
}

function showError(field, words) {
  const place = byId(`${field.id}-error`);
  if (!place) return;
  setText(place, words);
  if (words) field.setAttribute('aria-invalid', 'true');
  else field.removeAttribute('aria-invalid');
}

function clearErrors() {
  setText(generalError, '');
  for (const field of Object.values(fields)) showError(field, '');
}
