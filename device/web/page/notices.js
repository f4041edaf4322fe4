// Tells what has ended: as a toast that stays until it is closed, and to screen readers.
import { button, byId, element, icon, removeItem } from './dom.js';

const MOST_TOASTS = 3;
const MOST_ANNOUNCED = 10;

const container = byId('notices');
const announcer = byId('announcer');

// A later notice of the same key takes the place of the earlier.
export function notify(key, text, isFailure = false) {
  announce(text);
  const toast = element('div', { class: isFailure ? 'toast failure' : 'toast', 'data-key': key });
  toast.append(
    element('p', {}, text),
    button(icon('close'), { class: 'quiet', 'aria-label': 'Close the notice' },
      () => removeItem(toast, byId('files'))));
  [...container.children].find((each) => each.dataset.key === key)?.remove();
  container.append(toast);
  while (container.children.length > MOST_TOASTS) container.firstElementChild.remove();
}

export function clearNotices() {
  container.replaceChildren();
  announcer.replaceChildren();
}

function announce(text) {
  if (announcer.lastElementChild?.textContent === text) return;
  announcer.append(element('p', {}, text));
  if (announcer.children.length > MOST_ANNOUNCED) announcer.firstElementChild.remove();
}
