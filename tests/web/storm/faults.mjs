// Faults: volumes full or read-only, the archiver missing, the clock set back, the store damaged.
import { readFileSync, readdirSync, rmSync, statSync, writeFileSync } from 'node:fs';
import path from 'node:path';

import { Client, Device, build, isRoot, until } from '../device.mjs';
import { addEndless, calmCheck, ended, follow, isFailure, kill, processes, random, require, runJob,
  scale } from './tools.mjs';

const longest = 60;  // seconds, of anything
const startEndless = async (device, client) => {
  const taskid = await client.start(['/photo/endless'], '/photo/endless.7z', { level: 'store' });
  await until(() => processes(device, '7z').length > 0);
  return taskid;
};

// Breaks something while a device is in use, looks at what it does, and mends it again.
async function disturbed(rows) {
  const slowest = { name: '', seconds: 0 };
  for (const { name, prepare, breaks, mends, look, says, lists } of isRoot ? rows : []) {
    const device = await Device.start({ isolated: true });
    const isCalm = await calmCheck(device);
    addEndless(device);
    device.inside(prepare ?? ':');
    const client = await Client.signIn(device, 'alice');
    await runJob(client, ['/photo/cat.jpg'], '/photo/before.zip');
    const logged = device.log.length;
    const begin = performance.now();
    await look(device, client, () => device.inside(breaks));
    const seconds = (performance.now() - begin) / 1000;
    require(seconds < longest, `${name}: ${seconds} s`);
    if (seconds > slowest.seconds) {
      Object.assign(slowest, { name, seconds });
    }
    await until(() => says.test(device.log.slice(logged))).catch(() => {
      throw new Error(`${name}: the log has no ${says}: ${device.log.slice(logged)}`);
    });
    const lines = device.log.slice(logged).split('\n').length - 1;
    require(lines <= 20, `${name}: ${lines} lines are logged`);
    device.inside(mends);
    await runJob(client, ['/photo/cat.jpg', '/music/album/02.mp3'], '/photo/after.zip');
    require((await client.tasks()).length === 0, `${name}: tasks are left`);
    await client.ask('/session', { method: 'DELETE' });  // ends streams at once
    await isCalm({ folders: 2, lists });
    await device.remove();
  }
  return isRoot ? `${rows.length} faults, at most ${slowest.seconds.toFixed(1)} s (${slowest.name})`
    : 'skipped, as they take root';
}

const refusesToStart = async (client) => {
  const { code } = await client.call('start', { path: '["/photo/cat.jpg"]',
    dest_file_path: '["/photo/refused.zip"]' });
  require(code === 401, `start: ${code}`);
};

const failsJobs = (dest) => async (device, client, breaks) => {
  breaks();
  const close = await follow(client);
  for (const sources of [['/photo/trip'], ['/photo/trip', '/music/album/02.mp3']]) {
    const end = await ended(client, await client.start(sources, '/photo/new.zip'), longest);
    require(isFailure(end, dest), end);
  }
  await close();
};

const storeVolume = `store="$1/users/alice"
  mount -t tmpfs -o size=2m,mode=0700,uid=65001,gid=65100 store "$store"`;

export const volumesAreFull = () => disturbed([{
  name: 'a full store', prepare: storeVolume, lists: 1,
  breaks: 'dd if=/dev/zero of="$1/users/alice/filler" bs=1k || true',
  mends: 'rm "$1/users/alice/filler"',
  says: /task store .*full/,
  look: async (device, client, breaks) => {
    const stopped = await startEndless(device, client);
    const killed = await startEndless(device, client);
    breaks();
    await refusesToStart(client);
    require((await client.tasks()).every(({ state }) => state === 'running'), 'a job has failed');
    require((await client.call('stop', { taskid: stopped })).code === 0, 'stop');
    await until(() => processes(device, 'worker').length === 1);
    kill(processes(device, 'worker')[0].pid);
    // The end cannot be stored, nor the task removed: each answer tells it.
    for (let times = 0; times < 2; ++times) {
      const { data } = await until(async () => {
        const answer = await client.call('status', { taskid: killed });
        return answer.data.finished && answer;
      });
      require(isFailure(data, '/photo/endless.7z'), data);
    }
    require((await client.tasks()).every(({ state }) => state === 'failed'), 'a job goes on');
    device.inside('rm "$1/users/alice/filler"');
    for (const { taskid } of await client.tasks()) {
      await ended(client, taskid);
    }
    breaks();
  },
}, {
  name: 'a read-only store', prepare: storeVolume,
  breaks: 'mount -o remount,ro "$1/users/alice"',
  mends: 'mount -o remount,rw "$1/users/alice"',
  says: /task store .*readonly/,
  look: async (device, client, breaks) => {
    breaks();
    await refusesToStart(client);
    require((await client.call('status', { taskid: 'none' })).code === 599, 'status');
    require((await client.ask('/files?path=/photo')).status === 200, 'files');
    require([200, 500].includes((await client.ask('/tasks')).status), 'tasks');
  },
}, {
  name: 'a full /tmp', breaks: 'dd if=/dev/zero of=/tmp/filler bs=1k || true',
  mends: 'rm /tmp/filler', says: /Failed to write .*tempzip/, look: failsJobs(''),
}]);

const stock7z = '/usr/lib/p7zip';
export const archiverIsMissing = () => disturbed([
  ['no 7z', /cannot start.*No such file/, `mount -t tmpfs none ${stock7z}`],
  ['a 7z that may not run', /cannot start.*Permission denied/,
    `touch "$1/no-7z" && mount --bind "$1/no-7z" ${stock7z}/7z`],
  ['a 7z that is no program', /cannot start.*Exec format error/,
    `echo '?' >"$1/no-7z"; chmod 755 "$1/no-7z"; mount --bind "$1/no-7z" ${stock7z}/7z`],
].map(([name, says, breaks]) => ({ name, says, breaks,
  mends: `umount ${stock7z}/7z || umount ${stock7z}`, look: failsJobs('/photo/new.zip') })));

// True while a signal waits for a process that does not hear it.
const isToldToEnd = (pid) => {
  const waiting = readFileSync(`/proc/${pid}/status`, 'utf8').match(/ShdPnd:\s*(\w+)/)[1];
  return (BigInt(`0x${waiting}`) & 0x4000n) !== 0n;  // SIGTERM
};

export async function clockIsSetBack() {
  const days = (count) => String(count * 86400);
  const device = await Device.start({ isolated: isRoot, env: {
    LD_PRELOAD: path.join(build, 'libshifted_clock.so'), KAVO_CLOCK_SHIFT: '/dev/null' } });
  const shift = path.join(device.base, 'shift');
  writeFileSync(shift, days(0));
  await device.stop();
  device.env.KAVO_CLOCK_SHIFT = shift;
  await device.serve();
  const isCalm = await calmCheck(device);
  addEndless(device);
  const client = await Client.signIn(device, 'alice');
  const [killed, lost, stopped] = [await startEndless(device, client),
    await startEndless(device, client), await startEndless(device, client)];
  const done = await client.start(['/photo/cat.jpg'], '/photo/done.zip');
  await client.taskIn('finished', done);
  const workerOf = async (index) => processes(device, 'worker')
    .sort((one, other) => one.pid - other.pid)[index].pid;
  // A stop that dies when it has told the worker, which does not hear it.
  const deaf = await workerOf(1);
  kill(deaf, 'SIGSTOP');
  await until(() => /State:\s*T/.test(readFileSync(`/proc/${deaf}/status`, 'utf8')));
  const stopping = client.call('stop', { taskid: lost }).catch(() => null);
  await until(() => isToldToEnd(deaf));
  writeFileSync(shift, days(-3));
  processes(device, 'request').forEach(({ pid }) => kill(pid));
  await stopping;
  kill(deaf);
  require(isFailure(await ended(client, lost), '/photo/endless.7z'), 'a job to be stopped');
  const { started } = (await client.tasks()).find(({ taskid }) => taskid === done);
  const fresh = await client.start(['/photo/cat.jpg'], '/photo/fresh.zip');
  const task = await client.taskIn('finished', fresh);
  require(started - task.started > 2 * 86400, 'the clock is not set back');
  for (const taskid of [done, fresh]) {
    require(!(await ended(client, taskid)).errors, 'a job that was done');
  }
  kill(await workerOf(0));
  require(isFailure(await ended(client, killed), '/photo/endless.7z'), 'a killed job');
  require((await client.call('stop', { taskid: stopped })).code === 0, 'stop');
  let tries = 0;
  await until(async () => ++tries > 20 ||
    (await Client.signIn(device, 'alice', 'wrong')).signedIn.status === 429);
  writeFileSync(shift, days(-6));
  await until(async () => (await Client.signIn(device, 'alice')).signedIn.status === 200, 10);
  require(tries <= 20 && (await client.tasks()).length === 0, `${tries} tries, or tasks are left`);
  await isCalm({ lists: 2 });
  await device.remove();
  return 'set back by three days and three more among running, stopped, killed and finished jobs';
}

export async function storeIsDamaged() {
  const device = await Device.start({ isolated: isRoot });
  const isCalm = await calmCheck(device);
  const client = await Client.signIn(device, 'alice');
  const file = device.at('users/alice/store.db');
  const noise = (bytes, from, to, count) => {
    for (let times = 0; times < count; ++times) {
      bytes[from + random(to - from)] = random(256);
    }
    return bytes;
  };
  const damages = {  // what each does to the bytes of a file, and whether that is sure to be seen
    garbage: [file, (bytes) => noise(bytes, 0, bytes.length, 8 * bytes.length), true],
    header: [file, (bytes) => noise(bytes, 0, 16, 99), true],
    truncated: [file, (bytes) => bytes.subarray(0, 4096 + random(bytes.length - 8191)), true],
    empty: [file, (bytes) => bytes.subarray(0, 0), false],
    bytes: [file, (bytes) => noise(bytes, 0, bytes.length, 1 + random(400)), false],
    log: [`${file}-wal`, (bytes) => noise(bytes, 0, bytes.length, 99), false],
    'half a log': [`${file}-wal`, (bytes) => bytes.subarray(0, random(bytes.length)), false],
  };
  const counts = {};
  for (let round = 0; round < scale(10, 1); ++round) {
    for (const [name, [damaged, damage, isSeen]] of Object.entries(damages)) {
      do {  // until the log has been written back
        await runJob(client, ['/photo/cat.jpg'], '/photo/cat.zip');
        await until(() => device.processes().length === 1);
      } while (statSync(file).size < 8192);
      writeFileSync(damaged, damage(readFileSync(damaged)));
      if (isSeen) {  // what is in the log would stand for it
        rmSync(`${file}-wal`);
      }
      const [inode, logged] = [statSync(file).ino, device.log.length];
      // What is looked at first may meet the damage on its way.
      await until(async () => (await client.ask('/tasks')).status === 200 &&
        (await client.call('status', { taskid: 'none' })).code === 599);
      await until(() => runJob(client, ['/photo/cat.jpg'], '/photo/cat.zip').then(() => true,
        () => false));
      // A worker may wait for data that went with the store, as long as it is to.
      await until(() => device.processes().length === 1, longest + 5);
      const said = () =>
        device.log.slice(logged).match(/is set aside as .*store\.db\.damaged-/g)?.length ?? 0;
      const isAside = statSync(file).ino !== inode;
      // A worker that sets it aside as its last act may be gone before its line is read.
      await until(() => said() > 0 || !isAside).catch(() => {});
      require(said() === (isAside ? 1 : 0) && (isAside || !isSeen),
        `${name}: ${said()} lines, ${isAside ? '' : 'not '}set aside: ${device.log.slice(logged)}`);
      counts[name] = (counts[name] ?? 0) + said();
    }
  }
  await isCalm();
  require(readdirSync(device.at('users/alice')).length > 1, 'nothing was kept');
  await device.remove();
  return `set aside ${Object.entries(counts).map((each) => each.join(' ')).join(', ')}`;
}
