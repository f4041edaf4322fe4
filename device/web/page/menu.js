// A menu at a place of the page: for a right click, the menu key, a long touch and the button for it.
import { button, byId } from './dom.js';

const EDGE = 8;

const root = byId('menu');

// Items are pairs of a label and a function; `at` has left and bottom, or clientX and clientY.
export function openMenu(items, at) {
  root.replaceChildren(...items.map(([label, run]) =>
    button(label, { role: 'menuitem', tabindex: '-1' }, () => {
      root.hidePopover();
      run();
    })));
  root.showPopover();
  const left = at.clientX ?? at.left;
  const top = at.clientY ?? at.bottom;
  root.style.left = `${Math.max(EDGE, Math.min(left, innerWidth - root.offsetWidth - EDGE))}px`;
  root.style.top = `${Math.max(EDGE, Math.min(top, innerHeight - root.offsetHeight - EDGE))}px`;
  root.firstElementChild.focus();
}

root.addEventListener('keydown', (event) => {
  const items = [...root.children];
  const at = items.indexOf(document.activeElement);
  const next = {
    ArrowDown: at + 1,
    ArrowUp: at + items.length - 1,
    Home: 0,
    End: items.length - 1,
  }[event.key] ?? items.findIndex((item) => event.key.toLowerCase() === item.textContent[0].toLowerCase());
  if (event.key === 'Tab') root.hidePopover();
  else if (next >= 0) items[next % items.length].focus();
  if (event.key === 'Tab' || next >= 0) event.preventDefault();
});
