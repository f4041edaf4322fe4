// What stays in the browser until its user signs out: never a password, and nothing for anybody else.

const OWNER = 'user';
const JOB = 'job ';
const FOLDER = 'folder';
const DESK = 'desk';

// Storage may be full or forbidden; then nothing stays.
function attempt(body) {
  try {
    return body();
  } catch {
    return null;
  }
}

export function keepFor(user) {
  attempt(() => {
    if (localStorage.getItem(OWNER) !== user) localStorage.clear();
    localStorage.setItem(OWNER, user);
  });
}

export function forgetAll() {
  attempt(() => localStorage.clear());
  attempt(() => sessionStorage.clear());
}

// What a job was started with, for another try.
export const keepJob = (taskid, job) => attempt(() => localStorage.setItem(JOB + taskid, JSON.stringify(job)));
export const keptJob = (taskid) => attempt(() => JSON.parse(localStorage.getItem(JOB + taskid)));

export function dropJobs(isGone) {
  attempt(() => Object.keys(localStorage)
    .filter((key) => key.startsWith(JOB) && isGone(key.slice(JOB.length)))
    .forEach((key) => localStorage.removeItem(key)));
}

// The folder that the last archive went to.
export const keepFolder = (folder) => attempt(() => localStorage.setItem(FOLDER, JSON.stringify(folder)));
export const keptFolder = () => attempt(() => JSON.parse(localStorage.getItem(FOLDER)));

// What a user has laid out in this window: { user, … }. It is there once more after a reload.
export const keepDesk = (desk) => attempt(() => sessionStorage.setItem(DESK, JSON.stringify(desk)));
export const takeDesk = () => attempt(() => {
  const desk = JSON.parse(sessionStorage.getItem(DESK));
  sessionStorage.removeItem(DESK);
  return desk;
});
