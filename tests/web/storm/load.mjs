// Load: many jobs at once, jobs that are stopped, processes that are killed.
import assert from 'node:assert/strict';
import { execFileSync } from 'node:child_process';
import { existsSync, mkdirSync, readFileSync, rmdirSync, writeFileSync } from 'node:fs';
import path from 'node:path';

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

// The median of the time that an answer takes, in milliseconds, until `isOver`.
async function answers(client, isOver) {
  const times = [];
  do {
    const begin = performance.now();
    await client.tasks();
    times.push(performance.now() - begin);
    await moment(40);
  } while (!await isOver(times.length));
  return times.sort((one, other) => one - other)[times.length >> 1];
}

// A device that has little memory: jobs wait and keep within it, and nothing is killed.
export async function memory(device) {
  const isOld = existsSync('/sys/fs/cgroup/memory/cgroup.procs');  // the first version of the groups
  const group = `/sys/fs/cgroup/${isOld ? 'memory/' : ''}${path.basename(device.base)}`;
  mkdirSync(group);
  try {
    writeFileSync(`${group}/${isOld ? 'memory.limit_in_bytes' : 'memory.max'}`, `${2 ** 29}`);
    device.processes().forEach(({ pid }) => writeFileSync(`${group}/cgroup.procs`, `${pid}`));
    const big = device.at('vol1/photo/big');
    execFileSync('sh', ['-c', 'head -c $2 /dev/urandom > "$1" && chown 65001 "$1"', 'sh', big,
      scale(150e6, 30e6)]);
    const clients = (await signInAll(device)).slice(0, 2);
    const idle = await answers(clients[0], (count) => count >= 50);
    const tasks = await Promise.all(Array.from({ length: scale(8, 4) }, async (_, index) => {
      const client = clients[index % 2];
      const dest = `/photo/${index}.7z`;
      return { client, dest, id: await client.start(['/photo/big'], dest, { format: '7z', level: 'best' }) };
    }));
    let peak = 0;
    const busy = await answers(clients[0], async () => {
      const used = device.processes().map(({ pid }) => Number(execFileSync('sh', ['-c',
        `cat /proc/${pid}/smaps_rollup 2>/dev/null || :`], { encoding: 'utf8' }).match(/^Pss: +(\d+)/m)?.[1] ?? 0));
      peak = Math.max(peak, used.reduce((sum, each) => sum + each, 0));
      const states = (await Promise.all(clients.map((client) => client.tasks()))).flat();
      return states.every(({ state }) => ['finished', 'failed'].includes(state));
    });
    for (const { client, dest, id } of tasks) assertDone(await ended(client, id), dest);
    assert.ok(busy < 10 * idle, `an answer takes ${busy.toFixed(1)} ms, idle ${idle.toFixed(1)} ms`);
    return [`${tasks.length} jobs, all processes ${peak >> 10} MiB at most, ` +
      `answers ${idle.toFixed(1)} ms idle, ${busy.toFixed(1)} ms beside the jobs`];
  } finally {
    await device.stop();
    await until(() => device.processes().length === 0);
    rmdirSync(group);
    await device.serve();
  }
}
memory.takesRoot = true;

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
