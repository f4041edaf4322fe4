// Sizes, dates, counts and durations in words.

const LOCALE = 'en';
const UNIT = 1024;
const UNITS = ['bytes', 'KB', 'MB', 'GB', 'TB', 'PB'];
const MINUTE = 60;
const HOUR = 60 * MINUTE;
const SECONDS_STEP = 5;
const ROUNDING = 1e-6;

const dateFormat = new Intl.DateTimeFormat(LOCALE, {
  year: 'numeric', month: 'short', day: 'numeric', hour: '2-digit', minute: '2-digit', hourCycle: 'h23',
});
const timeFormat = new Intl.DateTimeFormat(LOCALE, { hour: '2-digit', minute: '2-digit', hourCycle: 'h23' });
const wholeFormat = new Intl.NumberFormat(LOCALE, { maximumFractionDigits: 0 });
const decimalFormat = new Intl.NumberFormat(LOCALE, { maximumFractionDigits: 1 });

export function sizeText(bytes) {
  let size = bytes;
  let unit = 0;
  while (size >= UNIT && unit < UNITS.length - 1) {
    size /= UNIT;
    unit += 1;
  }
  if (unit === 0) return counted(bytes, 'byte');
  return `${(size < 10 ? decimalFormat : wholeFormat).format(size)} ${UNITS[unit]}`;
}

export function dateText(seconds) {
  return dateFormat.format(new Date(seconds * 1000));
}

// The time alone, of today.
export function momentText(seconds) {
  const date = new Date(seconds * 1000);
  const isToday = date.toDateString() === new Date().toDateString();
  return isToday ? timeFormat.format(date) : dateFormat.format(date);
}

export function counted(count, noun, nouns = `${noun}s`) {
  return `${wholeFormat.format(count)} ${count === 1 ? noun : nouns}`;
}

// Whole per cents that are done. What is not a binary fraction may lie a little below.
export function percentText(progress) {
  return `${Math.floor(progress * 100 + ROUNDING)}%`;
}

export function treeText({ files, folders, bytes, complete }) {
  const parts = [folders > 0 && counted(folders, 'folder'), counted(files, 'file'), sizeText(bytes)];
  return `${complete ? '' : 'more than '}${parts.filter(Boolean).join(', ')}`;
}

export function timeLeftText(seconds) {
  if (seconds < MINUTE) {
    return `about ${Math.max(1, Math.ceil(seconds / SECONDS_STEP)) * SECONDS_STEP} s left`;
  }
  if (seconds < HOUR) return `about ${Math.round(seconds / MINUTE)} min left`;
  const minutes = Math.round(seconds / MINUTE);
  return `about ${Math.floor(minutes / 60)} h ${minutes % 60} min left`;
}
