// The page as a whole: who is signed in, and what the parts tell each other.
import { currentSession, downloadUrl, onSessionEnd, signOut } from './api.js';
import { lookInside } from './archive-view.js';
import { CompressDialog } from './dialog.js';
import { byId, element } from './dom.js';
import { Events } from './events.js';
import { Files } from './files.js';
import { counted, sizeText } from './format.js';
import { forgetAll, keepDesk, keepFor, takeDesk } from './keep.js';
import { formatOf, join, shown } from './names.js';
import { openMenu } from './menu.js';
import { announce, clearNotices, notify } from './notices.js';
import { SignIn } from './sign-in.js';
import { Tasks } from './tasks.js';
import { Tray } from './tray.js';

const SESSION_ENDED = 'The session has ended. Sign in again.';
const PAGE_TITLE = 'Files';
const SELECTING_MS = 400;

const app = byId('app');
const drawerToggle = byId('drawer-toggle');
let session = null;
let lastUser = '';  // whose folder the location names
let desk = takeDesk();  // what its user has laid out, until it is there once more
let announcing = 0;
let filesAt = 0;  // how far the list was scrolled before the tasks took its place

const files = new Files({
  onOpen: (entry) => { if (formatOf(entry.name)) lookInside(join(files.path, entry.name)); },
  onMenu: (at) => openMenu(actions(), at),
  onSelect: () => drawSelection(),
  onShow: () => {
    drawTitle();
    if (desk?.path === files.path) files.selectNames(desk.selected);
    desk = null;
  },
});
const tray = new Tray({ onChange: () => drawSelection() });
const tasks = new Tasks({
  change: () => drawWork(),
  end: (destination) => { if (destination.startsWith(files.path)) files.reload(); },
  show: (path) => {
    showDrawer(false);
    files.reveal(path);
  },
  look: lookInside,
  seen: (task) => {
    showDrawer(true);
    task.focus();
  },
  retry: (job) => dialog.open(job, session.codepage),
});
const dialog = new CompressDialog({
  onStarted: (taskid, path) => {
    tasks.expect(taskid, path);
    tray.clear();
    // The button that opened the dialog has the focus again, but with an empty tray it may be disabled.
    if (byId('compress').disabled) files.focus();
  },
});
const signInForm = new SignIn({ onSignedIn: (signedIn) => enter(signedIn) });
const events = new Events({
  task: (task) => tasks.tell(task),
  gone: (task) => tasks.tellGone(task),
  notification: (notification) => tasks.tellNotification(notification),
  connected: (isConnected) => drawConnection(isConnected),
  hidden: () => { if (tasks.work) tasks.refresh(); },
  sessionEnd: () => endSession(),
});

function enter(signedIn) {
  if (lastUser && lastUser !== signedIn.user) history.replaceState(null, '', location.pathname);
  lastUser = signedIn.user;
  session = signedIn;
  keepFor(session.user);
  if (desk?.user !== session.user) desk = null;
  signInForm.hide();
  byId('signed-in-user').textContent = shown(session.user);
  app.hidden = false;
  events.open(session.user);
  tray.add(desk?.tray ?? []);
  if (desk?.draft) dialog.open(desk.draft, session.codepage);
  files.openLocation();
}

// What the user has laid out goes with the session, to be there when the same user comes back.
function layOut() {
  return session && {
    user: session.user,
    tray: tray.paths,
    path: files.path,
    selected: files.selectedEntries.map((entry) => entry.name),
    draft: dialog.draft,
  };
}

function endSession() {
  if (!session) return;
  desk = layOut();
  leave(SESSION_ENDED, session.user);
}

function leave(message, userName) {
  session = null;
  events.close();
  for (const open of document.querySelectorAll('dialog[open]')) open.close();
  tray.clear();
  tasks.clear();
  files.clear();
  clearNotices();
  app.hidden = true;
  signInForm.show(message, userName);
}

// What a job takes: the tray first, then what is selected on show, each path once.
function sources() {
  return [...new Set([...tray.paths, ...files.selectedPaths])];
}

function compress() {
  dialog.open({ sources: sources(), folder: files.isWritable ? files.path : null }, session.codepage);
}

function addToTray() {
  tray.add(files.selectedPaths);
  announce(`${counted(tray.paths.length, 'item')} in the tray.`);
  files.clearSelection();
  files.focus();
}

// What can be done with the selection, as a menu tells it.
function actions() {
  const [entry, ...others] = files.selectedEntries;
  const path = entry && join(files.path, entry.name);
  const isFile = others.length === 0 && entry?.kind === 'file';
  return [
    ['Compress…', compress],
    entry && ['Add to tray', addToTray],
    isFile && ['Download', () => element('a', { href: downloadUrl(path), download: true }).click()],
    isFile && formatOf(entry.name) && ['Look inside', () => lookInside(path)],
  ].filter(Boolean);
}

function drawSelection() {
  const selected = files.selectedCount;
  const inTray = tray.paths.length;
  const bytes = files.selectedEntries.reduce((sum, entry) => sum + (entry.kind === 'file' ? entry.size : 0), 0);
  const words = selected > 0 ? `${counted(selected, 'item')} selected` : 'Nothing selected';
  if (session && !byId('selection-summary').textContent.startsWith(words)) {
    clearTimeout(announcing);
    announcing = setTimeout(() => announce(words), SELECTING_MS);
  }
  byId('selection-summary').textContent = [
    words, bytes > 0 && sizeText(bytes), inTray > 0 && `${inTray} in the tray`,
  ].filter(Boolean).join(', ');
  byId('add-to-tray').disabled = byId('more').disabled = selected === 0;
  byId('compress').disabled = selected + inTray === 0;
  drawWork();
}

function drawTitle() {
  if (session) document.title = [tasks.work?.percent, files.title, PAGE_TITLE].filter(Boolean).join(' – ');
}

function drawWork() {
  const { work } = tasks;
  const counts = `Tray (${tray.paths.length}) and tasks (${tasks.count})`;
  byId('drawer-text').textContent = work ? `${work.name} ${work.percent} · ${counts}` : counts;
  byId('drawer-progress').hidden = !work;
  byId('drawer-progress').value = work?.progress ?? 0;
  drawTitle();
}

function drawConnection(isConnected) {
  const wasLost = !byId('connection').hidden;
  byId('connection').hidden = isConnected;
  if (!isConnected && !wasLost) announce('The connection is lost.');
  if (!isConnected) return;
  tasks.refresh();
  if (files.isRefused || wasLost) files.reload();
}

// On a small screen, tray and tasks take the place of the files.
function showDrawer(isOpen) {
  const wasOpen = app.classList.contains('drawer-open');
  if (isOpen === wasOpen) return;
  if (isOpen) filesAt = window.scrollY;
  app.classList.toggle('drawer-open', isOpen);
  drawerToggle.setAttribute('aria-expanded', String(isOpen));
  window.scrollTo(0, isOpen ? 0 : filesAt);
}

byId('add-to-tray').addEventListener('click', addToTray);
byId('compress').addEventListener('click', compress);
byId('more').addEventListener('click', ({ currentTarget }) => openMenu(actions(), currentTarget.getBoundingClientRect()));
byId('retry').addEventListener('click', () => events.retry());
byId('sign-out').addEventListener('click', async () => {
  try {
    await signOut();
    forgetAll();
    history.replaceState(null, '', location.pathname);
    leave('');
  } catch (refusal) {
    notify('sign-out', `Signing out did not work: ${refusal.message}.`, { isFailure: true });
  }
});
drawerToggle.addEventListener('click', () => showDrawer(!app.classList.contains('drawer-open')));
app.querySelector('.skip-link').addEventListener('click', (event) => {
  event.preventDefault();
  files.focus();
});
window.addEventListener('hashchange', () => {
  if (session) files.openLocation();
});
window.addEventListener('pagehide', () => keepDesk(layOut() ?? desk));
history.scrollRestoration = 'manual';
onSessionEnd(endSession);

try {
  const found = await currentSession();
  if (found) enter(found);
  else signInForm.show('');
} catch (refusal) {
  signInForm.show(`Not ready: ${refusal.message}.`);
}
