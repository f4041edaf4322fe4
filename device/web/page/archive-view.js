// Looks inside an archive: what the device's archiver says is in it.
import { Refusal, downloadUrl, listArchive } from './api.js';
import { byId, cutNameElement, element, icon, nameElement } from './dom.js';
import { counted, sizeText } from './format.js';
import { shown } from './names.js';
import { byName } from './order.js';
import { Rows } from './rows.js';

const dialog = byId('archive-view');
const facts = byId('archive-facts');
const list = byId('archive-entries');
const rows = new Rows(list, makeRow);
let entries = [];
let asked = new AbortController();

export async function lookInside(path) {
  const { signal } = asked = new AbortController();
  byId('archive-title').replaceChildren(nameElement(path));
  byId('archive-download').href = downloadUrl(path);
  facts.textContent = 'Reading…';
  dialog.showModal();
  try {
    const archive = await listArchive(path, signal);
    if (signal.aborted) return;
    entries = archive.entries.sort(byName);
    facts.textContent = archiveText(archive);
    rows.fill(entries.length);
  } catch (refusal) {
    if (!(refusal instanceof Refusal)) throw refusal;
    if (!signal.aborted) facts.textContent = `It cannot be read: ${refusal.message}.`;
  }
}

export function archiveText({ format, count, size, complete, encrypted }) {
  return [
    `${format}, ${complete ? '' : 'more than '}${counted(count, 'entry', 'entries')}, ${sizeText(size)} unpacked`,
    encrypted && 'protected by a password',
  ].filter(Boolean).join(', ');
}

function makeRow(index) {
  const { name, kind, size } = entries[index];
  return element('li', { class: 'row', 'aria-setsize': entries.length, 'aria-posinset': index + 1 },
    element('div', { class: 'cell-name', title: shown(name) }, icon(kind), cutNameElement(name)),
    element('div', { class: 'cell-size' }, kind === 'file' ? sizeText(size) : ''));
}

dialog.addEventListener('close', () => {
  asked.abort();
  entries = [];
  rows.fill(0);
  byId('archive-title').replaceChildren();
});
byId('close-archive').addEventListener('click', () => dialog.close());
