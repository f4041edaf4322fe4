// The page's jobs in a browser: what is there already, what comes of a job, many windows, breaks.
import assert from 'node:assert/strict';
import { writeFileSync } from 'node:fs';

import { button, check, compress, device, noFaults, page, row, shows, signIn, task, visit } from './browser.mjs';
import { Client, isRoot, kill, listing, until } from './device.mjs';

const dialog = () => page.getByRole('dialog');

check('an archive that is there is told of before, and never added to unasked', async () => {
  await visit('alice', '/photo');
  const pack = async (name, choice) => {
    await row(name).click();
    await button('Compress…').click();
    await dialog().getByLabel('Archive name').fill('there.zip');
    if (choice) {
      await dialog().getByText(/1 entry/).waitFor();
      await dialog().getByLabel(choice).check();
      await (choice === 'Add' && noFaults('existing'));
    }
    await dialog().getByRole('button', { name: 'Compress' }).click();
    await dialog().waitFor({ state: 'hidden' });
  };
  await pack('cat.jpg');
  await task('/photo/there.zip').getByText('Done').waitFor();
  await pack('trip', 'Keep both');
  await task('/photo/there (2).zip').getByText('Done').waitFor();
  assert.deepEqual(listing(device.at('vol1/photo/there.zip')), ['cat.jpg']);
  await pack('trip', 'Add');
  await until(() => listing(device.at('vol1/photo/there.zip')).includes('trip'));
});

check('the dialog says what would fail, and the format and the ending follow each other', async () => {
  writeFileSync(device.at(`vol1/photo/${'n'.repeat(251)}.zip`), '');
  await visit('bob', '/attic');
  await row('old.txt').click();
  await button('Compress…').click();
  const name = dialog().getByLabel('Archive name');
  const folder = dialog().getByLabel('Folder', { exact: true });
  const password = dialog().getByLabel('Password (optional)');
  assert.equal(await folder.inputValue(), '/home');  // bob may not write in the attic
  const cases = [['/none', 'x.zip', folder], ['/attic', 'x.zip', folder], ['/photo/cat.jpg', 'x.zip', folder],
    ['/photo', '.zip', name], ['/photo', '  ', name], ['/photo', 'a/b', name], ['/photo', 'ü'.repeat(130), name],
    ['/photo', 'x.rar', name], ['/photo', 'x.zip', password, 'pä'], ['/photo', 'trip', null]];
  for (const [path, text, field, secret = ''] of cases) {
    await folder.fill(path);
    await name.fill(text);
    await password.fill(secret);
    await name.press('Tab');
    if (field) await dialog().getByRole('button', { name: 'Compress' }).click();
    await until(async () => (await field?.getAttribute('aria-invalid') ?? null) === (field && 'true'));
  }
  await noFaults('dialog');
  const held = new Promise((resolve) => { page.route(/none.late.zip/, resolve, { times: 1 }); });
  await folder.fill('/none');
  await name.fill('late.zip');
  const late = await held;
  const answered = page.waitForResponse(/photo.trip.zip/);
  await folder.fill('/photo');
  await name.fill('trip.zip');
  await answered;
  await late.continue().catch(() => {});
  await page.evaluate(() => fetch('/session').then((later) => later.text()));
  assert.equal(await folder.getAttribute('aria-invalid'), null);
  await name.press('Tab');
  assert.equal(await name.inputValue(), 'trip.zip');
  await dialog().getByLabel('Format').selectOption('7z');
  assert.equal(await name.inputValue(), 'trip.7z');
  await name.fill('trip.zip');
  assert.equal(await dialog().getByLabel('Format').inputValue(), 'zip');
  const compressButton = dialog().getByRole('button', { name: 'Compress' });
  const long = `${'n'.repeat(251)}.zip`;
  await name.fill(long);
  await dialog().getByText(/with a number it would be too long/).waitFor();
  await compressButton.click();
  await until(async () => await name.getAttribute('aria-invalid') === 'true');
  await page.route(/destination/, (route) => route.abort());
  await name.fill('unasked.zip');
  await compressButton.click();
  await dialog().getByText(/Try again/).waitFor();
  await page.unroute(/destination/);
  const pages = await dialog().getByLabel('Code page').locator('option').allTextContents();
  assert.deepEqual(pages.slice(0, 2), ['CP932 (your own setting)', 'UTF-8']);
  await page.keyboard.press('Escape');
});

check('what a job has made is downloaded, shown and looked into', async () => {
  await visit('alice', '/photo/trip');
  await row('best.jpg').click();
  await compress({ 'Archive name': 'Été 2.zip', Folder: '/photo' });
  const done = task('/photo/Été 2.zip');
  await done.getByText(/^Archive of/).waitFor();
  const [download] = await Promise.all([page.waitForEvent('download'), done.getByRole('link', { name: /Download/ }).click()]);
  assert.equal(download.suggestedFilename(), 'Été 2.zip');
  assert.deepEqual(listing(await download.path()), ['best.jpg']);
  await done.getByRole('button', { name: /Look inside/ }).click();
  await dialog().getByText('best.jpg').waitFor();
  await noFaults('inside');
  await page.keyboard.press('Escape');
  await page.getByRole('region', { name: 'Notices' }).getByRole('link', { name: /is ready/ }).click();
  await shows('photo');
  await until(() => page.evaluate(() => document.activeElement.matches('[aria-label="Été 2.zip"][aria-selected=true]')));
  await button('Clear finished').click();
  await done.waitFor({ state: 'detached' });
});

check('a failed job tells the archiver\'s reason and is tried again, but for the password', async () => {
  device.inside('mount -t tmpfs -o mode=0755,uid=65001,size=1m full "$1/vol2/video"');
  await visit('alice', '/photo');
  await row('trip').click();
  await compress({ Folder: '/video', 'Archive name': 'full.7z', Level: 'store', 'Password (optional)': 'secret' });
  await task('/video/full.7z').getByText(/^7z failed.*No space left/).waitFor();
  await page.reload();
  await task('/video/full.7z').getByRole('button', { name: /Retry/ }).click();
  const filledIn = ['Archive name', 'Folder', 'Level', 'Password (optional)'];
  assert.deepEqual(await Promise.all(filledIn.map((label) => dialog().getByLabel(label, { exact: true }).inputValue())),
    ['full.7z', '/video', 'store', '']);
  device.inside('umount "$1/vol2/video"');
  await dialog().getByRole('button', { name: 'Compress' }).click();
  await dialog().getByText(/There was a password/).waitFor();  // and no archive without
  await dialog().getByLabel('Password (optional)').fill('secret');
  await dialog().getByRole('button', { name: 'Compress' }).click();
  await task('/video/full.7z').getByText('Done').waitFor();
  await shows('photo');
  await row('trip').click();
  await button('Compress…').click();
  await dialog().getByLabel('Folder', { exact: true }).fill('/video');
  await dialog().getByLabel('Archive name').fill('full.7z');
  await dialog().getByText(/protected by a password/).waitFor();
  await dialog().getByLabel('Add').check();
  await dialog().getByRole('button', { name: 'Compress' }).click();
  await dialog().getByText(/give its password/).waitFor();
  await page.keyboard.press('Escape');
}, { skip: !isRoot && 'mounts take root' });

check('many windows share one stream, hidden ones have none, and all come back after a break', async () => {
  await visit('alice', '/photo');
  const windows = [page];
  while (windows.length < 8) windows.push(await page.context().newPage());
  for (const each of windows.slice(1)) await each.goto(`${device.url}/#/photo`);
  for (const each of windows) await each.getByRole('row').getByText('cat.jpg').waitFor();
  await until(() => device.processes('request').length === 1);
  const alice = await Client.signIn(device, 'alice');
  const { taskid } = await alice.startEndless();
  for (const each of windows) await task('/photo/endless.zip', each).getByRole('progressbar').waitFor();
  kill(device.process.pid, 'STOP');  // so that the front end stays away
  kill(device.processes('front end')[0].pid);
  try {
    for (const each of windows) await each.locator('#connection').waitFor();
    await noFaults('offline');
  } finally {
    kill(device.process.pid, 'CONT');
  }
  for (const each of windows) await each.locator('#connection').waitFor({ state: 'hidden' });
  const setHidden = (each, isHidden) => each.evaluate((value) => {
    Object.defineProperty(document, 'hidden', { value, configurable: true });
    document.dispatchEvent(new Event('visibilitychange'));
  }, isHidden);
  for (const each of windows) await setHidden(each, true);
  await until(() => device.processes('request').length === 0);
  await alice.call('stop', { taskid });
  await setHidden(page, false);
  await task('/photo/endless.zip').waitFor({ state: 'detached' });
  for (const each of windows.slice(1)) await each.close();
});

check('after the session\'s end, the same user finds selection, tray and dialog again', async () => {
  await visit('alice', '/photo');
  await row('trip').click();
  await button('Add to tray').click();
  await row('cat.jpg').click();
  await button('Compress…').click();
  await dialog().getByLabel('Archive name').fill('half.zip');
  await page.request.delete(`${device.url}/session`);
  await button('Sign in').waitFor();
  await page.reload();
  await signIn('alice');
  await dialog().getByRole('heading', { name: 'Compress 2 items' }).waitFor();
  assert.equal(await dialog().getByLabel('Archive name').inputValue(), 'half.zip');
  await page.keyboard.press('Escape');
  await page.getByText('1 item selected, 300 KB, 1 in the tray').waitFor();
});
