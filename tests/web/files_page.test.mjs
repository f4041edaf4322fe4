// The page's list of files in a browser: large folders, finding and choosing, small screens.
import assert from 'node:assert/strict';

import { button, check, compress, device, noFaults, page, row, shows, task, visit } from './browser.mjs';
import { until } from './device.mjs';

const rows = () => page.locator('#grid-body .row');
const names = () => rows().evaluateAll((all) => all.map((each) => each.getAttribute('aria-label')));
const active = () => page.evaluate(() => document.activeElement.getAttribute('aria-label'));
const announced = (text) => page.locator('#announcer').getByText(text).last().waitFor({ state: 'attached' });
const press = async (...keys) => { for (const key of keys) await page.keyboard.press(key); };

check('a large folder says that it is coming, keeps few rows in the page, and is counted whole', async () => {
  device.inside('mkdir "$1/vol1/photo/many" && cd "$1/vol1/photo/many" && seq -f "file%.0f" 10000 | xargs touch');
  await visit('alice', '/photo');
  const held = new Promise((resolve) => { page.route(/many$/, resolve, { times: 1 }); });
  await row('many').dblclick();
  const late = await held;
  await page.getByText('many…').waitFor();
  await noFaults('opening');
  await late.continue();
  await shows('many');
  assert.deepEqual((await names()).slice(0, 3), ['file1', 'file2', 'file3']);
  const nodes = () => page.evaluate(() => document.querySelectorAll('*').length);
  const [atFirst] = [await nodes(), await press('End')];
  await row('file10000').waitFor();
  assert.equal(await row('file10000').getAttribute('aria-rowindex'), '10001');
  assert.equal(await page.getByRole('grid').getAttribute('aria-rowcount'), '10001');
  await page.evaluate(() => scrollTo(0, document.documentElement.scrollHeight / 2));
  await row('file5000').waitFor();
  assert.ok(await nodes() < atFirst + 400);  // a row has ten
  await press('Control+a');
  await announced('10,000 items selected');
  await button('Compress…').click();
  await page.getByRole('heading', { name: 'Compress 1 item' }).waitFor();
  await page.locator('#compress-size').getByText('1 folder, 10,000 files').waitFor();
  await press('Escape');
  await page.reload();
  await shows('many');
  assert.deepEqual(await page.evaluate(() => performance.getEntriesByType('resource')
    .filter(({ name, transferSize }) => transferSize > 0 && /\.(js|css|svg)$/.test(name)).map(({ name }) => name)), []);
});

check('the list is sorted as people count, filtered, gone through by typing, and has a menu', async () => {
  device.inside(`mkdir "$1/vol1/photo/mixed" && cd "$1/vol1/photo/mixed" && mkdir Zoo && touch file10 File2 Éclair .dot
    && head -c 5000 /dev/zero >eclipse && touch -d 2001-01-01 file10 && chown -R 65001:65100 .`.replace('\n', ' '));
  await visit('alice', '/photo/mixed');
  assert.deepEqual(await names(), ['Zoo', 'Éclair', 'eclipse', 'File2', 'file10']);
  const cases = [['Size', 'eclipse'], ['Modified', 'file10', 2], ['Name', 'Éclair']];
  for (const [column, first, clicks = 1] of cases) {
    for (let each = 0; each < clicks; ++each) await button(column).click();
    assert.equal((await names())[1], first, column);
    assert.match(await page.getByRole('columnheader', { name: column }).getAttribute('aria-sort'), /scending/);
  }
  await page.getByLabel('Filter by name').fill('ECL');
  assert.deepEqual(await names(), ['Éclair', 'eclipse']);
  await page.getByLabel('Filter by name').fill('nothing');
  await page.getByText('Nothing to show').waitFor();
  await page.getByLabel('Filter by name').fill('');
  await page.getByLabel('Hidden files').check();
  assert.equal((await names())[1], '.dot');
  device.add('vol1/photo/mixed/late');
  await button('Refresh').click();
  await row('late').waitFor();
  await row('late').click();
  await page.keyboard.type('ecl');
  assert.equal(await active(), 'Éclair');
  await page.keyboard.type('i');
  assert.equal(await active(), 'eclipse');
  await press('Shift+F10');
  await page.getByRole('menu').waitFor();
  await noFaults('menu');
  await press('a', 'Enter');
  await page.getByRole('group', { name: 'Actions' }).getByText('1 in the tray').waitFor();
  await row('eclipse').click({ button: 'right' });
  assert.deepEqual(await page.getByRole('menuitem').allTextContents(), ['Compress…', 'Add to tray', 'Download']);
  const [download] = await Promise.all([page.waitForEvent('download'), press('d', 'Enter')]);
  assert.equal(download.suggestedFilename(), 'eclipse');
});

check('a folder is picked by keyboard, and the tray is short', async () => {
  await visit('alice', '/photo/trip');
  for (const name of ['day1', '日の出.jpg']) await row(name).click({ modifiers: ['Control'] });
  await button('Add to tray').click();
  await page.locator('#tray-details').getByText('2 items').waitFor();
  await page.locator('#tray-details').getByText('1 folder, 3 files, 9 MB').waitFor();
  await button('Compress…').click();
  await page.locator('#compress-size').getByText('1 folder, 3 files, 9 MB').waitFor();
  await page.getByLabel('Archive name').fill('picked.zip');
  await button('Browse').press('Enter');
  const picker = page.getByRole('dialog', { name: 'Choose a folder' });
  await until(async () => await active() === 'day1');
  await press('Backspace');
  await until(async () => await active() === 'trip');
  await press('Backspace');
  await until(async () => await active() === 'photo');
  await noFaults('picker');
  await press('ArrowUp', 'Home', 'h', 'Enter');
  await picker.getByText('/home').waitFor();
  await picker.getByRole('button', { name: 'Choose' }).press('Enter');
  await page.getByLabel('Archive name').press('Enter');
  await task('/home/picked.zip').getByText('Done').waitFor();
  await visit('alice', '/attic');
});

check('a small screen shows a running job, and scrolls as one', async () => {
  await visit('alice', '/photo/many');
  for (const [width, height] of [[390, 844], [844, 390], [640, 400]]) {
    await page.setViewportSize({ width, height });
    const state = `${width}x${height}`;
    await noFaults(state);
    const scrolling = await page.evaluate(() => [...document.querySelectorAll('#app *')].filter((each) =>
      each.scrollHeight > each.clientHeight + 1 && /auto|scroll/.test(getComputedStyle(each).overflowY)).length);
    assert.equal(scrolling, 0, state);
    await press('End');
    const last = await row('file10000').boundingBox();
    const foot = await page.locator('.foot').boundingBox();
    assert.ok(last.y + last.height <= foot.y + 1, state);
  }
  await row('file9999').click();
  await page.goto(`${device.url}/#/photo`);
  await row('endless').locator('input').click();
  await compress({ 'Archive name': 'seen.zip', Level: 'fastest' });
  await announced('Packing of /photo/seen.zip has started.');
  const toggle = page.getByRole('button', { name: /seen.zip 0%/ });
  await until(async () => /^0%/.test(await page.title()));
  await toggle.click();
  await noFaults('small-tasks');
  await button('Stop /photo/seen.zip').click();
  await announced('/photo/seen.zip was stopped.');
  await page.setViewportSize({ width: 1280, height: 800 });
  await page.emulateMedia({ forcedColors: 'active' });
  await row('cat.jpg').click();
  const colours = await rows().evaluateAll((all) => all.map((each) => getComputedStyle(each).backgroundColor));
  assert.equal(new Set(colours).size, 2);
  await noFaults('forced-colours');
  await page.emulateMedia({ forcedColors: 'none' });
});
