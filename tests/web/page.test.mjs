// The page in a browser. A screenshot of each state stands in the build's folder.
import assert from 'node:assert/strict';
import { chownSync, mkdirSync, truncateSync, writeFileSync } from 'node:fs';
import { createRequire } from 'node:module';
import path from 'node:path';
import { after, before, test } from 'node:test';
import { chromium } from 'playwright-core';

import { Client, Device, build, isRoot, text, until } from './device.mjs';

const axe = text(createRequire(import.meta.url).resolve('axe-core/axe.min.js'));
const shots = path.join(build, 'screenshots');
const markup = '<img src=x onerror=alert(1)>.txt';
const flags = ['--no-sandbox', '--disable-gpu', '--disable-quic', '--no-first-run',
  '--disable-background-networking', '--disable-component-update', '--disable-sync'];
let device;
let browser;

before(async () => {
  mkdirSync(shots, { recursive: true });
  device = await Device.start({ isolated: isRoot });
  if (isRoot) {
    device.inside('mount -t tmpfs -o mode=0755,uid=65001,size=4m full "$1/vol2/video"');
  }
  addFile('vol1/photo/endless');
  truncateSync(device.at('vol1/photo/endless'), 2 ** 40);
  browser = await chromium.launch({ executablePath: '/usr/bin/chromium', args: flags });
});
after(async () => {
  await browser.close();
  await device.remove();
});

function addFile(file, content = 'x') {
  writeFileSync(device.at(file), content);
  if (isRoot) {
    chownSync(device.at(file), 65001, 65100);
  }
}

let lastPage;

// A test that leaves behind what it saw when it fails.
function check(name, options, body = options) {
  test(name, body === options ? {} : options, () => body().catch(async (error) => {
    await lastPage.screenshot({ path: path.join(shots, 'failed-test.png') });
    const alice = await Client.signIn(device, 'alice');
    console.error(device.log, JSON.stringify(await alice.tasks()));
    throw error;
  }));
}

// A page of a new visitor; anything that a script throws, or a dialog of its own, fails the test.
async function visit(options = {}) {
  const context = await browser.newContext({ viewport: { width: 1280, height: 800 }, ...options });
  const page = await context.newPage();
  page.setDefaultTimeout(30000);
  lastPage = page;
  page.faults = [];
  page.on('pageerror', (error) => page.faults.push(error.message));
  page.on('dialog', (dialog) => { page.faults.push(dialog.message()); dialog.dismiss(); });
  await page.goto(device.url);
  return page;
}

async function signIn(page, user = 'alice') {
  await page.getByLabel('User name').fill(user);
  await page.getByRole('textbox', { name: 'Password' }).fill(user);
  await page.getByRole('button', { name: 'Sign in' }).click();
  await page.getByRole('grid').waitFor();
  return page;
}

async function open(page, ...names) {
  for (const name of names) {
    await row(page, name).dblclick();
    await page.getByRole('heading', { level: 1, name }).waitFor();
  }
}

const row = (page, name) => page.getByRole('row')
  .filter({ has: page.getByText(name, { exact: true }) });
const task = (page, dest) => page.getByRole('list', { name: 'Tasks' }).locator('> li')
  .filter({ has: page.getByText(dest, { exact: true }) });

async function compress(page, fields) {
  await page.getByRole('button', { name: 'Compress…' }).click();
  const dialog = page.getByRole('dialog');
  for (const [label, value] of Object.entries(fields)) {
    const field = dialog.getByLabel(label, { exact: true });
    await (['Format', 'Level'].includes(label) ? field.selectOption(value) : field.fill(value));
  }
  await dialog.getByRole('button', { name: 'Compress' }).click();
  return dialog;
}

async function noFaults(page, state) {
  await page.screenshot({ path: path.join(shots, `${state}.png`) });
  await page.evaluate(axe);
  const { violations } = await page.evaluate(() => globalThis.axe.run());
  const serious = violations.filter(({ impact }) => ['serious', 'critical'].includes(impact));
  assert.deepEqual(serious.map(({ id, nodes }) => `${id}: ${nodes[0].html}`), [], state);
  assert.deepEqual(page.faults, [], state);
  const { scrollWidth, clientWidth } = await page.evaluate(() => document.documentElement);
  assert.ok(!(scrollWidth > clientWidth), `${state} scrolls sideways`);
}

check('signing in, and what a wrong password says', async () => {
  const page = await visit();
  await noFaults(page, 'sign-in');
  await page.getByLabel('User name').fill('alice');
  await page.getByRole('textbox', { name: 'Password' }).fill('wrong');
  await page.keyboard.press('Enter');
  await page.getByText(/wrong user name or password/i).waitFor();
  await signIn(page);
  await noFaults(page, 'shared-folders');
  await page.reload();
  await page.getByRole('grid').waitFor();
  await page.getByRole('button', { name: 'Sign out' }).click();
  await page.getByLabel('User name').waitFor();
});

check('what is selected in two shared folders comes into one archive', async () => {
  const page = await signIn(await visit());
  await open(page, 'photo', 'trip');
  await row(page, 'day1').click();
  await row(page, '日の出.jpg').click({ modifiers: ['Control'] });
  await page.getByRole('button', { name: 'Add to tray' }).click();
  await page.getByRole('link', { name: 'Shared folders' }).click();
  await open(page, 'music');
  await row(page, 'album').click();
  await noFaults(page, 'selected');
  await compress(page, { Folder: '/photo', 'Archive name': 'both.7z', Format: '7z',
    Level: 'store' });
  await task(page, '/photo/both.7z').getByText('Done').waitFor();
  await noFaults(page, 'done');
  assert.deepEqual(device.names('vol1/photo/both.7z'), [
    'music/album', 'music/album/01 Été.mp3', 'music/album/02.mp3', 'photo/trip/day1',
    'photo/trip/day1/a.jpg', 'photo/trip/day1/b, the second.jpg', 'photo/trip/日の出.jpg']);
  await task(page, '/photo/both.7z').getByRole('button', { name: /Dismiss/ }).click();
  await task(page, '/photo/both.7z').waitFor({ state: 'detached' });
  assert.deepEqual(await (await Client.signIn(device, 'alice')).tasks(), []);
});

check('the dialog says at the field what is wrong with it', async () => {
  const page = await signIn(await visit());
  await open(page, 'photo');
  await row(page, 'cat.jpg').click();
  const rows = [['Archive name', ''], ['Archive name', 'a/b'], ['Archive name', 'ü'.repeat(130)],
    ['Password (optional)', 'pä']];
  for (const [label, value] of rows) {
    const dialog = await compress(page, { 'Archive name': 'x.zip', [label]: value });
    const field = dialog.getByLabel(label, { exact: true });
    assert.equal(await field.getAttribute('aria-invalid'), 'true', `${label} ${value}`);
    await noFaults(page, 'dialog');
    await page.keyboard.press('Escape');
  }
});

check('a running job is there after a reload and in a second window, and stops at a click',
  async () => {
    const page = await signIn(await visit());
    await open(page, 'photo');
    await row(page, 'endless').click();
    await compress(page, { 'Archive name': 'endless.7z', Format: '7z' });
    const job = task(page, '/photo/endless.7z');
    await job.getByText(/^1 TB/).waitFor();
    await noFaults(page, 'running');
    await page.reload();
    await job.getByRole('progressbar').waitFor();
    const second = await page.context().newPage();
    await second.goto(device.url);
    await task(second, '/photo/endless.7z').getByRole('button', { name: /Stop/ }).click();
    await job.waitFor({ state: 'detached' });
    await until(() => !device.processes().some(({ args }) => args.includes('.kavo-7z-')));
  });

check('a failure is told in words', { skip: !isRoot && 'a full volume takes root' }, async () => {
  const page = await signIn(await visit({ colorScheme: 'dark' }));
  await open(page, 'photo');
  await row(page, 'trip').click();
  await compress(page, { Folder: '/video', 'Archive name': 'full.zip', Level: 'store' });
  await task(page, '/video/full.zip').getByText(/no space left on device/).waitFor();
  await noFaults(page, 'failed-dark');
});

check('a name that is all markup is shown as it is, everywhere', async () => {
  addFile(`vol1/photo/${markup}`);
  const page = await signIn(await visit());
  await open(page, 'photo');
  await row(page, markup).click();
  await page.getByRole('button', { name: 'Add to tray' }).click();
  await compress(page, { 'Archive name': `${markup}.zip` });
  await task(page, `/photo/${markup}.zip`).getByText('Done').waitFor();
  await row(page, `${markup}.zip`).waitFor();
  // A job that nobody follows ends with a notification; its argument comes HTML-encoded.
  const other = await Client.signIn(device, 'alice');
  await other.start([`/photo/${markup}`], `/photo/<b>${markup}&amp;.zip`);
  await page.getByRole('region', { name: 'Notices' }).getByText(`<b>${markup}&amp;.zip`).waitFor();
  await noFaults(page, 'markup');
});

check('users do not see each other\'s tasks', async () => {
  const alice = await Client.signIn(device, 'alice');
  const taskid = await alice.start(['/photo/endless'], '/photo/alices.7z', { format: '7z' });
  const page = await signIn(await visit(), 'bob');
  await open(page, 'photo');
  assert.equal(await page.getByText('alices.7z').count(), 0);
  await alice.call('stop', { taskid });
});

check('the keyboard alone does, on a phone\'s width', async () => {
  const page = await visit({ viewport: { width: 360, height: 740 } });
  const press = async (...keys) => { for (const key of keys) { await page.keyboard.press(key); } };
  await page.getByLabel('User name').waitFor();
  await page.getByLabel('User name').focus();
  await page.keyboard.type('bob');
  await press('Tab');
  await page.keyboard.type('bob');
  await press('Enter');
  await page.getByRole('grid').waitFor();
  await until(async () => {
    await press('Tab');
    return page.evaluate(() => Boolean(document.activeElement.closest('#grid-body')));
  });
  await press('End', 'ArrowUp', 'ArrowUp', 'Home', 'ArrowDown', 'ArrowDown', 'ArrowDown');
  await until(async () => (await page.evaluate(() => document.activeElement.textContent))
    .includes('photo') || (await press('ArrowUp')), 5);
  await press('Enter');
  await page.getByRole('heading', { level: 1, name: 'photo' }).waitFor();
  await until(async () => (await page.evaluate(() => document.activeElement.textContent))
    .includes('cat.jpg') || (await press('ArrowDown')), 5);
  await press('Space');
  await noFaults(page, 'phone');
  await until(async () => {
    await press('Shift+Tab');
    return page.evaluate(() => document.activeElement.id === 'compress');
  });
  await press('Enter');
  await page.getByRole('dialog').waitFor();
  assert.equal(await page.getByLabel('Code page of names').inputValue(), 'CP932');
  await noFaults(page, 'phone-dialog');
  await press('Enter');
  const bob = await Client.signIn(device, 'bob');
  await until(async () => (await bob.tasks()).some((each) => each.state === 'finished'));
  assert.deepEqual(device.names('vol1/photo/cat.zip'), ['cat.jpg']);
});
