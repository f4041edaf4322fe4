// Names and paths. A name is bytes: a byte that is no UTF-8 is a lone surrogate here (U+DCFF is the
// byte 0xFF), so that every name goes back to the device as it came.

export const ROOT = '/';

const ESCAPE_BASE = 0xdc00;
const FIRST_ESCAPE = 0xdc80;
const LAST_ESCAPE = 0xdcff;
const REPLACEMENT = '\ufffd';
const CONTROL_PICTURES = 0x2400;
const DELETE_PICTURE = '\u2421';

const UNSHOWN = /[\u0000-\u001f\u007f-\u009f\u061c\u200e\u200f\u2028-\u202e\u2066-\u2069\ud800-\udfff]/gu;
// What may be one character in UTF-8, or else a byte, percent-encoded.
const SEQUENCE =
  /%[cd][0-9a-f]%[89ab][0-9a-f]|%e[0-9a-f](?:%[89ab][0-9a-f]){2}|%f[0-7](?:%[89ab][0-9a-f]){3}|%[0-9a-f]{2}/gi;
const UNPROPOSED = new RegExp(UNSHOWN.source + '|/', 'gu');

export function join(folder, name) {
  return (folder === ROOT ? '' : folder) + '/' + name;
}

export function parentOf(path) {
  return path.slice(0, path.lastIndexOf('/')) || ROOT;
}

export function lastName(path) {
  return path.slice(path.lastIndexOf('/') + 1);
}

// The name of the shared folder.
export function shareOf(path) {
  return path.split('/')[1];
}

// The archive's format by its ending, '' for any other file.
export function formatOf(name) {
  return /\.(zip|7z)$/i.exec(name)?.[1].toLowerCase() ?? '';
}

// What a reader sees: nothing in a name may break the line, turn its direction or stay invisible.
export function shown(name) {
  return name.replace(UNSHOWN, (char) => {
    const code = char.codePointAt(0);
    if (code < 0x20) return String.fromCharCode(CONTROL_PICTURES + code);
    if (code === 0x7f) return DELETE_PICTURE;
    if (code < 0xa0 || code >= 0xd800) return REPLACEMENT;
    return `⟨U+${code.toString(16).toUpperCase().padStart(4, '0')}⟩`;
  });
}

// A new name made from an old one, of characters that can be typed.
export function typeable(name) {
  return name.replace(UNPROPOSED, '_');
}

export function byteLength(name) {
  return new TextEncoder().encode(name).length;
}

// For a URL: encodeURIComponent throws at a lone surrogate, and slashes are to stay readable.
export function encodePath(path) {
  return path.replace(/[^A-Za-z0-9\-._~/]/gu, (char) => {
    const code = char.codePointAt(0);
    if (code >= FIRST_ESCAPE && code <= LAST_ESCAPE) {
      return '%' + (code - ESCAPE_BASE).toString(16).toUpperCase();
    }
    return encodeURIComponent(char.isWellFormed() ? char : REPLACEMENT);
  });
}

export function decodePath(encoded) {
  return encoded.replace(SEQUENCE, (sequence) => {
    try {
      return decodeURIComponent(sequence);
    } catch {
      return sequence.replace(/%(..)/g, (byte, hex) => String.fromCharCode(ESCAPE_BASE + parseInt(hex, 16)));
    }
  });
}

// A JSON array as the text of a parameter. Not JSON.stringify: a lone surrogate is left for the
// request's own JSON to escape, so that it reaches the device's inner text as the byte it stands for.
export function pathList(paths) {
  const quoted = paths.map(
    (path) => '"' + path.replace(/["\\\u0000-\u001f]/g, (char) => JSON.stringify(char).slice(1, -1)) + '"');
  return '[' + quoted.join(',') + ']';
}
