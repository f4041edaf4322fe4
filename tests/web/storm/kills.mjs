// Processes of the device killed at any moment.
import { execFileSync } from 'node:child_process';
import { chownSync, readFileSync, writeFileSync } from 'node:fs';

import { Client, Device, isRoot, listing, until } from '../device.mjs';
import { addEndless, calmCheck, follow, isFailure, kill, moment, processes, random, require, runJob,
  scale } from './tools.mjs';

const signIn = (device) => until(() => Client.signIn(device, 'alice').catch(() => null));

// What "status" may answer after processes of one kind were killed. An endless job goes on, or has
// failed; one of the shorter ones may have ended and been reported meanwhile.
function isAllowed(kind, isEndless, { code, data }) {
  if (code === 599) {
    return !isEndless;
  }
  const isHit = ['worker', 'archiver', '7z'].includes(kind);
  return code === 0 && (data.errors ? isHit && isFailure(data, '/photo/old.7z')
    : !data.finished || !isEndless);
}

export async function killsAtRandom() {
  const device = await Device.start({ isolated: isRoot });
  const isCalm = await calmCheck(device);
  addEndless(device);
  const archive = device.at('vol1/photo/old.7z');
  execFileSync('7z', ['a', '-bso0', 'old.7z', 'cat.jpg'], { cwd: device.at('vol1/photo') });
  if (isRoot) {
    chownSync(archive, 65001, 65100);
  }
  const old = readFileSync(archive);
  const both = [...new Set(['cat.jpg', ...listing(archive), 'trip'])];
  const rounds = scale(200, 12);
  const jobs = ['worker', 'archiver', '7z'];
  const kinds = [...jobs, 'request', 'front end', 'launcher'];
  const counts = {};
  for (let round = 0; round < rounds; ++round) {
    const kind = kinds[round % kinds.length];
    let client = await signIn(device);
    const close = await follow(client);
    const isEndless = random(2) === 0;
    const taskid = await client.start([isEndless ? '/photo/endless' : '/photo/trip'],
      '/photo/old.7z', { format: '7z', level: 'store' });
    await moment(120);
    const polling = client.call('status', { taskid }).catch(() => null);
    await moment(4);
    const killed = processes(device, kind).slice(0, 1 + random(2)).filter(({ pid }) => kill(pid));
    counts[kind] = (counts[kind] ?? 0) + killed.length;
    const polled = await polling;
    await close();
    require(polled === null || polled.code === undefined ||
      isAllowed(kind, isEndless, polled), { kind, isEndless, polled });
    if (kind === 'launcher') {
      await device.ended;
      await device.serve();
    }
    if (['launcher', 'front end'].includes(kind)) {  // else the moment after the kill counts
      client = await signIn(device);
    }
    const mustFail = isEndless && killed.length > 0 && jobs.includes(kind);
    const isReported = polled?.data?.finished ?? false;
    await until(async () => {
      const answer = await client.call('status', { taskid });
      require(isAllowed(kind, isEndless && !isReported, answer), { kind, isEndless, answer });
      return !mustFail || isReported || answer.data.errors;
    });
    require((await client.call('stop', { taskid })).code === 0, 'stop');
    await until(() => jobs.every((each) => processes(device, each).length === 0));
    execFileSync('/usr/bin/7z', ['t', archive]);
    require(listing(archive).every((name) => both.includes(name.split('/')[0])) &&
      listing(archive).includes('cat.jpg'), `${listing(archive)}`);
    writeFileSync(archive, old);
  }
  // What an archiver that was killed has left, the next one of the same folder removes.
  const client = await signIn(device);
  await runJob(client, ['/photo/cat.jpg'], '/photo/last.7z');
  await isCalm({ lists: rounds });
  require((await client.tasks()).length === 0, 'tasks are left');
  require(!device.log.includes('set aside'), 'a store was damaged');
  await device.remove();
  const killed = Object.entries(counts).map((each) => each.join(' ')).join(', ');
  return `${rounds} rounds; killed ${killed}`;
}
