// The page as a whole: who is signed in, and what the parts tell each other.
import { currentSession, onSessionEnd, signOut } from './api.js';
import { CompressDialog } from './dialog.js';
import { byId } from './dom.js';
import { Events } from './events.js';
import { Files } from './files.js';
import { counted } from './format.js';
import { parentOf, shown } from './names.js';
import { clearNotices, notify } from './notices.js';
import { SignIn } from './sign-in.js';
import { Tasks } from './tasks.js';
import { Tray } from './tray.js';

const SESSION_ENDED = 'The session has ended. Sign in again.';

const app = byId('app');
const drawerToggle = byId('drawer-toggle');
let session = null;
let lastUser = '';  // whose folder the location names

const files = new Files({ onSelect: () => drawSelection() });
const tray = new Tray({ onChange: () => drawSelection() });
const tasks = new Tasks({
  onChange: () => drawDrawerToggle(),
  onEnd: (destination) => {
    if (parentOf(destination) === files.path) files.reload();
  },
});
const dialog = new CompressDialog({
  onStarted: (taskid) => {
    tasks.expect(taskid);
    tray.clear();
    // The button that opened the dialog has the focus again, but with an empty tray it may be disabled.
    if (byId('compress').disabled) files.focus();
  },
});
const signInForm = new SignIn({ onSignedIn: (signedIn) => enter(signedIn) });
const events = new Events({
  task: (task) => tasks.update(task),
  gone: ({ taskid }) => tasks.remove(taskid),
  notification: (notification) => tasks.tellNotification(notification),
  connected: (isConnected) => tasks.connected(isConnected),
  sessionEnd: () => endSession(),
});

function enter(signedIn) {
  if (lastUser && lastUser !== signedIn.user) forgetFolder();
  lastUser = signedIn.user;
  session = signedIn;
  signInForm.hide();
  byId('signed-in-user').textContent = shown(session.user);
  app.hidden = false;
  events.open();
  files.openLocation();
}

function forgetFolder() {
  history.replaceState(null, '', location.pathname);
}

function endSession() {
  if (session) leave(SESSION_ENDED, session.user);
}

function leave(message, userName) {
  session = null;
  events.close();
  dialog.close();
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

function drawSelection() {
  const selected = files.selectedPaths.length;
  const inTray = tray.paths.length;
  byId('selection-summary').textContent = [
    selected > 0 ? `${counted(selected, 'item')} selected` : 'Nothing selected',
    inTray > 0 && `${inTray} in the tray`,
  ].filter(Boolean).join(', ');
  byId('add-to-tray').disabled = selected === 0;
  byId('compress').disabled = selected + inTray === 0;
  drawDrawerToggle();
}

function drawDrawerToggle() {
  drawerToggle.textContent = `Tray (${tray.paths.length}) and tasks (${tasks.count})`;
}

byId('add-to-tray').addEventListener('click', () => {
  tray.add(files.selectedPaths);
  files.clearSelection();
  files.focus();
});
byId('compress').addEventListener('click', () => {
  dialog.open(sources(), files.path, files.isWritable, session.codepage);
});
byId('sign-out').addEventListener('click', async () => {
  try {
    await signOut();
    forgetFolder();
    leave('');
  } catch (refusal) {
    notify('sign-out', `Signing out did not work: ${refusal.message}.`, true);
  }
});
drawerToggle.addEventListener('click', () => {
  const isOpen = byId('side').classList.toggle('open');
  drawerToggle.setAttribute('aria-expanded', String(isOpen));
});
app.querySelector('.skip-link').addEventListener('click', (event) => {
  event.preventDefault();
  files.focus();
});
window.addEventListener('hashchange', () => {
  if (session) files.openLocation();
});
onSessionEnd(endSession);

try {
  const found = await currentSession();
  if (found) enter(found);
  else signInForm.show('');
} catch (refusal) {
  signInForm.show(`Not ready: ${refusal.message}.`);
}
