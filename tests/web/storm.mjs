// Load and faults on a served device: storm.mjs [--short] [SEED]. One line for each storm; the exit
// status tells whether all held. The seed of a run is printed, so that it can be repeated.
import { execFileSync } from 'node:child_process';
import { existsSync, readFileSync, readdirSync, readlinkSync, truncateSync, writeFileSync,
  chownSync } from 'node:fs';

import { Client, Device, isRoot, listing, until } from './device.mjs';

const isShort = process.argv.includes('--short');
const seed = Number(process.argv.slice(2).find((each) => /^\d+$/.test(each)) ?? Date.now() % 1e6);
let state = seed;

// Mulberry32, so that a seed gives the same storm everywhere.
function random(below) {
  state = (state + 0x6d2b79f5) | 0;
  let mixed = Math.imul(state ^ (state >>> 15), 1 | state);
  mixed = (mixed + Math.imul(mixed ^ (mixed >>> 7), 61 | mixed)) ^ mixed;
  return ((mixed ^ (mixed >>> 14)) >>> 0) % below;
}
const pick = (list) => list[random(list.length)];
const scale = (full, short) => (isShort ? short : full);

function require(holds, what) {
  if (!holds) {
    throw new Error(what);
  }
}

const median = (values) => values.sort((one, other) => one - other)[values.length >> 1];

async function timed(body) {
  const begin = performance.now();
  await body();
  return performance.now() - begin;
}

function addEndless(device) {
  writeFileSync(device.at('vol1/photo/endless'), '');
  truncateSync(device.at('vol1/photo/endless'), 2 ** 40);
  if (isRoot) {
    chownSync(device.at('vol1/photo/endless'), 65001, 65100);
  }
}

const listFiles = () => readdirSync('/tmp').filter((name) => name.startsWith('lumozip'));

// What no storm may leave behind: processes but the launcher and its front end, lists, hidden folders.
async function isCalm(device, listsBefore) {
  const busy = () => device.processes()
    .filter(({ pid, args }) => pid !== device.process.pid && !args.startsWith('kavo-web'));
  await until(() => busy().length === 0).catch(() => {
    throw new Error(`left behind: ${busy().map(({ args }) => args).join('; ')}`);
  });
  const lists = listFiles().filter((name) => !listsBefore.includes(name));
  require(lists.length === 0, `lists left behind: ${lists}`);
}

async function manyJobsAtOnce() {
  const device = await Device.start();
  const lists = listFiles();
  const count = scale(200, 24);
  const clients = await Promise.all(['alice', 'bob', 'carol']
    .map((user) => Client.signIn(device, user)));
  const idle = median(await series(21, () => timed(() => clients[0].tasks())));
  const jobs = await Promise.all(Array.from({ length: count }, async (_, index) => {
    const client = clients[index % 3];
    const dest = `/home/${index}.${index % 2 ? 'zip' : '7z'}`;
    const taskid = await client.start(['/photo/cat.jpg'], dest,
      { format: index % 2 ? 'zip' : '7z', level: 'store' });
    return { client, taskid, user: ['alice', 'bob', 'carol'][index % 3], dest };
  }));
  const busy = [];
  for (const { client, taskid } of jobs) {
    await until(async () => {
      let answer;
      busy.push(await timed(async () => { answer = await client.call('status', { taskid }); }));
      require(answer.code === 0 && !answer.data.errors, `status: ${JSON.stringify(answer)}`);
      return answer.data.finished;
    }, 120);
  }
  for (const { user, dest } of jobs) {
    const volume = user === 'carol' ? 'vol2' : 'vol1';
    const names = listing(device.at(volume, 'homes', user, dest.slice(6)));
    require(names.join() === 'cat.jpg', `${dest} of ${user} holds ${names}`);
  }
  for (const client of clients) {
    require((await client.tasks()).length === 0, 'tasks are left');
  }
  await isCalm(device, lists);
  await device.remove();
  const loaded = median(busy);
  require(loaded < 10 * Math.max(idle, 1), `answers took ${loaded} ms, ${idle} ms when idle`);
  return `${count} jobs; answers took ${loaded.toFixed(1)} ms, ${idle.toFixed(1)} ms when idle`;
}

async function series(count, body) {
  const results = [];
  for (let index = 0; index < count; ++index) {
    results.push(await body(index));
  }
  return results;
}

async function stopsAtAnyMoment() {
  const device = await Device.start();
  addEndless(device);
  const lists = listFiles();
  const client = await Client.signIn(device, 'alice');
  const rounds = scale(1000, 40);
  for (let round = 0; round < rounds; ++round) {
    const source = pick(['/photo/endless', '/photo/cat.jpg', '/photo/trip']);
    const taskid = await client.start([source], '/photo/out.7z', { format: '7z', level: 'store' });
    await new Promise((resolve) => { setTimeout(resolve, random(4) * random(40)); });
    const status = await client.call('status', { taskid });
    require(status.code === 0 && !status.data.errors, `status: ${JSON.stringify(status)}`);
    const stop = await client.call('stop', { taskid });
    require(stop.code === 0, `stop: ${JSON.stringify(stop)}`);
    require((await client.call('status', { taskid })).code === 599, 'the task is still there');
  }
  await isCalm(device, lists);
  const hidden = readdirSync(device.at('vol1/photo')).filter((name) => name.startsWith('.kavo-7z'));
  require(hidden.length === 0, `left behind: ${hidden}`);
  await device.remove();
  return `${rounds} rounds`;
}

// The device's processes of one kind.
function victims(device, kind) {
  const all = execFileSync('ps', ['-eo', 'pid=,ppid=,sid=,args='], { encoding: 'utf8' }).split('\n')
    .map((line) => line.trim().split(/\s+/)).filter((words) => words.length > 3)
    .map(([pid, parent, session, ...args]) => ({ pid: +pid, parent: +parent, session: +session,
      args: args.join(' ') }));
  const launcher = device.process.pid;
  return all.filter(({ pid, parent, session, args }) => ({
    worker: args.includes(device.folder) && pid === session && pid !== launcher,
    archiver: args.includes('-progress') && args.includes(device.folder),
    '7z': args.startsWith('/usr/lib/p7zip') && args.includes(device.folder),
    request: parent === launcher && pid !== session && !args.startsWith('kavo-web'),
    'front end': parent === launcher && args.startsWith('kavo-web'),
    launcher: pid === launcher,
  })[kind]);
}

async function killsAtRandom() {
  const device = await Device.start();
  addEndless(device);
  const rounds = scale(120, 14);
  const old = execFileSync('sh', ['-c', `cd "$1" && 7z a -bso0 old.7z cat.jpg && cat old.7z`, 'sh',
    device.at('vol1/photo')]);
  let killed = 0;
  for (let round = 0; round < rounds; ++round) {
    const kind = pick(['worker', 'archiver', '7z', 'request', 'front end', 'launcher']);
    let client = await until(() => Client.signIn(device, 'alice').catch(() => null));
    const source = pick(['/photo/endless', '/photo/trip']);
    const taskid = await client.start([source], '/photo/old.7z', { format: '7z', level: 'store' });
    await new Promise((resolve) => { setTimeout(resolve, random(120)); });
    const polling = client.call('status', { taskid }).catch(() => null);
    for (const { pid } of victims(device, kind).slice(0, 1 + random(2))) {
      try {
        process.kill(pid, 'SIGKILL');
        killed += 1;
      } catch {
        // It has ended by itself meanwhile.
      }
    }
    await polling;
    if (kind === 'launcher') {
      await device.ended;
      await device.serve();
    }
    client = await until(() => Client.signIn(device, 'alice').catch(() => null));
    const answer = await client.call('status', { taskid });
    require(answer.code === 0 || answer.code === 599, `status: ${JSON.stringify(answer)}`);
    if (kind === 'worker' && source === '/photo/endless' && answer.code === 0) {
      const end = await until(async () => {
        const { code, data } = await client.call('status', { taskid });
        return code === 599 || data.finished ? { code, data } : null;
      });
      require(end.code === 599 || end.data.errors?.[0].code === 1300,
        `a killed worker's end: ${JSON.stringify(end)}`);
    }
    await until(async () => (await client.call('stop', { taskid })).code === 0);
    await until(() => victims(device, '7z').length === 0 && victims(device, 'worker').length === 0);
    require(listing(device.at('vol1/photo/old.7z')).includes('cat.jpg'), 'the archive is not whole');
    writeFileSync(device.at('vol1/photo/old.7z'), old);
  }
  await device.remove();
  return `${killed} processes in ${rounds} rounds`;
}

async function storeIsDamaged() {
  const device = await Device.start();
  const client = await Client.signIn(device, 'alice');
  for (const damage of scale([0, 1, 2, 3, 4, 5, 6, 7], [0, 1])) {
    await client.start(['/photo/cat.jpg'], '/photo/cat.zip');
    await until(() => device.processes().length <= 2);
    const file = device.at('users/alice/store.db');
    const bytes = readFileSync(file);
    for (let count = 0; count < 1 + damage * 40; ++count) {
      bytes[random(damage % 2 ? bytes.length : 100)] = random(256);
    }
    writeFileSync(file, bytes.subarray(0, damage === 3 ? random(bytes.length) : bytes.length));
    await until(async () => {
      const answer = await client.call('status', { taskid: 'x' });
      return answer?.code === 599 && (await client.ask('/tasks')).status === 200;
    });
  }
  await device.remove();
  return 'the device went on';
}

function footprint(pid) {
  const status = readFileSync(`/proc/${pid}/status`, 'utf8');
  const descriptors = readdirSync(`/proc/${pid}/fd`).filter((fd) => {
    try {
      return existsSync(`/proc/${pid}/fd`) && readlinkSync(`/proc/${pid}/fd/${fd}`);
    } catch {
      return false;
    }
  });
  return { kilobytes: Number(status.match(/VmRSS:\s+(\d+)/)[1]), descriptors: descriptors.length };
}

async function longUse() {
  const device = await Device.start();
  const use = async () => {
    const client = await Client.signIn(device, pick(['alice', 'bob', 'carol']));
    const events = await fetch(`${device.url}/events`, { headers: { Cookie: client.cookie } });
    await events.body.cancel();
    await client.ask('/files?path=/photo');
    const taskid = await client.start(['/photo/cat.jpg'], '/home/c.zip', { level: 'store' });
    await until(async () => {
      const { code, data } = await client.call('status', { taskid });
      return code !== 0 || data.finished;
    });
    await client.ask('/session', { method: 'DELETE' });
  };
  const pids = [device.process.pid, victims(device, 'front end')[0].pid];
  await series(scale(300, 30), use);
  const before = pids.map(footprint);
  await series(scale(1500, 60), use);
  await until(() => pids.map(footprint)
    .every((now, index) => now.descriptors <= before[index].descriptors + 8));
  const grown = pids.map(footprint).map((now, index) => now.kilobytes - before[index].kilobytes);
  require(Math.max(...grown) < 4096, `grown by ${grown} KiB`);
  await device.remove();
  return `launcher and front end grew by ${grown.join(' and ')} KiB`;
}

const storms = { 'many jobs at once': manyJobsAtOnce, 'stops at any moment': stopsAtAnyMoment,
  'kills at random': killsAtRandom, 'damaged stores': storeIsDamaged, 'long use': longUse };
console.log(`seed ${seed}`);
for (const [name, storm] of Object.entries(storms)) {
  try {
    console.log(`ok    ${name}: ${await storm()}`);
  } catch (error) {
    console.log(`FAILS ${name}: ${error.message}`);
    process.exitCode = 1;
  }
}
process.exit();
