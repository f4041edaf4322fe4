// What one client may ask of the device over HTTP.
import assert from 'node:assert/strict';
import { once } from 'node:events';
import { readFileSync } from 'node:fs';
import net from 'node:net';
import { after, before, test } from 'node:test';

import { Client, Device, isRoot, program, until } from './device.mjs';

// The sanitizers' own memory leaves no room for a limit.
const isSanitized = readFileSync(program).includes('__asan_init') && 'sanitized';
const skip = !isRoot && 'it takes root';
const json = { 'Content-Type': 'application/json' };
let device;
let alice;

before(async () => {
  device = await Device.start();
  alice = await Client.signIn(device, 'alice');
});
after(() => device.remove());

test('what takes too much memory is refused, and leaves nothing', { skip: isSanitized }, async () => {
  const request = (params) => JSON.stringify({ api: 'KAVO.Zantro.Compress', version: 3,
    method: 'start', params: { path: '["/photo/cat.jpg"]', dest_file_path: '["/photo/o.zip"]', ...params } });
  const length = 8300000;
  const zeros = `[${'0,'.repeat(length / 2)}0]`;
  const keys = Array.from({ length: 600000 }, (_, index) => `"${index.toString(36)}":0`);
  for (const [name, body, headers = json] of [
    ['values', zeros], ['values in a text', request({ path: zeros })],
    ['members', `{${keys}}`], ['an array of arrays', `[${'[],'.repeat(length / 3)}0]`],
    ['long texts', request({ path: Array(90000).fill('x'.repeat(80)) })],
    ['pieces', request({ path: 'a,'.repeat(length / 2) })],
    ['fields', keys.join('=&'), { 'Content-Type': 'application/x-www-form-urlencoded' }],
    // Written as escapes into the task, when there is a worker.
    ['control characters', request({ password: '\x01' }).replace('\\u0001', '\x01'.repeat(length))],
  ]) {
    const { status, text } = await alice.ask('/webapi', { method: 'POST', body, headers });
    assert.deepEqual([status, text], [413, '{"error":"the request takes too much memory"}\n'], name);
  }
  await until(() => device.processes('worker', 'request').length === 0);
  const sources = Array.from({ length: 100000 }, (_, index) => `/none/${'x'.repeat(48)}${1e5 + index}`);
  const started = await Promise.all([1, 2].map(() => alice.start(sources, '/photo/many.zip')));
  await Promise.all(started.map((taskid) => alice.taskIn('failed', taskid)));
  for (const { pid } of device.processes('launcher', 'front end')) {
    const [, peak] = readFileSync(`/proc/${pid}/status`, 'utf8').match(/VmHWM:\s*(\d+) kB/);
    assert.ok(peak < 64 << 10, `${peak} kB`);
  }
});

// Connections that have sent this, and then send a byte again and again.
async function crawl(t, count, head, localAddress = '127.0.0.1') {
  const { port } = new URL(device.url);
  const sockets = Array.from({ length: count },
    () => net.connect({ port, host: '127.0.0.1', localAddress }).on('error', () => {}).resume());
  await Promise.all(sockets.map((socket) => once(socket, 'connect')));
  sockets.forEach((socket) => socket.write(head));
  const crawling = setInterval(() => sockets.forEach((socket) => socket.write(' ')), 1000);
  const close = () => { clearInterval(crawling); sockets.forEach((socket) => socket.destroy()); };
  t.after(close);
  return { areOpen: () => sockets.filter(({ closed }) => !closed).length, close };
}

test('one user holds up nobody else', async (t) => {
  const bodies = await crawl(t, 8, `POST /webapi HTTP/1.1\r\nHost: ${new URL(device.url).host}\r\n` +
    `Cookie: ${alice.cookie}\r\nContent-Length: 999\r\n\r\n{`);
  await until(() => device.processes('request').length === 8);
  const bob = await Client.signIn(device, 'bob');
  const statuses = [];
  const waiting = Array.from({ length: 130 }, async () => {
    statuses.push((await alice.ask('/tasks')).status);
  });
  await until(() => statuses.length === 2);
  assert.equal((await bob.ask('/tasks')).status, 200);
  assert.deepEqual(statuses, [429, 429]);
  bodies.close();
  await Promise.all(waiting);
  assert.deepEqual(statuses.slice(2), Array(128).fill(200));
});

test('slow clients make room, and have so long in all', { skip }, async (t) => {
  const crowd = [];
  for (let last = 1; last <= 5; ++last) {
    crowd.push(await crawl(t, 1000, last % 2 ? 'GET / HTTP/1.1\r\nX: ' :
      'POST /session HTTP/1.1\r\nContent-Length: 999\r\n\r\n{', `127.0.0.${last}`));
  }
  assert.equal((await alice.ask('/tasks', { signal: AbortSignal.timeout(10000) })).status, 200);
  await until(() => crowd[0].areOpen() < 1000);
  assert.equal(crowd[4].areOpen(), 1000);
  const one = await crawl(t, 1500, 'GET / HTTP/1.1\r\nX: ', '127.0.0.6');
  await until(() => one.areOpen() <= 1024);
  await until(() => one.areOpen() + crowd[4].areOpen() === 0);
});
