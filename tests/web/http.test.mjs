// The device over HTTP: the examples of docs/webapi.md, and what must not bring it down.
import assert from 'node:assert/strict';
import { execFile, execFileSync } from 'node:child_process';
import { truncateSync, writeFileSync, chownSync, existsSync } from 'node:fs';
import net from 'node:net';
import { after, before, test } from 'node:test';
import { promisify } from 'node:util';
import { gzipSync } from 'node:zlib';

import { Client, Device, build, isRoot, listing, text, until } from './device.mjs';

const run = promisify(execFile);
const alicesUid = 65001;
let device;
let alice;

before(async () => {
  device = await Device.start();
  alice = await Client.signIn(device, 'alice');
  addFile('endless');
  truncateSync(device.at('vol1/photo/endless'), 2 ** 40);
});
after(() => device.remove());

function addFile(name, content = 'x') {
  const file = Buffer.concat([Buffer.from(device.at('vol1/photo/')), Buffer.from(name)]);
  writeFileSync(file, content);
  if (isRoot) {
    chownSync(file, alicesUid, 65100);
  }
}

async function startEndless() {
  const taskid = await alice.start(['/photo/endless'], '/photo/endless.7z', { format: '7z' });
  await until(() => device.processes().some(({ args }) => args.includes('.kavo-7z-')));
  return taskid;
}

test('every example of the documentation is as it says', async () => {
  const fresh = await Device.start();
  const document = text(new URL('../../docs/webapi.md', import.meta.url));
  const blocks = [...document.matchAll(/```console\n([\s\S]*?)```/g)].map((match) => match[1]);
  const examples = blocks.join('').split('\n$ ').map((each) => each.replace(/^\$ /, ''));
  assert.ok(examples.length >= 9);
  try {
    for (const example of examples) {
      const [command, ...expected] = example.trimEnd().split('\n');
      const { stdout } = await run('sh', ['-c',
        command.replaceAll('http://127.0.0.1:5080', fresh.url)], { cwd: fresh.base });
      const pattern = expected.join('\n').split('…')
        .map((part) => part.replace(/[.*+?^${}()|[\]\\]/g, '\\$&')).join('[^\\n]*');
      assert.match(stdout, new RegExp(`^${pattern}\n$`), command);
    }
  } finally {
    await fresh.remove();
  }
});

test('what is wrong is refused with its status and reason', async () => {
  const json = { 'Content-Type': 'application/json' };
  const post = (body, headers = {}) => ['/webapi', { method: 'POST', body, headers }];
  const long = 'x'.repeat(9 << 20);
  const rows = [
    [404, 'no such route', '/none', {}],
    [403, "another site's page", '/tasks', { headers: { Origin: 'http://evil.example' } }],
    [403, "another site's page", '/tasks', { headers: { Origin: `http://evil.example${device.url}` } }],
    [401, 'no session', '/tasks', { headers: { Cookie: 'session=stale' } }],
    [401, 'no session', ...post('{"api":"a","method":"b","version":1}', { Cookie: '' })],
    [400, 'line 1, column 8', ...post('{"api":', json)],
    [400, "byte 3: '%' without", ...post('a=%4', { 'Content-Type': 'application/x-www-form-urlencoded' })],
    [400, "'version' is missing", ...post('{"api":"a","method":"b"}', json)],
    [400, 'not an object', ...post('[]', json)],
    [400, 'nested too deep', ...post('['.repeat(100000), json)],
    [400, "'path' is missing", '/files', {}],
    [401, 'wrong user name', '/session', {
      method: 'POST', body: new URLSearchParams({ user: 'bob', password: 'bob\0x' }) }],
    [413, 'too long', ...post(long, json)],
    [413, 'too long', ...post(new Blob([long]).stream(), json)],
    [413, 'too long', '/session', { method: 'POST', body: `user=${long.slice(0, 70000)}` }],
    [401, 'no session', ...post(long.slice(0, 70000), { Cookie: 'session=stale' })],
    [415, 'an encoding', ...post(gzipSync('{}'), { ...json, 'Content-Encoding': 'gzip' })],
    [404, 'no such route', '/none', { method: 'PUT', body: 'x' }],
    [400, 'not a request', ...post(new FormData())],
  ];
  for (const [status, words, route, options] of rows) {
    const answer = await alice.ask(route, { duplex: 'half', ...options })
      .catch((error) => assert.fail(`${route} ${words}: ${error.cause ?? error}`));
    assert.equal(answer.status, status, `${route}: ${answer.text}`);
    assert.ok(answer.body.error.includes(words), `${answer.text} has no "${words}"`);
  }
  const { stdout } = await run('curl', ['-s', '-H', 'Host: evil.example', `${device.url}/codes`]);
  assert.match(stdout, /another site's page/);
  const part = await alice.ask('/none', { headers: { Range: 'bytes=0-1' } });
  assert.match(part.text, /no such route/);
  const sameSite = await alice.ask('/tasks', { headers: { Origin: device.url } });
  assert.equal(sameSite.status, 200);
});

test('what a refused request leaves unread is no request', async () => {
  const { host, port } = new URL(device.url);
  const body = `DELETE /session HTTP/1.1\r\nHost: ${host}\r\nCookie: ${alice.cookie}\r\n\r\n`;
  const socket = net.connect(Number(port), '127.0.0.1');
  socket.on('error', () => {}).write('POST /webapi HTTP/1.1\r\nOrigin: http://evil.example\r\n' +
    `Host: ${host}\r\nContent-Length: ${body.length}\r\n\r\n`);
  let answer = '';
  socket.on('data', (data) => {
    answer += data;
    socket.write(body);
  });
  await new Promise((resolve) => { socket.on('close', resolve); });
  assert.match(answer, /^HTTP\/1.1 403 /);
  assert.equal((await alice.ask('/session')).status, 200);
});

test('a name goes out and comes back byte by byte', async () => {
  const name = Buffer.from([...Buffer.from('a\n"<\'é'), 0xff, 0xed, 0xb3, 0xbf]);
  addFile(name, 'odd');
  const { body } = await alice.ask('/files?path=/photo');
  const shown = body.entries.map((entry) => entry.name).find((each) => each.startsWith('a\n'));
  assert.equal(shown, 'a\n"<\'é\udcff\udced\udcb3\udcbf');
  addFile(Buffer.from([0x62, 0xff]), 'odd');
  const answer = await alice.ask('/webapi', { method: 'POST', body: JSON.stringify({
    api: 'KAVO.Zantro.Compress', version: 3, method: 'start', params: {
      path: JSON.stringify(['/photo/b\udcff']), dest_file_path: JSON.stringify(['/photo/b.7z']),
      format: '7z' } }) });
  await alice.taskIn('finished', answer.body.data.taskid);
  assert.equal(listing(device.at('vol1/photo/b.7z')).length, 1);
});

test('one user reaches neither tasks nor sessions nor files of another', async () => {
  const taskid = await startEndless();
  const bob = await Client.signIn(device, 'bob');
  assert.deepEqual(await bob.tasks(), []);
  assert.equal((await bob.call('status', { taskid })).code, 599);
  assert.equal((await bob.call('stop', { taskid })).code, 0);
  assert.equal((await alice.call('status', { taskid })).code, 0);
  assert.equal((await bob.ask('/files?path=/vault')).status, 403);
  assert.equal((await bob.ask('/files?path=/home/../alice')).status, 403);
  assert.equal((await alice.call('stop', { taskid })).code, 0);
});

test('signing out ends the session', async () => {
  const client = await Client.signIn(device, 'alice');
  assert.match(client.signedIn.cookie, /; HttpOnly; SameSite=Strict/);
  assert.equal((await client.ask('/session')).body.user, 'alice');
  assert.equal((await client.ask('/session', { method: 'DELETE' })).status, 204);
  assert.equal((await client.ask('/session')).status, 401);
});

test('wrong passwords slow down that user alone', async () => {
  const statuses = [];
  for (let tries = 0; tries < 12; ++tries) {
    statuses.push((await Client.signIn(device, 'carol', 'wrong')).signedIn.status);
  }
  assert.deepEqual(new Set(statuses.slice(0, 10)), new Set([401]));
  assert.ok(statuses.slice(10).includes(429), statuses);
  assert.equal((await Client.signIn(device, 'alice')).signedIn.status, 200);
});

test('a thousand slow clients hold up nobody', async () => {
  const { port } = new URL(device.url);
  const sockets = await Promise.all(Array.from({ length: 1000 }, (_, index) => new Promise(
    (resolve, reject) => {
      const socket = net.connect(Number(port), '127.0.0.1', () => {
        socket.write(index % 2 ? 'POST /webapi HTTP/1.1\r\nContent-Length: 9\r\n\r\n{' : 'GET ');
        resolve(socket);
      });
      socket.on('error', reject);
    })));
  assert.equal((await alice.ask('/tasks', { signal: AbortSignal.timeout(5000) })).status, 200);
  sockets.forEach((socket) => socket.destroy());
});

test('a request process that crashes answers 500, and the next one works', async () => {
  const broken = await Device.start({ faults: ['Vesk::TaskMgr::TaskMgr=crash'] });
  const client = await Client.signIn(broken, 'alice');
  const answer = await client.ask('/webapi', { method: 'POST', body: new URLSearchParams({
    api: 'KAVO.Zantro.Compress', version: 3, method: 'status', taskid: 'x' }) });
  assert.equal(answer.status, 500);
  assert.equal(answer.body.error, 'the request ended without an answer');
  assert.equal((await client.ask('/session')).status, 200);
  await broken.remove();
});

test('a job outlives its device, and is found again', async () => {
  const taskid = await startEndless();
  assert.equal(await device.stop(), 0);
  assert.ok(device.processes().length > 0);
  await device.serve();
  assert.equal((await alice.ask('/session')).status, 401);
  alice = await Client.signIn(device, 'alice');
  assert.deepEqual((await alice.tasks()).map((task) => [task.taskid, task.state])
    .filter(([id]) => id === taskid), [[taskid, 'running']]);
  assert.equal((await alice.call('stop', { taskid })).code, 0);
  await until(() => !device.processes().some(({ args }) => args.includes('.kavo-7z-')));
});

test('the end of a killed worker is a failed task', async () => {
  const taskid = await startEndless();
  const stat = (pid) => execFileSync('ps', ['-o', 'pgid=', '-p', pid], { encoding: 'utf8' }).trim();
  const worker = stat(device.processes().find(({ args }) => args.includes('.kavo-7z-')).pid);
  process.kill(Number(worker), 'SIGKILL');
  const task = await alice.taskIn('failed', taskid);
  assert.deepEqual(task.errors, [{ code: 1300, path: '/photo/endless.7z' }]);
  assert.equal((await alice.call('status', { taskid })).data.finished, true);
  assert.equal((await alice.call('status', { taskid })).code, 599);
});

test('the front end has no rights and is started again when it dies, at any moment', async () => {
  const frontEnd = () => execFileSync('ps', ['-eo', 'ppid=,pid=,uid=,args='], { encoding: 'utf8' })
    .split('\n').map((line) => line.trim().split(/\s+/))
    .find(([parent, , , program]) => Number(parent) === device.process.pid && program === 'kavo-web')
    ?.slice(1, 3).map(Number);
  const [first, uid] = frontEnd();
  assert.equal(uid, isRoot ? 65534 : process.getuid());
  process.kill(first, 'SIGKILL');
  const [second] = await until(frontEnd);  // it does not listen yet
  process.kill(second, 'SIGKILL');
  await until(() => alice.ask('/session').then((answer) => answer.status === 200, () => false));
  assert.match(device.log, /the front end has ended; starting it again/);
});

test('a second device on the same folder or port says so in one line', async () => {
  const serve = (...args) => run(`${build}/kavo-device`, ['serve', ...args])
    .then(() => assert.fail('it serves'), (error) => error);
  const second = await serve(device.folder);
  assert.equal(second.code, 2);
  assert.match(second.stderr, /^kavo-device: device '.*': another process serves it\n$/);
  const other = await Device.start();
  const address = new URL(other.url).host;
  const third = await Device.start();
  await third.stop();
  const taken = await serve(third.folder, '--listen', address);
  assert.equal(taken.code, 2);
  assert.match(taken.stderr, /cannot listen on 127.0.0.1:\d+: Address already in use\n$/);
  await Promise.all([other.remove(), third.remove()]);
  assert.ok(existsSync(device.folder));
});
