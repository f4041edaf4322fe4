// Holds one stream of events for all windows that are seen: a browser has six connections to an address.
import { Stream } from './stream.js';

const windows = new Set();
const stream = new Stream((kind, data) => {
  for (const port of windows) port.postMessage({ kind, data });
});

globalThis.addEventListener('connect', ({ ports: [port] }) => {
  port.addEventListener('message', ({ data: { user, isRetry } }) => {
    if (!user) {
      windows.delete(port);
      if (windows.size === 0) stream.close();
      return;
    }
    windows.add(port);
    if (stream.user !== user || isRetry) stream.open(user);
    else if (stream.stands) port.postMessage({ kind: 'connected', data: true });
  });
  port.start();
});
