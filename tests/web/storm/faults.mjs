// Faults: a volume full, no archiver, the store damaged.
import assert from 'node:assert/strict';
import { readFileSync, readdirSync, rmSync, statSync, truncateSync, writeFileSync } from 'node:fs';

import { Client, kill, until } from '../device.mjs';
import { assertFailed, ended, random, runJob, scale } from './tools.mjs';

// Breaks something while a device is in use, looks at what it does, and mends it again.
async function disturb(device, isCalm, rows) {
  for (const { breaks, mends, look, says, lists } of rows) {
    const client = await Client.signIn(device, 'alice');
    await runJob(client, ['/photo/cat.jpg'], '/photo/before.zip');
    const logged = device.log.length;
    await look(client, () => device.inside(breaks));
    const log = () => device.log.slice(logged);
    await until(() => says.test(log())).catch(() => assert.fail(`no ${says} in: ${log()}`));
    assert.ok(log().split('\n').length <= 21, `too much is logged: ${log()}`);
    device.inside(mends);
    await runJob(client, ['/photo/cat.jpg', '/music/album/02.mp3'], '/photo/after.zip');
    await client.ask('/session', { method: 'DELETE' });  // ends streams at once
    await isCalm({ folders: 2, lists });
  }
  return [`${rows.length} faults`];
}

const failsJobs = (dest) => async (client, breaks) => {
  breaks();
  await client.follow();  // so that what jobs log reaches the device's log
  for (const sources of [['/photo/trip'], ['/photo/trip', '/music/album/02.mp3']]) {
    assertFailed(await ended(client, await client.start(sources, '/photo/new.zip')), dest);
  }
};

async function bearsAFullStore(client, breaks) {
  const [stopped, killed] = [await client.startEndless(), await client.startEndless()];
  breaks();
  const start = { path: '["/photo/cat.jpg"]', dest_file_path: '["/photo/refused.zip"]' };
  assert.equal((await client.call('start', start)).code, 401);
  assert.deepEqual((await client.tasks()).map(({ state }) => state), ['running', 'running']);
  assert.equal((await client.call('stop', stopped)).code, 0);
  kill(killed.worker);
  await client.taskIn('failed', killed.taskid);
  // The end cannot be stored, nor the task removed: each answer tells it.
  for (let times = 0; times < 2; ++times) {
    assertFailed((await client.call('status', killed)).data, '/photo/endless.zip');
  }
  assert.ok((await client.tasks()).every(({ state }) => state === 'failed'), 'a job goes on');
  client.device.inside('rm "$1/users/alice/filler"');
  for (const { taskid } of await client.tasks()) await ended(client, taskid);
  breaks();
}

export function volumes(device, isCalm) {
  device.inside('mount -t tmpfs -o size=2m,mode=0700,uid=65001,gid=65100 store "$1/users/alice"');
  return disturb(device, isCalm, [
    { breaks: 'dd if=/dev/zero of="$1/users/alice/filler" bs=1k || true',
      mends: 'rm "$1/users/alice/filler"', says: /task store .*full/, look: bearsAFullStore, lists: 1 },
    { breaks: 'dd if=/dev/zero of=/tmp/filler bs=1k || true', mends: 'rm /tmp/filler',
      says: /Failed to write .*tempzip/, look: failsJobs('') }]);
}

export const archiver = (device, isCalm) => disturb(device, isCalm, [
  { breaks: 'mount -t tmpfs none /usr/lib/p7zip', mends: 'umount /usr/lib/p7zip',
    says: /cannot start.*No such file/, look: failsJobs('/photo/new.zip') }]);
volumes.takesRoot = archiver.takesRoot = true;

export async function stores(device) {
  const client = await Client.signIn(device, 'alice');
  const file = device.at('users/alice/store.db');
  const runJobs = () => runJob(client, ['/photo/cat.jpg'], '/photo/cat.zip');
  // A worker may wait for data that went with the store, as long as it is to.
  const isIdle = () => until(() => device.processes('worker', 'request').length === 0, 65);
  const counts = { truncated: 0, bytes: 0, log: 0 };
  for (let round = 0; round < scale(30, 3); ++round) {
    const kind = Object.keys(counts)[round % 3];
    do {  // until the log has been written back
      await runJobs();
      await isIdle();
    } while (statSync(file).size < 8192);
    const damaged = kind === 'log' ? `${file}-wal` : file;
    const bytes = readFileSync(damaged);
    if (kind === 'truncated') {
      truncateSync(file, 4096 + random(bytes.length - 8191));
      rmSync(`${file}-wal`);  // what is in the log would stand for it
    } else {
      for (let times = random(400); times >= 0; --times) bytes[random(bytes.length)] = random(256);
      writeFileSync(damaged, bytes);
    }
    const [inode, logged] = [statSync(file).ino, device.log.length];
    // What is looked at first may meet the damage on its way.
    await until(async () => (await client.ask('/tasks')).status === 200 &&
      (await client.call('status', { taskid: 'none' })).code === 599);
    await until(() => runJobs().then(() => true, () => false));
    await isIdle();
    const log = () => device.log.slice(logged);
    const said = () => log().split(/is set aside as .*store\.db\.damaged-/).length - 1;
    const isAside = statSync(file).ino !== inode;
    // A worker that sets it aside as its last act may be gone before its line is read.
    await until(() => said() > 0 || !isAside).catch(() => {});
    assert.ok(said() === (isAside ? 1 : 0) && (isAside || kind !== 'truncated'),
      `${kind}, ${isAside ? '' : 'not '}set aside: ${log()}`);
    counts[kind] += said();
  }
  // Those of jobs that met the damage.
  for (const { taskid } of await client.tasks()) await client.call('stop', { taskid });
  assert.match(`${readdirSync(device.at('users/alice'))}`, /damaged-/, 'nothing was kept');
  return [`set aside ${JSON.stringify(counts)}`];
}
