// What the storms share: chance, jobs, and what a device must not leave behind.
import assert from 'node:assert/strict';
import { execFileSync } from 'node:child_process';
import { readFileSync, rmSync } from 'node:fs';
import { setTimeout as sleep } from 'node:timers/promises';

import { Client, until } from '../device.mjs';

const words = process.argv.slice(2);
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
export const scale = (full, short) => (words.includes('--short') ? short : full);
export const moment = (below) => sleep(random(below));
export const signInAll = (device) => Promise.all(users.map((user) => Client.signIn(device, user)));

// The answer that tells a task's end. It comes once.
export async function ended(client, taskid) {
  const answer = await until(async () => {
    const { code, data } = await client.call('status', { taskid });
    assert.equal(code, 0, 'an unreported task is gone');
    return data.finished && data;
  }, 120);
  assert.equal((await client.call('status', { taskid })).code, 599, 'an end is reported twice');
  return answer;
}

// Of a job that has failed for no reason that has a code, and of one that has ended well.
export const assertFailed = (end, dest) => assert.deepEqual(end.errors, [{ code: 1300, path: dest }]);
export const assertDone = (end, dest) =>
  assert.deepEqual([end.errors, end.dest_file_path], [undefined, dest]);

export async function runJob(client, sources, dest) {
  assertDone(await ended(client, await client.start(sources, dest, { level: 'store' })), dest);
}

// In the end there must be no task, no process of a job or request, no lock but the launcher's, and
// nothing that a job made but folders of links and lists where workers were killed, no more than said.
export function calmCheck(device) {
  const find = (folder, ...tests) => execFileSync('find', [folder, '-ignore_readdir_race', ...tests],
    { encoding: 'utf8' }).split('\n').slice(0, -1);
  const ours = device.isolated ? [] : ['-name', 'lumo*', '-uid', `${process.getuid()}`];
  const inTmp = () => find(device.tmp, '-mindepth', '1', '-maxdepth', '1', ...ours, '-printf', '%f\n');
  const left = () => {
    const inodes = find(device.folder, '!', '-name', 'serve.lock', '-printf', '%i\n');
    const locks = readFileSync('/proc/locks', 'utf8').split('\n')
      .filter((line) => inodes.includes(line.match(/:(\d+) \d+ \w+$/)?.[1]));
    const running = device.processes('worker', 'archiver', '7z', 'request').map(({ args }) => args);
    return [...running, ...locks, ...find(device.folder, '-name', '.kavo-7z-*')].join('; ');
  };
  const before = inTmp();
  return async ({ folders = 0, lists = 0 } = {}) => {
    await until(() => left() === '').catch(() => assert.fail(`left behind: ${left()}`));
    for (const client of await signInAll(device)) assert.deepEqual(await client.tasks(), []);
    const added = inTmp().filter((name) => !before.includes(name));
    const listed = added.filter((name) => find(`${device.tmp}/${name}`, '-type', 'f').length > 0);
    assert.ok(listed.length <= lists && added.length <= folders + lists,
      `${listed.length} lists are left, and ${added.length} folders of links by ${folders} jobs`);
    added.forEach((name) => rmSync(`${device.tmp}/${name}`, { recursive: true }));
  };
}
