// Tells what has begun and ended: for a while as a notice, and to screen readers.
import { button, byId, element, icon, link, removeItem } from './dom.js';

const MOST_NOTICES = 3;
const MOST_ANNOUNCED = 10;
const STAY_MS = 8000;

const container = byId('notices');
const announcer = byId('announcer');

// A later notice of the same key takes the place of the earlier. What it tells of is at the other end
// of a link, if there is a function that goes there. A failure stays until it is closed.
export function notify(key, text, { isFailure = false, go } = {}) {
  announce(text);
  const notice = element('div', { class: isFailure ? 'toast failure' : 'toast', 'data-key': key });
  const close = () => removeItem(notice, byId('files'));
  notice.append(
    element('p', {}, go ? link(text, go) : text),
    button(icon('close'), { class: 'quiet', 'aria-label': 'Close the notice' }, close));
  [...container.children].find((each) => each.dataset.key === key)?.remove();
  container.append(notice);
  while (container.children.length > MOST_NOTICES) container.firstElementChild.remove();
  if (!isFailure) leaveLater(notice);
}

// Not while somebody is at it, or nobody sees it.
function leaveLater(notice) {
  setTimeout(() => {
    if (document.hidden || notice.matches(':hover, :focus-within')) leaveLater(notice);
    else notice.remove();
  }, STAY_MS);
}

export function clearNotices() {
  container.replaceChildren();
  announcer.replaceChildren();
}

export function announce(text) {
  if (announcer.lastElementChild?.textContent === text) return;
  announcer.append(element('p', {}, text));
  if (announcer.children.length > MOST_ANNOUNCED) announcer.firstElementChild.remove();
}
