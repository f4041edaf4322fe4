// In which order a folder's entries are shown, and which of them.

const MARKS = /\p{M}+/gu;
const METADATA = '@eaDir';

const DIGITS = /\d+/g;
const MOST_DIGITS = 20;

// Numbers are made one length beforehand: comparing them as the collator does ("numeric") takes many
// times as long.
const collator = new Intl.Collator(undefined, { sensitivity: 'base' });
const sortKey = (entry) => (entry.key ??= entry.name.replace(DIGITS, (digits) => digits.padStart(MOST_DIGITS, '0')));

// As people count: file2 before file10, without regard to case and accents.
export const byName = (one, other) => collator.compare(sortKey(one), sortKey(other));

// A name as people look for it, without case and accents.
const fold = (name) => name.normalize('NFD').replace(MARKS, '').toLowerCase();

const foldedName = (entry) => (entry.folded ??= fold(entry.name));

// The device's own, which comes into no archive.
export const isMetadata = ({ name }) => name === METADATA;

export const isHidden = (entry) => entry.name.startsWith('.') || isMetadata(entry);

// By name, size or modified, folders first; equals are in the order of their names.
export function sorted(entries, { by, isDescending }) {
  const result = [...entries].sort(byName);
  const sign = isDescending ? -1 : 1;
  if (by !== 'name') result.sort((one, other) => sign * (one[by] - other[by]));
  else if (isDescending) result.reverse();
  return result.sort((one, other) => (other.kind === 'folder') - (one.kind === 'folder'));
}

export function matching(entries, filter, withHidden) {
  const wanted = fold(filter);
  return entries.filter((entry) =>
    (withHidden || !isHidden(entry)) && (!wanted || foldedName(entry).includes(wanted)));
}

// The next entry from there on that begins so, or -1.
export function nextBeginning(entries, text, from) {
  const wanted = fold(text);
  const isIt = (entry) => foldedName(entry).startsWith(wanted);
  const after = entries.findIndex((entry, index) => index >= from && isIt(entry));
  return after < 0 ? entries.findIndex(isIt) : after;
}
