// The device over HTTP: the examples of docs/webapi.md, and what must not bring it down.
import assert from 'node:assert/strict';
import { execFile, execFileSync } from 'node:child_process';
import { once } from 'node:events';
import { readFileSync, readdirSync, statSync } from 'node:fs';
import net from 'node:net';
import { after, before, test } from 'node:test';
import { promisify } from 'node:util';
import { gzipSync } from 'node:zlib';

import { Client, Device, isRoot, kill, listing, program, until } from './device.mjs';

const run = promisify(execFile);
const skip = !isRoot && 'it takes root';
const owner = isRoot ? { uid: 65534, gid: 65534 } : {};
const json = { 'Content-Type': 'application/json' };
const guards = {
  'content-security-policy': /^default-src 'none'; (?!.*unsafe).*; frame-ancestors 'none'$/,
  'x-content-type-options': /^nosniff$/, 'referrer-policy': /^no-referrer$/,
  'cross-origin-resource-policy': /^same-origin$/, 'cache-control': /^no-(store|cache)$/ };
let device;
let plain;  // one that a plain user runs
let alice;

// A client whose every answer must tell browsers to be careful with it.
class Guarded extends Client {
  async fetch(route, options) {
    const response = await super.fetch(route, options);
    for (const [name, value] of Object.entries(guards)) {
      assert.match(response.headers.get(name) ?? '', value, `${name} of ${route}`);
    }
    return response;
  }
}

before(async () => {
  if (isRoot) process.setgroups([0, 65101]);  // groups that the front end has to give up
  [device, plain] = [await Device.start(), await Device.start({ owner, faults: ['DoKill=crash'] })];
  alice = await Guarded.signIn(device, 'alice');
});
after(() => Promise.all([device, plain].map((each) => each.remove())));

test('every example of the documentation is as it says', async () => {
  const document = readFileSync(new URL('../../docs/webapi.md', import.meta.url), 'utf8');
  const blocks = [...document.matchAll(/```console\n([\s\S]*?)```/g)].map((match) => match[1]);
  const examples = blocks.join('').split('\n$ ').map((each) => each.replace(/^\$ /, ''));
  assert.ok(examples.length >= 9);
  for (const example of examples) {
    const [command, ...expected] = example.trimEnd().split('\n');
    const { stdout } = await run('sh', ['-c',
      command.replaceAll('http://127.0.0.1:5080', device.url)], { cwd: device.base });
    const pattern = expected.join('\n').split('…')
      .map((part) => part.replace(/[.*+?^${}()|[\]\\]/g, '\\$&')).join('[^\\n]*');
    assert.match(stdout, new RegExp(`^${pattern}\n$`), command);
  }
});

test('each request is answered with its status and words, and guarded', async () => {
  const post = (body, headers = {}) => ['/webapi', { method: 'POST', body, headers }];
  const cookie = (text) => ({ headers: { Cookie: text } });
  const long = 'x'.repeat(9 << 20);
  const id = alice.cookie.slice('session='.length);
  const rows = [
    [200, '<!DOCTYPE html>', '/'],
    [404, 'no such route', '/app.js'],
    [200, '"alice"', '/session', cookie(`a=b; session=${id}; c=d`)],
    [401, 'no session', '/session', cookie(`xsession=${id}`)],
    [401, 'no session', '/session', cookie(`a=b; session2=${id}; csession=${id}`)],
    [401, 'no session', '/session', cookie(`a=%3B%20session%3D${id}`)],
    [401, 'no session', '/events', cookie('')],
    [401, 'no session', ...post('{"api":"a","method":"b","version":1}', { Cookie: '' })],
    [401, 'no session', ...post(long.slice(0, 70000), { Cookie: 'session=stale' })],
    [401, 'wrong user', '/session', { method: 'POST', body: '{"user":"bob","password":"bob\\u0000x"}' }],
    [200, '"tasks"', '/tasks', { headers: { Origin: device.url } }],
    [200, '"tasks"', '/tasks', { headers: { Origin: 'https://nas.example', 'X-Forwarded-Host': 'nas.example' } }],
    [403, "another site's page", '/tasks', { headers: { Origin: 'http://evil.example' } }],
    [403, "another site's page", '/tasks', { headers: { Origin: `http://evil.example${device.url}` } }],
    [404, 'no such route', '/none', { headers: { Range: 'bytes=0-1' } }],
    [404, 'no such route', '/none', { method: 'PUT', body: 'x' }],
    [400, "'path' is missing", '/files'],
    [400, "byte 3: '%' without", ...post('a=%4', { 'Content-Type': 'application/x-www-form-urlencoded' })],
    [400, "'version' is missing", ...post('{"api":"a","method":"b"}', json)],
    [400, 'not an object', ...post('[]', json)],
    [400, 'nested too deep', ...post('['.repeat(100000), json)],
    [400, 'not a request', ...post(new FormData())],
    [413, 'too long', ...post(long, json)],
    [413, 'too long', ...post(new Blob([long]).stream(), json)],
    [413, 'too long', '/session', { method: 'POST', body: `user=${long.slice(0, 70000)}` }],
    [414, 'not a request', `/${long.slice(0, 10000)}`],
    [415, 'an encoding', ...post(gzipSync('{}'), { ...json, 'Content-Encoding': 'gzip' })],
  ];
  for (const [status, words, route, options] of rows) {
    const answer = await alice.ask(route, { duplex: 'half', ...options })
      .catch((error) => assert.fail(`${route} ${words}: ${error.cause ?? error}`));
    assert.equal(answer.status, status, `${route}: ${answer.text}`);
    assert.ok(answer.text.includes(words), `${answer.text} has no "${words}"`);
  }
  const { stdout } = await run('curl', ['-s', '-H', 'Host: evil.example', `${device.url}/codes`]);
  assert.match(stdout, /another site's page/);
});

test('the page is asked for again by its validator, and what it consists of never', async () => {
  const page = await alice.ask('/');
  assert.equal(page.headers.get('cache-control'), 'no-cache');
  const files = [...page.text.matchAll(/(?:href|src)="(\/.*?)"/g)].map(([, url]) => url);
  assert.ok(files.length > 5);
  for (const url of files) {
    const { status, headers } = await fetch(device.url + url);
    assert.deepEqual([status, headers.get('cache-control')], [200, 'max-age=31536000, immutable'], url);
  }
  const again = { headers: { 'If-None-Match': `W/"other", ${page.headers.get('etag')}` } };
  assert.deepEqual([(await alice.ask('/', again)).status, (await alice.ask('/', again)).text], [304, '']);
  const { stdout: old } = await run('curl', ['-sD-', '-o/dev/null', '--http1.0', '-H', 'Accept-Encoding: gzip', `${device.url}/codes`]);
  assert.doesNotMatch(old, /-encoding:/i);
  for (const [accepted, sent] of [['br', null], ['br, gzip', 'gzip'], ['gzip; q=0', null]]) {
    for (const route of ['/codes', files.at(-1)]) {
      const { headers } = await fetch(device.url + route, { headers: { 'Accept-Encoding': accepted } });
      assert.equal(headers.get('content-encoding'), sent, `${accepted} of ${route}`);
    }
  }
});

test('what a refused request leaves unread is no request', async () => {
  const { host, port } = new URL(device.url);
  const body = `DELETE /session HTTP/1.1\r\nHost: ${host}\r\nCookie: ${alice.cookie}\r\n\r\n`;
  const socket = net.connect(port, '127.0.0.1').on('error', () => {});
  socket.write(`POST /webapi HTTP/1.1\r\nOrigin: http://evil.example\r\nHost: ${host}\r\n` +
    `Content-Length: ${body.length}\r\n\r\n`);
  assert.match(`${await once(socket, 'data')}`, /^HTTP\/1.1 403 /);
  socket.resume().write(body);
  await once(socket, 'close');
  assert.equal((await alice.ask('/session')).status, 200);
});

test('a name goes out and comes back byte by byte', async () => {
  device.add(Buffer.from('vol1/photo/a\n"<\'\xc3\xa9\xff\xed\xb3\xbf', 'latin1'));
  const names = (await alice.ask('/files?path=/photo')).body.entries.map(({ name }) => name);
  assert.ok(names.includes('a\n"<\'é\udcff\udced\udcb3\udcbf'), `${names}`);
  device.add(Buffer.from('vol1/photo/b\xff', 'latin1'));
  const taskid = await alice.start(['/photo/b\udcff'], '/photo/b.7z', { format: '7z' });
  await alice.taskIn('finished', taskid);
  assert.equal(listing(device.at('vol1/photo/b.7z')).length, 1);
});

test('one user reaches neither tasks nor sessions nor files of another', async () => {
  const { taskid } = await alice.startEndless();
  const bob = await Guarded.signIn(device, 'bob');
  assert.deepEqual(await bob.tasks(), []);
  assert.equal((await bob.call('status', { taskid })).code, 599);
  assert.equal((await bob.call('stop', { taskid })).code, 0);
  assert.equal((await alice.call('status', { taskid })).data.finished, false);
  assert.equal((await alice.call('stop', { taskid })).code, 0);
  for (const path of ['/vault', '/home/../alice', '/photo/host', '/photo/host/ssl']) {
    assert.equal((await bob.ask(`/files?path=${path}`)).status, 403, path);
  }
});

test('each process has its user\'s rights, and the front end none', { skip }, async () => {
  const [{ pid }] = device.processes('front end');
  assert.match(readFileSync(`/proc/${pid}/status`, 'utf8'),
    /^Uid:(\t65534){4}\nGid:(\t65534){4}\n[^]*^Groups:[\t ]*$[^]*^CapEff:\t0+$/m);
  execFileSync('install', ['-d', '-m', '0700', '-o', '65002', device.at('vol1/photo/closed')]);
  const bob = await Guarded.signIn(device, 'bob');
  for (const [client, status, uid, gid] of [[alice, 403, 65001, 65101], [bob, 200, 65002, 65100]]) {
    assert.equal((await client.ask('/files?path=/photo/closed')).status, status);
    const dest = `/photo/${uid}.zip`;
    await client.taskIn('finished', await client.start(['/photo/cat.jpg'], dest));
    const archive = statSync(device.at('vol1', dest));
    assert.deepEqual([archive.uid, archive.gid], [uid, gid]);
  }
});

test('sessions end when they are signed out or too many, and a user has sixteen streams', async () => {
  const client = await Guarded.signIn(device, 'alice');
  assert.match(client.signedIn.headers.get('set-cookie'), /; HttpOnly; SameSite=Strict/);
  const { status, headers } = await client.ask('/session', { method: 'DELETE' });
  assert.equal(status, 204);
  assert.match(headers.get('set-cookie'), /^session=; Max-Age=0; Path=\//);
  assert.equal((await client.ask('/session')).status, 401);
  const sessions = [];
  while (sessions.length < 17) sessions.push(await Guarded.signIn(device, 'bob'));
  assert.equal((await sessions[0].ask('/session')).status, 401);
  const streams = await Promise.all(sessions.slice(1, 4).flatMap((session) =>
    Array.from({ length: 6 }, () => session.follow())));
  streams.sort((one, other) => one.status - other.status).forEach(({ close }) => close());
  assert.deepEqual(streams.map(({ status }) => status), [...Array(16).fill(200), 429, 429]);
  assert.ok(streams[16].headers.get('retry-after') > 0);
});

test('wrong passwords slow down that name alone, whether or not there is such a user', async () => {
  const wrong = async (user) => (await Guarded.signIn(device, user, '')).signedIn.status;
  for (const name of ['carol', 'mallory']) {
    const tries = [];
    while (tries.length < 12) tries.push(await wrong(name));
    assert.deepEqual(tries.slice(0, 10), Array(10).fill(401));
    assert.ok(tries.slice(10).includes(429), `${name}: ${tries}`);
    assert.deepEqual([await wrong('bob'), await wrong('trent')], [401, 401]);
  }
  assert.equal((await Guarded.signIn(device, 'alice')).signedIn.status, 200);
});

test('the end of a job that nobody follows is told once, to the streams of then', async () => {
  const other = await Guarded.signIn(device, 'alice');
  const told = (stream) => stream.events('notification').map(({ taskid }) => taskid);
  const open = await alice.follow();
  const first = await other.start(['/photo/cat.jpg'], '/photo/first.zip');
  await until(() => told(open).length > 0);
  const late = await alice.follow();
  await until(() => late.events('task').length > 0);
  const second = await other.start(['/photo/cat.jpg'], '/photo/second.zip');
  await until(() => [open, late].every((stream) => told(stream).includes(second)));
  assert.deepEqual([open, late].map(told), [[first, second], [second]]);
  const { taskid } = await other.startEndless();
  await until(() => open.events('task').some((task) => task.taskid === taskid));
  await other.call('stop', { taskid });
  await other.call('status', { taskid: first });
  const gone = (id) => until(() => open.events('gone').find((event) => event.taskid === id));
  assert.deepEqual([await gone(taskid), await gone(first)], [{ stopped: true, taskid }, { taskid: first }]);
  [open, late].forEach(({ close }) => close());
});

test('a job leaves nothing in /tmp when it is stopped or fails', { skip }, async () => {
  const here = () => readdirSync(device.tmp).sort();
  const before = here();
  const stopped = await alice.startEndless();
  assert.notDeepEqual(here(), before);
  assert.equal((await alice.call('stop', stopped)).code, 0);
  const failed = await alice.startEndless();
  device.processes('7z').forEach(({ pid }) => kill(pid));
  await alice.taskIn('failed', failed.taskid);
  await until(() => device.processes('worker', 'archiver').length === 0);
  assert.deepEqual(here(), before);
});

test('a job outlives its device, and its end is told to who follows it on the next', async () => {
  const { taskid, worker } = await alice.startEndless();
  assert.equal(await device.stop(), 0);
  await device.serve();
  assert.equal((await alice.ask('/session')).status, 401);
  alice = await Guarded.signIn(device, 'alice');
  const stream = await alice.follow();
  const told = (state) => until(() => stream.events('task')
    .find((task) => task.taskid === taskid && task.state === state));
  await told('running');
  kill(worker);
  assert.deepEqual((await told('failed')).errors, [{ code: 1300, path: '/photo/endless.zip' }]);
  stream.close();
  assert.equal((await alice.call('status', { taskid })).data.finished, true);
  assert.equal((await alice.call('status', { taskid })).code, 599);
  await until(() => device.processes('archiver').length === 0);
});

test('a request that crashes answers 500, and a worker that dumps core has failed', async () => {
  const client = await Guarded.signIn(plain, 'alice');
  const { taskid, worker } = await client.startEndless();
  const form = `api=KAVO.Zantro.Compress&version=3&method=stop&taskid=${taskid}`;
  const answer = await client.ask('/webapi', { method: 'POST', body: new URLSearchParams(form) });
  assert.equal(answer.status, 500);
  assert.equal(answer.body.error, 'the request ended without an answer');
  assert.equal((await client.ask('/session')).status, 200);
  // A worker that has changed its user would dump nothing; here and there none may.
  await run('prlimit', ['--pid', worker, '--core=unlimited:'], owner).catch(() => {});
  kill(worker, 'ABRT');
  // Not over HTTP, as that would look for workers that are gone.
  await until(() => execFileSync(program, ['tasks', plain.folder, '--user', 'alice'], owner)
    .includes(`${taskid}\tfailed\t`));
});

test('the front end is started again when it dies, at any moment', async () => {
  const [first] = device.processes('front end');
  kill(first.pid);
  const next = () => device.processes('front end').find(({ pid }) => pid !== first.pid);
  kill((await until(next)).pid);  // it does not listen yet
  await until(() => alice.ask('/session').then((answer) => answer.status === 200, () => false));
  assert.match(device.log, /the front end has ended; starting it again/);
});

test('a second device on the same folder or port says so in one line', async () => {
  await plain.stop();
  for (const [user, reason, ...args] of [
    [{}, /^2 kavo-device: device '.*': another process serves it\n$/, device.folder],
    [owner, /^2 kavo-device: cannot listen on 127.0.0.1:\d+: Address already in use\n$/,
      plain.folder, '--listen', new URL(device.url).host]]) {
    const { code, stderr } = await run(program, ['serve', ...args], { timeout: 30000, ...user })
      .then(() => assert.fail('it serves'), (error) => error);
    assert.match(`${code} ${stderr.replace(/^.*: not root: .*\n/, '')}`, reason);
  }
});
