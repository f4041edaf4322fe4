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
  const bytes = [];
  for (let at = 0; at < encoded.length; ++at) {
    const hex = encoded[at] === '%' && /^[0-9a-f]{2}$/i.test(encoded.slice(at + 1, at + 3));
    bytes.push(hex ? parseInt(encoded.slice(at + 1, at + 3), 16) : encoded.charCodeAt(at));
    at += hex ? 2 : 0;
  }
  return decodeBytes(bytes);
}

function decodeBytes(bytes) {
  const decoder = new TextDecoder('utf-8', { fatal: true, ignoreBOM: true });
  let text = '';
  for (let at = 0; at < bytes.length;) {
    const length = sequenceLength(bytes[at]);
    try {
      text += decoder.decode(Uint8Array.from(bytes.slice(at, at + length)));
      at += length;
    } catch {
      text += String.fromCharCode(ESCAPE_BASE + bytes[at]);
      at += 1;
    }
  }
  return text;
}

function sequenceLength(lead) {
  if (lead < 0x80) return 1;
  if (lead < 0xe0) return 2;
  return lead < 0xf0 ? 3 : 4;
}

// A JSON array as the text of a parameter. Not JSON.stringify: a lone surrogate is left for the
// request's own JSON to escape, so that it reaches the device's inner text as the byte it stands for.
export function pathList(paths) {
  const quoted = paths.map(
    (path) => '"' + path.replace(/["\\\u0000-\u001f]/g, (char) => JSON.stringify(char).slice(1, -1)) + '"');
  return '[' + quoted.join(',') + ']';
}
