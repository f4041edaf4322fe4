// What clients ask about files, and get of them.
import assert from 'node:assert/strict';
import { execFileSync } from 'node:child_process';
import { mkdirSync, writeFileSync } from 'node:fs';
import { after, before, test } from 'node:test';

import { Client, Device, isRoot, until } from './device.mjs';

const json = { 'Content-Type': 'application/json' };
let device;
let alice;
let bob;

// Runs it in the folder /photo, with files for everybody; what comes is alice's.
const inPhoto = (script) => execFileSync('sh', ['-ec', `umask 0; ${script}`], {
  cwd: device.at('vol1/photo'), ...isRoot && { uid: 65001, gid: 65100 } });

before(async () => {
  process.env.TZ = 'CET-1CEST,M3.5.0,M10.5.0/3';  // the device's
  device = await Device.start();
  [alice, bob] = await Promise.all(['alice', 'bob'].map((user) => Client.signIn(device, user)));
});
after(() => device.remove());

test('a file is downloaded whole or in ranges, and nothing but a file', async () => {
  const name = Buffer.from('vol1/photo/\xc3\xa9 "x"%\n.txt', 'latin1');
  device.add(name, '0123456789');
  device.add(Buffer.from('vol1/photo/a\xff', 'latin1'));
  device.add('vol1/photo/empty', '');
  const url = '/download?path=/photo/%C3%A9%20%22x%22%25%0A.txt';
  const whole = await alice.ask(url);
  const [tag, time] = ['etag', 'last-modified'].map((header) => whole.headers.get(header));
  assert.equal(whole.headers.get('content-disposition'),
    'attachment; filename="__ _x___.txt"; filename*=UTF-8\'\'%C3%A9%20%22x%22%25_.txt');
  assert.equal((await alice.ask('/download?path=/photo/a%FF')).headers.get('content-disposition'),
    'attachment; filename="a_"');
  assert.equal(whole.headers.get('content-type'), 'application/octet-stream');
  for (const [range, status, text, place, condition] of [
    ['bytes=0-0', 206, '0', '0-0'], ['bytes=7-', 206, '789', '7-9'], ['bytes=-2', 206, '89', '8-9'],
    ['bytes=-99', 200, '0123456789'], ['bytes=8-99999999999', 206, '89', '8-9'],
    ['bytes=10-', 416, /^.*the file has 10 bytes.*$/m, '*'], ['bytes=-0', 416, /10 bytes/, '*'],
    ['bytes=0-1,4-5', 200, '0123456789'], ['bytes=1-1', 206, '1', '1-1', tag], ['bytes=1-1', 206, '1', '1-1', time],
    ['bytes=1-1', 200, '0123456789', undefined, '"other"'],
  ]) {
    const headers = { Range: range, ...condition && { 'If-Range': condition } };
    const answer = await alice.ask(url, { headers });
    assert.deepEqual([answer.status, answer.headers.get('content-range')],
      [status, place ? `bytes ${place}/10` : null], range);
    assert.match(answer.text, text instanceof RegExp ? text : new RegExp(`^${text}$`), range);
  }
  const head = await alice.ask(url, { method: 'HEAD', headers: { Range: 'bytes=1-1' } });
  assert.deepEqual([head.status, head.headers.get('content-length'), head.text], [200, '10', '']);
  const late = await alice.ask('/download?path=/photo/endless', { headers: { Range: `bytes=${2 ** 40 - 2}-` } });
  assert.equal(late.text, '\0\0');
  execFileSync('sh', ['-ec', `mkfifo pipe; ln -s cat.jpg link; ln -s /etc etc; echo x >closed
    chmod 0600 closed`], { cwd: device.at('vol1/photo') });
  for (const [path, status] of [['/photo/empty', 200], ['/photo/pipe', 404], ['/photo/link', 404], ['/photo/etc/passwd', 403],
    ['/photo/trip', 404], ['/photo', 404], ['/', 404], ['/vault/x', 403], ['/home/../alice/x', 403],
    ['/photo/closed', isRoot ? 403 : 200], ['/photo/none', 404]]) {
    assert.equal((await bob.ask(`/download?path=${path}`)).status, status, path);
  }
  const stuck = [];
  while (stuck.length < 17) stuck.push(await bob.fetch('/download?path=/photo/endless'));
  assert.deepEqual(stuck.map(({ status }) => status), [...Array(16).fill(200), 429]);
  assert.equal(device.processes('request').length, 0);
  await Promise.all(stuck.map(({ body }) => body.cancel()));
  await until(() => bob.ask('/download?path=/photo/cat.jpg').then(({ status }) => status === 200));
});

test('what would be wrong with a destination is told before there is a job', async () => {
  inPhoto('mkdir -p taken.zip ../../vol2/vault/deep; ln -sfn trip shortcut; ln -sf cat.jpg linked.zip; touch a.zip "a (2).zip"');
  const name = (length) => `${'x'.repeat(length - 6)}é.zip`;
  inPhoto(`touch ${name(254)}`);
  const at = (path) => alice.ask(`/destination?path=${encodeURIComponent(path)}`);
  for (const [path, field, error] of [
    ['/photo/none/a.zip', 'folder', 'there is no such folder'], ['/none/a.zip', 'folder', 'there is no such folder'],
    ['/photo/cat.jpg/a.zip', 'folder', 'this is not a folder'], ['/photo/shortcut/a.zip', 'folder', 'this is not a folder'],
    ['/attic/a.zip', 'folder', 'you may not write in this folder'], ['a.zip', 'folder', /./],
    ['/photo/../a.zip', 'folder', /leads out/], [`/photo/${name(256)}`, 'name', 'file name too long'],
    [`/vault/${name(144)}`, 'name', /encrypted/], [`/vault/deep/${name(144)}`, 'name', /encrypted/], ['/photo/taken.zip', 'name', 'a folder has this name'],
    ['/photo/linked.zip', 'name', /else than a file/],
  ]) {
    const { body } = await at(path);
    assert.deepEqual([body.field, body.exists], [field, false], path);
    assert.match(body.error, error instanceof RegExp ? error : new RegExp(`^${error}$`), path);
  }
  for (const [path, exists, free] of [
    ['/photo/new.zip', false, 'new.zip'], ['/photo/a.zip', true, 'a (3).zip'], ['/home/a.zip', false, 'a.zip'],
    [`/vault/${name(142)}`, false, name(142)], [`/photo/${name(254)}`, true, undefined],
  ]) {
    const { body } = await at(path);
    assert.deepEqual([body.error, body.exists, body.free_name], [null, exists, free], path);
  }
  if (isRoot) assert.equal((await bob.ask('/destination?path=/music/a.zip')).body.field, 'folder');
});

// A zip of empty files with these names, as bytes, each with a comment.
function zip(names, comment = '') {
  const field = (value, size) => Buffer.from(Array.from({ length: size }, (_, at) => (value / 256 ** at) & 255));
  const fields = (...pairs) => Buffer.concat(pairs.map(([value, size]) => field(value, size)));
  const [bodies, index] = [[], []];
  let offset = 0;
  for (const name of names.map((each) => Buffer.from(each))) {
    const shared = fields([20, 2], [0x800, 2], [0, 2], [0, 2], [0x21, 2], [0, 4], [0, 4], [0, 4], [name.length, 2], [0, 2]);
    bodies.push(Buffer.from('PK\x03\x04'), shared, name);
    index.push(Buffer.from('PK\x01\x02'), field(20, 2), shared,
      fields([comment.length, 2], [0, 2], [0, 2], [0, 4], [offset, 4]), name, Buffer.from(comment));
    offset += 30 + name.length;
  }
  const size = index.reduce((sum, { length }) => sum + length, 0);
  return Buffer.concat([...bodies, ...index, Buffer.from('PK\x05\x06'),
    fields([0, 4], [names.length, 2], [names.length, 2], [size, 4], [offset, 4], [0, 2])]);
}

test('an archive is listed, whoever made it', async () => {
  inPhoto(`cp cat.jpg winter.jpg; touch -d 2024-01-15 winter.jpg; touch -d 2024-07-01 cat.jpg
    7z a -bso0 -pa plain.zip cat.jpg trip; 7z a -bso0 both.7z cat.jpg winter.jpg trip; 7z a -bso0 -pa -mhe shut.7z cat.jpg
    head -c 400 plain.zip >cut.zip; head -c 400 both.7z >cut.7z`);
  const hostile = ['../../etc/passwd', '/etc/shadow', 'a\n\nPath = b\nSize = 9', '\x1b[2J"},', `${'x'.repeat(60000)}`];
  device.add('vol1/photo/hostile.zip', zip(hostile, '\n\nPath = c\nSize = 7\n'));
  device.add('vol1/photo/many.zip', zip(Array.from({ length: 10001 }, (_, index) => `${index}`)));
  const list = async (name, client = alice) => client.ask(`/archive?path=/photo/${name}`);
  const { body } = await list('both.7z');
  const pictures = ({ entries }) => entries.filter(({ name }) => /^(cat|winter)/.test(name));
  assert.deepEqual(pictures(body), pictures((await alice.ask('/files?path=/photo')).body));
  assert.equal(body.entries.find(({ name }) => name === 'trip/day1').kind, 'folder');
  assert.deepEqual([body.format, body.count, body.complete, body.encrypted], ['7z', body.entries.length, true, false]);
  assert.deepEqual([(await list('plain.zip')).body.format, (await list('plain.zip')).body.encrypted], ['zip', true]);
  const { text, body: { count, entries } } = await list('hostile.zip');
  assert.ok(count >= 5 && entries.every(({ name }) => !name.includes('\n')), text.slice(0, 1000));
  const many = (await list('many.zip')).body;
  assert.deepEqual([many.count, many.entries.length, many.complete], [10001, 10000, false]);
  assert.equal((await list('cut.zip')).body.complete, false);
  for (const [name, status, reason] of [['shut.7z', 422, /by a password/], ['cut.7z', 422, /damaged/],
    ['cat.jpg', 422, /not a zip or 7z/], ['none.zip', 404, /./], ['trip', 404, /./]]) {
    const answer = await list(name);
    assert.equal(answer.status, status, name);
    assert.match(answer.body.error, reason);
  }
  await bob.taskIn('finished', await bob.start(['/photo/trip'], '/photo/sjis.zip'));  // in CP932, bob's own
  assert.ok((await list('sjis.zip', bob)).body.entries.some(({ name }) => name === 'trip/日の出.jpg'));
  inPhoto('chmod 0600 both.7z');
  if (isRoot) assert.equal((await list('both.7z', bob)).status, 403);
});

test('a selection is counted as it would be packed, for as long as the client waits', async () => {
  const count = (paths, options) => alice.ask('/size', {
    method: 'POST', headers: json, body: JSON.stringify({ paths }), ...options });
  inPhoto(`mkdir -p counted/@eaDir counted/.kavo-7z-${'0'.repeat(32)} counted/in; ln -s /etc counted/out
    for folder in @eaDir .kavo-7z-${'0'.repeat(32)} in; do echo 12345 >counted/$folder/file; done`);
  assert.deepEqual((await count(['/photo/counted', '/photo/cat.jpg'])).body,
    { bytes: 307206, complete: true, files: 3, folders: 2 });
  assert.equal((await count(['/photo/counted', '/photo/none'])).body.complete, false);
  assert.equal((await count(['/none'])).status, 404);
  assert.equal((await count('/photo')).status, 400);
  inPhoto('mkdir -p crowd; cd crowd; seq 5000 | xargs touch');
  const leaving = new AbortController();
  const counted = count(Array(20000).fill('/photo/crowd'), { signal: leaving.signal });
  await until(() => device.processes('request').length === 1);
  leaving.abort();
  await assert.rejects(counted);
  await until(() => device.processes('request').length === 0, 20);
});

test('every code page that is listed can be used', async () => {
  const pages = JSON.parse((await alice.ask('/codepages')).text);
  const state = async (codepage, index) => {
    const taskid = await alice.start(['/photo/cat.jpg'], `/photo/in${index}.zip`, { codepage });
    return until(async () => (await alice.tasks())
      .find((task) => task.taskid === taskid && /finished|failed/.test(task.state))?.state);
  };
  assert.deepEqual(await Promise.all([...pages, 'CP1'].map(state)), [...pages.map(() => 'finished'), 'failed']);
});
