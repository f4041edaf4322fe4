// Load: many jobs at once, jobs that are stopped, processes that are killed.
import assert from 'node:assert/strict';
import { execFileSync } from 'node:child_process';
import { existsSync, readFileSync } from 'node:fs';

import { Client, contents, kill, listing, until } from '../device.mjs';
import { assertDone, assertFailed, ended, moment, pick, random, runJob, scale, signInAll, users }
  from './tools.mjs';

const archiveOf = ({ device, user }, dest) =>
  device.at(user === 'carol' ? 'vol2' : 'vol1', dest.replace('/home', `homes/${user}`));

export async function jobs(device) {
  device.add('vol1/photo/zeros', 2 ** 24);  // keeps the archiver at work, and little of the disk
  device.add('vol1/music/zeros', 2 ** 24);
  const sources = [['/photo/zeros'], ['/photo/cat.jpg'], ['/photo/zeros', '/music/zeros']];
  execFileSync('7z', ['a', '-bso0', '-mx0', '../reference.7z', 'photo/zeros', 'photo/cat.jpg',
    'music/zeros'], { cwd: device.at('vol1') });
  const reference = contents(device.at('reference.7z'));
  const clients = await signInAll(device);
  const all = await Promise.all(Array.from({ length: scale(200, 24) }, async (_, index) => {
    const client = clients[index % 3];
    const paths = sources[(index + Math.floor(index / 3)) % 3];
    const format = index % 2 ? 'zip' : '7z';
    const dest = `/home/${index}.${format}`;
    const taskid = await client.start(paths, dest, { format, level: 'fastest' });
    return { client, paths, dest, taskid };
  }));
  for (const { client, paths, dest, taskid } of all) {
    assertDone(await ended(client, taskid), dest);
    assert.deepEqual(contents(archiveOf(client, dest)), new Map(paths.map((each) =>
      [each.slice(paths.length > 1 ? 1 : '/photo/'.length), reference.get(each.slice(1))])));
  }
  return [`${all.length} jobs`, { folders: all.filter(({ paths }) => paths.length > 1).length }];
}

export async function stops(device) {
  let [left, folders, running] = [scale(1000, 60), 0, 0];
  const dest = '/home/out.7z';
  const clients = await signInAll(device);
  await Promise.all(clients.map(async (client) => {
    for (; left > 0; --left) {
      const sources = pick([['/photo/endless'], ['/photo/cat.jpg'], ['/photo/trip'],
        ['/photo/trip', '/music/album/02.mp3'], ['/music/album/02.mp3', '/photo/endless']]);
      folders += sources.length > 1 ? 1 : 0;
      const taskid = await client.start(sources, dest, { format: '7z', level: 'store' });
      await moment(pick([1, 10, 40, 150]));
      const { code, data } = await client.call('status', { taskid });
      assert.ok(code === 0 && !data.errors && data.dest_file_path === dest &&
        data.progress >= 0 && data.progress <= 1, JSON.stringify({ code, data }));
      running += data.finished ? 0 : 1;
      await moment(pick([1, 10, 40]));
      assert.deepEqual(await client.call('stop', { taskid }), { code: 0, data: null });
      assert.equal((await client.call('status', { taskid })).code, 599, 'the task is still there');
    }
  }));
  clients.map((client) => archiveOf(client, dest)).filter(existsSync)
    .forEach((archive) => execFileSync('/usr/bin/7z', ['t', archive]));
  return [`${running} jobs in the middle`, { folders }];
}

export async function kills(device) {
  const dest = '/photo/old.7z';
  const archive = device.at('vol1', dest);
  execFileSync('7z', ['a', '-bso0', archive, device.at('vol1/photo/cat.jpg')]);
  const old = readFileSync(archive);
  const jobs = ['worker', 'archiver', '7z'];
  const kinds = [...jobs, 'request', 'front end', 'launcher'];
  const rounds = scale(200, 12);
  const counts = Object.fromEntries(kinds.map((kind) => [kind, 0]));
  const signIn = () => until(() => Client.signIn(device, 'alice').catch(() => null));
  for (let round = 0; round < rounds; ++round) {
    device.add('vol1/photo/old.7z', old);
    const kind = kinds[round % kinds.length];
    let client = await signIn();
    const { close } = await client.follow();
    const isEndless = random(2) === 0;
    const taskid = await client.start([isEndless ? '/photo/endless' : '/photo/trip'], dest,
      { format: '7z', level: 'store' });
    let mayBeGone = !isEndless;  // a short job may end, and be reported, at any moment
    const hasEnded = ({ code, data }) => {
      const isFine = code === 599 ? mayBeGone
        : code === 0 && (data.errors ? jobs.includes(kind) : !data.finished || !isEndless);
      assert.ok(isFine, JSON.stringify({ kind, isEndless, code, data }));
      if (data?.errors) assertFailed(data, dest);
      mayBeGone ||= data.finished;
      return code === 599 || data.finished;
    };
    await moment(120);
    const polling = client.call('status', { taskid }).catch(() => ({}));
    await moment(4);
    const killed = device.processes(kind).slice(0, 1 + random(2)).filter(({ pid }) => kill(pid));
    counts[kind] += killed.length;
    const polled = await polling;
    if ('code' in polled) hasEnded(polled);
    close();
    if (kind === 'launcher') await device.ended.then(() => device.serve());
    // Else the moment after the kill counts.
    if (['launcher', 'front end'].includes(kind)) client = await signIn();
    const mustFail = isEndless && killed.length > 0 && jobs.includes(kind);
    await until(async () => hasEnded(await client.call('status', { taskid })) || !mustFail);
    assert.equal((await client.call('stop', { taskid })).code, 0);
    await until(() => device.processes(...jobs).length === 0);
    execFileSync('/usr/bin/7z', ['t', archive]);
    assert.ok(listing(archive).includes('cat.jpg') &&
      listing(archive).every((name) => /^(cat\.jpg|trip)(\/|$)/.test(name)), `${listing(archive)}`);
  }
  // What an archiver that was killed has left, the next one of the same folder removes.
  await runJob(await signIn(), ['/photo/cat.jpg'], '/photo/last.7z');
  assert.doesNotMatch(device.log, /set aside/, 'a store was damaged');
  return [JSON.stringify(counts), { lists: rounds }];
}
