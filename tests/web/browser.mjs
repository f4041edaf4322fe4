// The page in a browser, for the tests of it. A screenshot of each state stands in the build's folder.
import assert from 'node:assert/strict';
import { mkdirSync, readFileSync } from 'node:fs';
import path from 'node:path';
import { after, before, test } from 'node:test';
import { chromium } from 'playwright-core';

import { Device, build } from './device.mjs';

const axe = readFileSync(new URL('node_modules/axe-core/axe.min.js', import.meta.url), 'utf8');
const shots = path.join(build, 'screenshots');
const args = ['--no-sandbox', '--disable-gpu', '--disable-quic', '--no-first-run',
  '--disable-background-networking', '--disable-component-update', '--disable-sync'];
const faults = [];  // what scripts throw, and dialogs of their own
export let device;
let browser;
export let page;  // of all tests, as a new one takes its time

before(async () => {
  mkdirSync(shots, { recursive: true });
  device = await Device.start();
  browser = await chromium.launch({ executablePath: '/usr/bin/chromium', args });
  const context = await browser.newContext({ viewport: { width: 1280, height: 800 } });
  page = await context.newPage();
  page.on('pageerror', (error) => faults.push(error.message));
  page.on('dialog', (dialog) => { faults.push(dialog.message()); dialog.dismiss(); });
});
after(() => Promise.all([browser.close(), device.remove()]));

// A test that leaves behind what it saw when it fails.
export const check = (name, body, options) => test(name, options, () => body().catch(async (error) => {
  await page.screenshot({ path: path.join(shots, 'failed-test.png') });
  console.error(device.log);
  throw error;
}));

export const button = (name) => page.getByRole('button', { name });
export const row = (name) => page.getByRole('row').filter({ has: page.getByText(name, { exact: true }) });
export const task = (dest, of = page) => of.getByRole('list', { name: 'Tasks' }).locator('> li')
  .filter(dest && { has: of.getByText(dest, { exact: true }) });
export const shows = (title) => page.getByRole('grid', { name: `Contents of ${title}` }).waitFor();

export async function signIn(user, password = user) {
  await page.getByLabel('User name').fill(user);
  await page.getByRole('textbox', { name: 'Password' }).fill(password);
  await button('Sign in').click();
}

// Comes afresh to a folder, as a user who is signed in, or else as nobody.
export async function visit(user, folder = '') {
  await page.context().clearCookies();
  await page.request.post(`${device.url}/session`, { data: { user, password: user } });
  await page.goto(`${device.url}/codes`);  // of the same site, so that nothing is kept
  await page.evaluate(() => { localStorage.clear(); sessionStorage.clear(); });
  await page.goto(`${device.url}/#${folder}`);
  await (user ? shows(path.basename(folder)) : button('Sign in').waitFor());
}

export async function compress(fields) {
  await button('Compress…').click();
  const dialog = page.getByRole('dialog');
  for (const [label, value] of Object.entries(fields)) {
    const field = dialog.getByLabel(label, { exact: true });
    await (['Format', 'Level'].includes(label) ? field.selectOption(value) : field.fill(value));
  }
  await dialog.getByRole('button', { name: 'Compress' }).click();
}

export async function noFaults(state) {
  await page.screenshot({ path: path.join(shots, `${state}.png`) });
  await page.evaluate(() => 'axe' in globalThis) || await page.evaluate(axe);
  const { violations } = await page.evaluate(() => globalThis.axe.run());
  assert.deepEqual(violations.map(({ id, nodes }) => `${id}: ${nodes[0].html}`), [], state);
  assert.deepEqual(faults, [], state);
  assert.ok(await page.evaluate(() => document.documentElement.scrollWidth <= innerWidth), state);
}
