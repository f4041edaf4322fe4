// Load: many jobs at once, jobs that are stopped, and hours of use.
import { execFileSync } from 'node:child_process';
import { existsSync } from 'node:fs';
import path from 'node:path';
import { Worker } from 'node:worker_threads';

import { Client, Device, isRoot, until } from '../device.mjs';
import { addEndless, addZeros, calmCheck, ended, follow, footprints, isShort, moment, pick, quantile,
  random, require, runJob, scale, users } from './tools.mjs';

const signIn = (device) => Promise.all(users.map((user) => Client.signIn(device, user)));
const archiveOf = (device, user, dest) =>
  device.at(user === 'carol' ? 'vol2' : 'vol1', 'homes', user, path.basename(dest));

// The names of an archive's files, each with the checksum of its content.
function contents(archive) {
  const listed = execFileSync('/usr/bin/7z', ['l', '-ba', '-slt', archive], { encoding: 'utf8' });
  const files = listed.matchAll(/Path = (.*)[^]*?CRC = (\w+)/g);
  return new Map([...files].map(([, name, checksum]) => [name, checksum]));
}

// Of answers, what the later asks for.
const summary = (answers, part) => quantile(answers.map(({ took }) => took), part);

export async function manyJobsAtOnce() {
  const device = await Device.start({ isolated: isRoot });
  const isCalm = await calmCheck(device);
  for (const name of ['photo/zeros', 'music/zeros']) {
    addZeros(device, `vol1/${name}`, 2 ** 24);  // keep the archiver at work, and little of the disk
  }
  const sources = [['/photo/zeros'], ['/photo/cat.jpg'], ['/photo/zeros', '/music/zeros']];
  execFileSync('7z', ['a', '-bso0', '-mx0', '../reference.7z', 'photo/zeros', 'photo/cat.jpg',
    'music/zeros'], { cwd: device.at('vol1') });
  const reference = contents(device.at('reference.7z'));
  const clients = await signIn(device);
  const prober = new Worker(new URL('./prober.mjs', import.meta.url),
    { workerData: { url: device.url, cookie: clients[0].cookie } });
  const told = () => new Promise((resolve) => { prober.once('message', resolve); });
  const idle = summary(await told(), 0.5);
  const jobs = await Promise.all(Array.from({ length: scale(200, 24) }, async (_, index) => {
    const [client, user] = [clients[index % 3], users[index % 3]];
    const paths = sources[(index + Math.floor(index / 3)) % 3];
    const dest = `/home/${index}.${index % 2 ? 'zip' : '7z'}`;
    const params = { format: index % 2 ? 'zip' : '7z', level: 'fastest' };
    return { client, user, paths, dest, taskid: await client.start(paths, dest, params) };
  }));
  const accepted = performance.timeOrigin + performance.now();
  for (const { client, taskid, dest } of jobs) {
    const end = await ended(client, taskid, 120);
    require(!end.errors && end.dest_file_path === dest, end);
  }
  const all = performance.timeOrigin + performance.now() - accepted;
  const answersTold = told();
  prober.postMessage('enough');
  const answers = await answersTold;
  for (const { user, paths, dest } of jobs) {
    const found = contents(archiveOf(device, user, dest));
    const names = paths.map((each) => (paths.length > 1 ? each.slice(1) : path.basename(each)));
    require(found.size === names.length && names.every((name, index) =>
      found.get(name) === reference.get(paths[index].slice(1))), `${dest}: ${[...found]}`);
  }
  for (const client of clients) {
    require((await client.tasks()).length === 0, 'tasks are left');
  }
  await isCalm({ folders: jobs.filter(({ paths }) => paths.length > 1).length });
  await prober.terminate();
  await device.remove();
  // Answers among the starts wait for those, which must not wait for the jobs too.
  const [during, after] = [answers.filter(({ asked }) => asked < accepted),
    answers.filter(({ asked }) => asked >= accepted)];
  const burst = accepted - answers[0].asked;
  // A short run has few answers, and a busy machine's hiccup must not fail it.
  const part = scale(0.95, 0.5);
  const [amid, loaded] = [summary(during, part), summary(after, part)];
  require(loaded < 10 * Math.max(idle, 1), `answers took ${loaded} ms, ${idle} ms when idle`);
  require(isShort || burst < all / 2, `the starts took ${burst} ms, and the jobs after them ${all} ms`);
  return `${jobs.length} jobs; ${100 * part} in 100 answers took up to ${loaded.toFixed(1)} ms beside them, ` +
    `${amid.toFixed(0)} ms in ${burst.toFixed(0)} ms of starts; half ${idle.toFixed(1)} ms, idle`;
}

export async function stopsAtAnyMoment() {
  const device = await Device.start({ isolated: isRoot });
  addEndless(device);
  const isCalm = await calmCheck(device);
  const clients = await signIn(device);
  let left = scale(1000, 60);
  let folders = 0;
  const counts = { running: 0, finished: 0 };
  await Promise.all(clients.map(async (client, index) => {
    const dest = `/home/out${index}.7z`;
    for (; left > 0; --left) {
      const sources = pick([['/photo/endless'], ['/photo/cat.jpg'], ['/photo/trip'],
        ['/photo/trip', '/music/album/02.mp3'], ['/music/album/02.mp3', '/photo/endless']]);
      folders += sources.length > 1 ? 1 : 0;
      const taskid = await client.start(sources, dest, { format: '7z', level: 'store' });
      await moment(pick([1, 10, 40, 150]));
      const { code, data } = await client.call('status', { taskid });
      require(code === 0 && !data.errors && data.dest_file_path === dest &&
        data.progress >= 0 && data.progress <= 1, { code, data });
      counts[data.finished ? 'finished' : 'running'] += 1;
      await moment(pick([1, 10, 40]));
      const stop = await client.call('stop', { taskid });
      require(stop.code === 0 && stop.data === null, stop);
      require((await client.call('status', { taskid })).code === 599, 'the task is still there');
    }
  }));
  await isCalm({ folders });
  users.forEach((user, index) => {
    const archive = archiveOf(device, user, `out${index}.7z`);
    if (existsSync(archive)) {
      execFileSync('/usr/bin/7z', ['t', archive]);
    }
  });
  await device.remove();
  return `${counts.running} jobs in the middle, ${counts.finished} at their end`;
}

// What a user does in some minutes.
async function useDevice(device) {
  const user = pick(users);
  if (random(4) === 0) {
    const { status } = (await Client.signIn(device, user, 'wrong')).signedIn;
    require(status === 401, `a wrong password: ${status}`);
  }
  if (random(4) === 0) {
    await Client.signIn(device, user);  // and never out: it ends when there are too many
  }
  const client = await Client.signIn(device, user);
  const close = await follow(client);
  for (const route of ['/files?path=/', '/files?path=/photo', '/tasks', '/session', '/codes']) {
    require((await client.ask(route)).status === 200, route);
  }
  await runJob(client, ['/photo/cat.jpg'], '/home/c.zip');
  if (random(4) === 0) {
    const taskid = await client.start(['/photo/endless'], '/home/e.zip');
    require((await client.call('stop', { taskid })).code === 0, 'stop');
  }
  await close();
  await client.ask('/session', { method: 'DELETE' });
}

export async function hoursOfUse() {
  const device = await Device.start({ isolated: isRoot });
  const isCalm = await calmCheck(device);
  addEndless(device);
  const times = scale(1500, 25);
  const useOften = async (count) => {
    for (let index = 0; index < count; ++index) {
      await useDevice(device);
    }
  };
  await useOften(scale(300, 15));
  await isCalm();
  const before = footprints(device);
  await useOften(times);
  await isCalm();
  const grown = footprints(device).map((now, index) => now.kilobytes - before[index].kilobytes);
  require(Math.max(...grown) < 1024, `grown by ${grown} KiB`);
  await device.remove();
  return `${times} uses; launcher and front end grew by ${grown.join(' and ')} KiB, no descriptor`;
}
