// The dialog that asks how to compress, checks what can be known before, and starts the task.
import { Refusal, listCodepages, startTask } from './api.js';
import { Destination } from './destination.js';
import { byId, element, setText } from './dom.js';
import { FolderPicker } from './folder-picker.js';
import { counted } from './format.js';
import { keepFolder, keepJob, keptFolder } from './keep.js';
import { ROOT, byteLength, formatOf, join, lastName, parentOf, shareOf, shown, typeable } from './names.js';
import { TreeSize } from './tree-size.js';

const HOME = '/home';
const DEFAULT_NAME = 'archive';
const NAME_BYTES = 255;
const NAME_TOO_LONG = 1301;
const ZIP = 'zip';
const KEEP_BOTH = 'keep';
const ADD = 'add';
const TYPING_MS = 250;
const ENDING = /\.(?:zip|7z)$/i;
const OTHER_FORMAT = /\.(?:rar|tar|t?gz|t?bz2?|t?xz|zst|lzh|arj|cab|iso)$/i;
const PRINTABLE_ASCII = /^[ -~]*$/;

const dialog = byId('compress-dialog');
const form = byId('compress-form');
const { name, folder, format, level, password, codepage } = form.elements;
const generalError = byId('compress-error');

export class CompressDialog {
  #sources = [];
  #proposed = HOME;  // the folder that the field shows as long as nobody types there
  #wantsPassword = false;  // the draft had one, which is not kept
  #destination = new Destination(showPlaceError);
  #picker = new FolderPicker();
  #size = new TreeSize(byId('compress-size'));
  #onStarted;

  constructor({ onStarted }) {
    this.#onStarted = onStarted;
    form.addEventListener('submit', (event) => {
      event.preventDefault();
      this.#submit();
    });
    form.addEventListener('input', (event) => {
      showError(event.target, '');
      if (event.target === name && formatOf(name.value)) this.#setFormat(formatOf(name.value));
      if (event.target === name || event.target === folder) this.#look(TYPING_MS);
    });
    name.addEventListener('change', completeName);
    format.addEventListener('change', () => {
      name.value = `${name.value.replace(ENDING, '')}.${format.value}`;
      this.#setFormat(format.value);
      this.#look(0);
    });
    byId('browse').addEventListener('click', () => this.#picker.open(this.#folder(), (path) => {
      this.#propose(path);
      this.#look(0);
      folder.focus();
    }));
    byId('cancel-compress').addEventListener('click', () => dialog.close());
    byId('show-password').addEventListener('click', () => showPassword(password.type === 'password'));
    // A password does not stay in a form that nobody sees, and nobody waits for what is being asked.
    dialog.addEventListener('close', () => {
      form.reset();
      this.#destination.hide();
      this.#size.stop();
    });
  }

  // What is being asked, but for the password; null when nothing is.
  get draft() {
    if (!dialog.open) return null;
    return {
      sources: this.#sources,
      name: name.value,
      folder: this.#folder(),
      format: format.value,
      level: level.value,
      mode: form.elements.mode.value,
      codepage: codepage.value,
      isProtected: this.#wantsPassword || password.value !== '',
    };
  }

  // A draft need not have more than the sources and the folder, which may be null.
  open(draft, ownCodepage) {
    form.reset();
    clearErrors();
    showPassword(false);
    this.#sources = draft.sources;
    this.#propose(draft.folder ?? keptFolder() ?? HOME);
    byId('compress-title').textContent = `Compress ${counted(draft.sources.length, 'item')}`;
    level.value = draft.level ?? level.value;
    form.elements.mode.value = draft.mode ?? KEEP_BOTH;
    this.#setFormat(draft.format ?? format.value);
    name.value = draft.name ?? `${proposedName(draft.sources)}.${format.value}`;
    offerCodepages(ownCodepage, draft.codepage ?? ownCodepage);
    byId('compress-names').hidden = new Set(draft.sources.map(shareOf)).size < 2;
    this.#wantsPassword = Boolean(draft.isProtected);
    if (this.#wantsPassword) showError(password, 'The password is not kept. Type it again.');
    this.#destination.hide();
    dialog.showModal();
    (this.#wantsPassword ? password : name).focus();
    name.setSelectionRange(0, name.value.replace(ENDING, '').length);
    this.#look(0);
    this.#size.ask(this.#sources);
  }

  #propose(path) {
    this.#proposed = path;
    folder.value = shown(path);
    showError(folder, '');
  }

  #setFormat(value) {
    format.value = value;
    byId('codepage-field').hidden = value !== ZIP;
    showError(password, '');
  }

  // A proposed folder that was left as it is keeps bytes that no text field could hold.
  #folder() {
    return folder.value === shown(this.#proposed) ? this.#proposed : folder.value.replace(/(.)\/+$/, '$1');
  }

  #look(milliseconds) {
    this.#destination.hide();
    if (formatOf(name.value) && this.#folder().startsWith(ROOT)) {
      this.#destination.askLater(join(this.#folder(), name.value), milliseconds);
    }
  }

  async #submit() {
    clearErrors();
    if (form.hasAttribute('aria-busy')) return;
    completeName();
    if (!this.#isFilledIn()) return;
    form.setAttribute('aria-busy', 'true');
    try {
      await this.#start();
    } catch (refusal) {
      if (!(refusal instanceof Refusal)) throw refusal;
      showRefusal(refusal);
    } finally {
      form.removeAttribute('aria-busy');
    }
  }

  // What has come to stand there unseen is shown first.
  async #start() {
    const { isChoiceShown: wasChoiceShown, isProtected } = this.#destination;
    const draft = this.draft;
    const place = await this.#destination.ask(join(draft.folder, draft.name));
    form.querySelector('[aria-invalid]')?.focus();
    if (!dialog.open || place?.error) return;
    if (!place) {
      setText(generalError, 'The device did not say what is at this place. Try again.');
      return;
    }
    if (place.exists && !wasChoiceShown) {
      form.elements.mode.value = KEEP_BOTH;
      byId('existing').querySelector('input:enabled').focus();
      return;
    }
    const isKept = place.exists && draft.mode === KEEP_BOTH;
    if (isKept && !place.free_name) {
      showError(name, 'With a number, the name would be too long. Choose another, or what becomes of the archive.');
      name.focus();
      return;
    }
    if (place.exists && !isKept && isProtected && !password.value) {
      showError(password, 'The archive is protected: give its password.');
      password.focus();
      return;
    }
    if (isKept) draft.name = place.free_name;
    const mode = place.exists && !isKept ? draft.mode : ADD;
    const path = join(draft.folder, draft.name);
    const taskid = await startTask(draft.sources, path, {
      format: draft.format,
      level: draft.level,
      mode,
      ...(password.value && { password: password.value }),
      ...(draft.format === ZIP && draft.codepage && { codepage: draft.codepage }),
    });
    keepJob(taskid, draft);
    keepFolder(draft.folder);
    dialog.close();
    this.#onStarted(taskid, path);
  }

  #isFilledIn() {
    const stem = name.value.replace(ENDING, '');
    if (stem.trim() === '') showError(name, 'Give the archive a name.');
    else if (name.value.includes('/')) showError(name, 'A name cannot hold a slash.');
    else if (formatOf(name.value) !== format.value) showError(name, 'The name of an archive ends in .zip or .7z.');
    else if (byteLength(name.value) > NAME_BYTES) showError(name, `The name is longer than ${NAME_BYTES} bytes.`);
    if (!this.#folder().startsWith(ROOT)) {
      showError(folder, 'Give a folder from its shared folder on, such as /home.');
    }
    if (format.value === ZIP && !PRINTABLE_ASCII.test(password.value)) {
      showError(password, 'A zip takes printable ASCII only.');
    }
    if (this.#wantsPassword && !password.value) {
      showError(password, 'There was a password. Type it again, or press Compress once more to go without.');
      this.#wantsPassword = false;
    }
    const unlisted = this.#sources.map(lastName).find((each) => each.includes('\n'));
    if (unlisted) {
      setText(generalError, `"${shown(unlisted)}" has a line break in its name. Select the folder that it is in instead.`);
    }
    const invalid = form.querySelector('[aria-invalid]');
    invalid?.focus();
    return !invalid && !unlisted;
  }
}

// The ending follows the format where it is left out.
function completeName() {
  name.value = name.value.trim();
  const isOther = OTHER_FORMAT.test(name.value) || formatOf(name.value);
  if (name.value && !isOther) name.value += `.${format.value}`;
}

function proposedName(sources) {
  const [first] = sources;
  const isSingle = sources.length === 1;
  const proposed = isSingle ? lastName(first).replace(/(.)\.[^.]+$/s, '$1') : lastName(parentOf(first));
  return typeable(proposed) || DEFAULT_NAME;
}

// The user's own first.
async function offerCodepages(own, chosen) {
  const option = (value, text = value) => element('option', { value }, text);
  codepage.replaceChildren(option(own, `${own || 'UTF-8'} (your own setting)`));
  const others = await listCodepages().catch(() => []);
  codepage.append(...others.filter((value) => value !== own).map((value) => option(value || 'UTF-8')));
  codepage.value = chosen;
}

function showPassword(isVisible) {
  password.type = isVisible ? 'text' : 'password';
  byId('show-password').setAttribute('aria-pressed', String(isVisible));
}

function showPlaceError({ error, field }) {
  if (error) showError(field === 'folder' ? folder : name, `${error[0].toUpperCase()}${error.slice(1)}.`);
}

function showRefusal(refusal) {
  const words = `${refusal.message}.`;
  if (refusal.code === NAME_TOO_LONG) {
    showError(name, words);
    name.focus();
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
  for (const field of [name, folder, password]) showError(field, '');
}
