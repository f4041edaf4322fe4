// Making elements. Text goes in as text nodes alone, so that a name is never markup.
import { shown } from './names.js';

const SVG = 'http://www.w3.org/2000/svg';

const ICONS = {
  folder: 'M3 6.5A1.5 1.5 0 0 1 4.5 5h4l2 2.5h9A1.5 1.5 0 0 1 21 9v8.5a1.5 1.5 0 0 1-1.5 1.5h-15A1.5 1.5 0 0 1 3 17.5z',
  file: 'M6 3h8l5 5v11.5a1.5 1.5 0 0 1-1.5 1.5h-11A1.5 1.5 0 0 1 5 19.5v-15A1.5 1.5 0 0 1 6.5 3zM14 3v5h5',
  link:
    'M10 14a4 4 0 0 0 5.7 0l3.1-3.1a4 4 0 0 0-5.7-5.7L12 6.3M14 10a4 4 0 0 0-5.7 0l-3.1 3.1a4 4 0 0 0 5.7 5.7L12 17.7',
  other: 'M12 3l8 4.5v9L12 21l-8-4.5v-9zM12 12l8-4.5M12 12v9M12 12L4 7.5',
  refresh: 'M20 5v5h-5M4 19v-5h5M19.5 10A8 8 0 0 0 5.6 7.6M4.5 14a8 8 0 0 0 13.9 2.4',
  close: 'M6 6l12 12M18 6L6 18',
};
const END_SIGNS = 10;

const segmenter = new Intl.Segmenter();

export const byId = (id) => document.getElementById(id);

// Attributes that are undefined or false are left out.
export function element(tag, attributes = {}, ...children) {
  const made = document.createElement(tag);
  for (const [name, value] of Object.entries(attributes)) {
    if (value !== undefined && value !== false) made.setAttribute(name, value === true ? '' : value);
  }
  made.append(...children);
  return made;
}

export function icon(name) {
  const svg = document.createElementNS(SVG, 'svg');
  svg.setAttribute('viewBox', '0 0 24 24');
  svg.setAttribute('aria-hidden', 'true');
  svg.setAttribute('class', `icon icon-${name}`);
  const path = document.createElementNS(SVG, 'path');
  path.setAttribute('d', ICONS[name]);
  svg.append(path);
  return svg;
}

// A name or path from the device, apart from the direction of the text around it. It can break after
// what parts its words.
export function nameElement(name) {
  const made = element('bdi', { class: 'name' });
  for (const part of shown(name).split(/(?<=[/._\-])/u)) made.append(part, element('wbr'));
  return made;
}

// A name on one line, which is cut in the middle when there is no room: its ending tells what it is.
export function cutNameElement(name) {
  const text = shown(name);
  const signs = [...segmenter.segment(text)];
  const at = signs.length > 2 * END_SIGNS ? signs.at(-END_SIGNS).index : text.length;
  return element('bdi', { class: 'name cut' }, element('span', {}, text.slice(0, at)), element('span', {}, text.slice(at)));
}

export function button(label, attributes, onClick) {
  const made = element('button', { type: 'button', ...attributes }, label);
  made.addEventListener('click', onClick);
  return made;
}

// A link to a place in the page, which a function goes to.
export function link(label, onClick) {
  const made = element('a', { href: location.hash || '#' }, label);
  made.addEventListener('click', (event) => {
    event.preventDefault();
    onClick();
  });
  return made;
}

// Shows a text, or hides the element when there is none.
export function setText(target, text) {
  target.textContent = text;
  target.hidden = text === '';
}

// Takes an item off its list without losing the focus that was in it.
export function removeItem(item, heading) {
  const hadFocus = item.contains(document.activeElement);
  const neighbour = item.nextElementSibling ?? item.previousElementSibling;
  item.remove();
  if (hadFocus) (neighbour?.querySelector('button') ?? heading).focus();
}
