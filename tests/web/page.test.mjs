// The page in a browser: from the sign-in to the archive, and what must not be seen.
import assert from 'node:assert/strict';

import { button, check, compress, device, noFaults, page, row, shows, signIn, task, visit } from './browser.mjs';
import { Client, isRoot, listing, until } from './device.mjs';

check('signing in, and what a wrong password says', async () => {
  await visit();
  await noFaults('sign-in');
  await signIn('alice', 'wrong');
  await page.getByText(/wrong user name or password/i).waitFor();
  await signIn('alice');
  await shows('Shared folders');
  await noFaults('shared-folders');
});

check('what is selected in two shared folders comes into one archive', async () => {
  await visit('alice', '/photo');
  await row('trip').dblclick();
  await row('日の出.jpg').click();
  await row('day1').click({ modifiers: ['Shift'] });
  assert.deepEqual(await page.getByRole('row', { selected: true }).evaluateAll((rows) =>
    rows.map((each) => each.getAttribute('aria-label'))), ['day1', 'empty', 'best.jpg', '日の出.jpg']);
  for (const name of ['empty', 'best.jpg']) await row(name).click({ modifiers: ['Control'] });
  await button('Add to tray').click();
  await page.getByRole('link', { name: 'Shared folders' }).click();
  await row('music').dblclick();
  await row('album').click();
  await noFaults('selected');
  await compress({ Folder: '/photo', 'Archive name': 'both.7z', Format: '7z', Level: 'store' });
  await task('/photo/both.7z').getByText('Done').waitFor();
  await noFaults('done');
  assert.deepEqual(listing(device.at('vol1/photo/both.7z')), [
    'music/album', 'music/album/01 Été.mp3', 'music/album/02.mp3', 'photo/trip/day1',
    'photo/trip/day1/a.jpg', 'photo/trip/day1/b, the second.jpg', 'photo/trip/日の出.jpg']);
  await task('/photo/both.7z').getByRole('button', { name: /Dismiss/ }).click();
  await task('/photo/both.7z').waitFor({ state: 'detached' });
  assert.deepEqual(await (await Client.signIn(device, 'alice')).tasks(), []);
});

check('a folder that comes when another is wanted meanwhile is not shown', async () => {
  await visit('alice', '/photo');
  const held = new Promise((resolve) => { page.route(/=.photo.trip$/, resolve, { times: 1 }); });
  await row('trip').dblclick();
  const late = await held;
  await page.getByRole('link', { name: 'Shared folders' }).click();
  await shows('Shared folders');
  const [answer] = await Promise.all([page.waitForResponse(/trip$/), late.continue()]);
  await answer.finished();
  await page.evaluate(() => fetch('/session').then((later) => later.text()));
  assert.equal(await row('day1').count(), 0);
});

check('a running job is there after a reload and in a second window that stops it', async () => {
  await visit('alice', '/photo');
  await row('endless').click();
  await compress({ 'Archive name': 'endless.zip', Level: 'fastest' });
  await task('/photo/endless.zip').getByText(/ of 1 TB/).waitFor();
  await noFaults('running');
  await page.reload();
  await task('/photo/endless.zip').getByRole('progressbar').waitFor();
  const second = await page.context().newPage();
  await second.goto(device.url);
  await task('/photo/endless.zip', second).getByRole('button', { name: /Stop/ }).click();
  await task('/photo/endless.zip').waitFor({ state: 'detached' });
  await second.close();
  await until(() => device.processes('7z').length === 0);
});

check('a failure is told in words, and there is no 100 % before there is an archive', async () => {
  device.inside('mount -t tmpfs -o mode=0755,uid=65001,size=4m full "$1/vol2/video"');
  await page.emulateMedia({ colorScheme: 'dark' });
  await visit('alice', '/photo');
  await row('trip').click();
  await compress({ Folder: '/video', 'Archive name': 'full.zip', Level: 'store' });
  await task('/video/full.zip').getByText(/no space left on device/).waitFor();
  await noFaults('failed-dark');
  await page.emulateMedia({ colorScheme: 'light' });
  device.add('7z', '#!/bin/sh\nprintf "100%% 1 + cat.jpg"\nexec tail -f /dev/null\n');
  device.inside('chmod 755 "$1/7z" && mount --bind "$1/7z" /usr/lib/p7zip/7z');
  await compress({ 'Archive name': 'held.zip' });
  await task('/photo/held.zip').getByText('99%').waitFor();
  await task('/photo/held.zip').getByRole('button', { name: /Stop/ }).click();
  device.inside('umount /usr/lib/p7zip/7z');
}, { skip: !isRoot && 'mounts take root' });

check('a name of markup and marks of direction is shown as it is, everywhere', async () => {
  const [name, shown] = ['\u202e', '⟨U+202E⟩']
    .map((mark) => `<img src=x onerror=alert(1)>${mark}.txt`);
  device.add(`vol1/photo/${name}`);
  await visit('alice', '/photo');
  await row(shown).locator('bdi').click();
  await button('Add to tray').click();
  await page.getByText('1 item', { exact: true }).click();
  await page.getByRole('list', { name: 'Tray' }).locator('bdi', { hasText: shown }).waitFor();
  await compress({ 'Archive name': `${name}.zip` });
  await task(`/photo/${shown}.zip`).getByText('Done').waitFor();
  await task(`/photo/${shown}.zip`).locator('bdi', { hasText: shown }).waitFor();
  await row(`${shown}.zip`).waitFor();
  // A job that nobody follows ends with a notification; its argument comes HTML-encoded.
  const other = await Client.signIn(device, 'alice');
  await other.start([`/photo/${name}`], `/photo/<b>${name}&amp;.zip`);
  await page.getByRole('region', { name: 'Notices' }).getByText(`<b>${shown}&amp;.zip`).waitFor();
  assert.ok(!(await page.content()).includes('\u202e'));
  await noFaults('markup');
});

check('the next user sees nothing of the last', async () => {
  const alice = await Client.signIn(device, 'alice');
  await visit('alice', '/photo/trip');
  await alice.start(['/photo/cat.jpg'], '/photo/alices.zip');
  await page.locator('.toast').waitFor();
  await page.evaluate(() => localStorage.setItem('folder', '"/home/secret"'));  // as jobs leave it
  await row('day1').click();
  await button('Add to tray').click();
  await button('Compress…').click();
  await page.getByLabel('Password (optional)').fill('secret');
  await page.request.delete(`${device.url}/session`);
  await page.keyboard.press('Enter');
  await button('Sign in').waitFor();
  assert.equal(await page.locator('#grid-body .row, #tray > *, #tasks > *, .toast').count(), 0);
  await signIn('bob');
  await shows('Shared folders');
  assert.equal(await page.evaluate(() => localStorage.getItem('folder')), null);
  assert.equal(await page.locator('#archive-password').inputValue(), '');
  await row('photo').dblclick();
  await row('cat.jpg').click();
  await compress({ 'Archive name': 'bobs.zip' });
  await task('/photo/bobs.zip').getByText('Done').waitFor();
  assert.equal(await task().count(), 1);
  await button('Sign out').click();
  await page.getByLabel('User name').waitFor();
  assert.equal(new URL(page.url()).hash, '');
});

check('the keyboard alone does, on a phone\'s width', async () => {
  const press = async (...keys) => { for (const key of keys) { await page.keyboard.press(key); } };
  const pressUntil = (key, isThere) => until(async () => await page.evaluate(isThere) || press(key));
  await page.setViewportSize({ width: 360, height: 740 });
  await visit();
  await page.getByLabel('User name').focus();
  await page.keyboard.type('bob');
  await press('Tab');
  await page.keyboard.type('bob');
  await press('Enter');
  await shows('Shared folders');
  await pressUntil('Tab', () => document.activeElement.closest('#grid-body') !== null);
  await press('End', 'ArrowUp', 'Home');
  await pressUntil('ArrowDown', () => document.activeElement.textContent.includes('photo'));
  await press('Enter');
  await shows('photo');
  await press('End');
  await pressUntil('ArrowUp', () => document.activeElement.textContent.includes('cat.jpg'));
  await press('Space');
  await noFaults('phone');
  await pressUntil('Shift+Tab', () => document.activeElement.id === 'compress');
  await press('Enter');
  await page.getByRole('dialog').waitFor();
  assert.equal(await page.getByLabel('Code page of names').inputValue(), 'CP932');
  await noFaults('phone-dialog');
  await press('Enter');
  const bob = await Client.signIn(device, 'bob');
  await until(async () => (await bob.tasks()).some(({ dest_file_path: dest, state }) =>
    dest === '/photo/cat.zip' && state === 'finished'));
  assert.deepEqual(listing(device.at('vol1/photo/cat.zip')), ['cat.jpg']);
});
