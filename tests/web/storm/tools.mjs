// What the storms share: chance, statistics, jobs, and what a device must not leave behind.
import { execFileSync } from 'node:child_process';
import { chownSync, readFileSync, readdirSync, rmSync, truncateSync, writeFileSync } from 'node:fs';
import path from 'node:path';

import { isRoot, until } from '../device.mjs';

const words = process.argv.slice(2);
export const isShort = words.includes('--short');
export const seed = Number(words.find((each) => /^\d+$/.test(each)) ?? Date.now() % 1e6);
export const names = words.filter((each) => !/^(--short|\d+)$/.test(each));
export const users = ['alice', 'bob', 'carol'];
let state = seed;

// Mulberry32, so that a seed gives the same storm everywhere.
export function random(below) {
  state = (state + 0x6d2b79f5) | 0;
  let mixed = Math.imul(state ^ (state >>> 15), 1 | state);
  mixed = (mixed + Math.imul(mixed ^ (mixed >>> 7), 61 | mixed)) ^ mixed;
  return ((mixed ^ (mixed >>> 14)) >>> 0) % below;
}
export const pick = (list) => list[random(list.length)];
export const scale = (full, short) => (isShort ? short : full);
export const moment = (below) => new Promise((resolve) => { setTimeout(resolve, random(below)); });

export function require(holds, what) {
  if (!holds) {
    throw new Error(typeof what === 'string' ? what : JSON.stringify(what));
  }
}

// The value that so large a part of the values does not exceed.
export const quantile = (values, part) => [...values].sort((one, other) => one - other)[
  Math.min(values.length - 1, Math.floor(values.length * part))];

// A sparse file of zeros that every user may read.
export function addZeros(device, name, size) {
  writeFileSync(device.at(name), '');
  truncateSync(device.at(name), size);
  if (isRoot) {
    chownSync(device.at(name), 65001, 65100);
  }
}
export const addEndless = (device) => addZeros(device, 'vol1/photo/endless', 2 ** 40);

// The answer that tells a task's end. It comes once.
export async function ended(client, taskid, seconds = 60) {
  const answer = await until(async () => {
    const { code, data } = await client.call('status', { taskid });
    require(code === 0, `an unreported task is gone: ${code}`);
    return data.finished && data;
  }, seconds);
  require((await client.call('status', { taskid })).code === 599, 'an end is reported twice');
  return answer;
}

// The one error item of a job that has failed for no reason that has a code.
export const isFailure = (end, dest) =>
  JSON.stringify(end.errors) === `[{"code":1300,"path":"${dest}"}]`;

// Opens an event stream, so that what jobs log reaches the device's log; returns what closes it.
export async function follow(client) {
  const headers = { Cookie: client.cookie };
  const { body } = await fetch(`${client.device.url}/events`, { headers });
  return () => body.cancel().catch(() => {});
}

// A job that must end well.
export async function runJob(client, sources, dest, params = { level: 'store' }) {
  const end = await ended(client, await client.start(sources, dest, params));
  require(!end.errors, end);
}

// The device's processes of one kind; those of a job lead a process group or are in one that does.
export function processes(device, kind) {
  const launcher = device.process.pid;
  const is = {
    worker: ({ pid, group, args }) =>
      pid === group && pid !== launcher && args.includes(device.folder),
    archiver: ({ args }) => args.includes('-progress') && args.includes(device.folder),
    '7z': ({ args }) => args.startsWith('/usr/lib/p7zip') && args.includes(device.folder),
    request: ({ pid, parent, group, args }) => parent === launcher && pid !== group &&
      !args.startsWith('kavo-web'),
    'front end': ({ parent, args }) => parent === launcher && args.startsWith('kavo-web'),
    launcher: ({ pid }) => pid === launcher,
  }[kind];
  return execFileSync('ps', ['-eo', 'pid=,ppid=,pgid=,args='], { encoding: 'utf8' }).split('\n')
    .map((line) => line.trim().match(/^(\d+) +(\d+) +(\d+) (.*)$/)).filter((match) => match)
    .map(([, pid, parent, group, args]) => ({ pid: +pid, parent: +parent, group: +group, args }))
    .filter(is);
}

export function kill(pid, signal = 'SIGKILL') {
  try {
    process.kill(pid, signal);
    return true;
  } catch {
    return false;  // it has ended by itself meanwhile
  }
}

// Memory and descriptors of the launcher and of the front end.
export function footprints(device) {
  return [device.process.pid, processes(device, 'front end')[0]?.pid].map((pid) => ({
    kilobytes: Number(readFileSync(`/proc/${pid}/status`, 'utf8').match(/VmRSS:\s+(\d+)/)[1]),
    descriptors: readdirSync(`/proc/${pid}/fd`).length,
  }));
}

const staged = (device) => readdirSync(device.tmp).filter((name) => name.startsWith('lumozip'));

function filesBelow(device, ...tests) {
  return execFileSync('find', [device.folder, ...tests], { encoding: 'utf8' }).split('\n')
    .filter((line) => line);
}

// A list file, or a staging folder with more in it than links.
function isLeft(device, name) {
  return execFileSync('find', [path.join(device.tmp, name), '-type', 'f']).length > 0;
}

// Of a device that nobody has asked yet. In the end nothing more may be there: no process, list,
// hidden folder, lock but the launcher's, or descriptor. Folders of links are left on purpose, as
// many as jobs have made, and lists where workers were killed.
export async function calmCheck(device) {
  const before = staged(device);
  const descriptors = () => footprints(device).map((each) => each.descriptors).join();
  const idle = descriptors();
  const busy = () => device.processes().filter(({ pid }) => pid !== device.process.pid);
  const added = () => staged(device).filter((name) => !before.includes(name));
  const locks = () => {
    const inodes = filesBelow(device, '!', '-name', 'serve.lock', '-printf', '%i\n');
    return readFileSync('/proc/locks', 'utf8').split('\n')
      .filter((line) => inodes.includes(line.match(/:(\d+) \d+ \w+$/)?.[1]));
  };
  const left = () => [...busy().map(({ args }) => args), ...locks(),
    ...filesBelow(device, '-name', '.kavo-7z-*'),
    ...(descriptors() === idle ? [] : [`descriptors ${descriptors()} after ${idle}`])];
  return async ({ folders = 0, lists = 0 } = {}) => {
    await until(() => left().length === 0).catch(() => {
      throw new Error(`left behind: ${left().join('; ')}`);
    });
    const listed = added().filter((name) => isLeft(device, name));
    require(listed.length <= lists && added().length <= folders + lists,
      `${listed.length} lists are left, and ${added().length} folders of links by ${folders} jobs`);
    added().forEach((name) => rmSync(path.join(device.tmp, name), { recursive: true }));
  };
}
