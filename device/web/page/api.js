// The device's HTTP interface: one function per request, and failures as one kind of error.
import { encodePath, pathList } from './names.js';

const API = 'KAVO.Zantro.Compress';
const API_VERSION = 3;
export const UNAUTHORIZED = 401;

// The device said no: the HTTP status, or the API's code, and the reason in words.
export class Refusal extends Error {
  constructor(words, { status = 0, code = 0, retryAfter = 0 } = {}) {
    super(words);
    Object.assign(this, { status, code, retryAfter });
  }
}

let tellSessionEnd = () => {};
let codeWords = null;

export function onSessionEnd(handler) {
  tellSessionEnd = handler;
}

async function send(method, url, { body, signal } = {}) {
  const headers = body ? { 'Content-Type': 'application/json' } : {};
  try {
    return await fetch(url, { method, headers, body: body && JSON.stringify(body), cache: 'no-store', signal });
  } catch {
    throw new Refusal('the device does not answer');
  }
}

async function answerOf(response) {
  const answer = await response.json().catch(() => null);
  if (response.ok && answer) return answer;
  const words = response.ok ? 'the answer broke off' : `the device answered ${response.status}`;
  throw new Refusal(answer?.error ?? words, {
    status: response.status,
    code: answer?.code,
    retryAfter: Number(response.headers.get('Retry-After')),
  });
}

async function request(method, url, options) {
  const response = await send(method, url, options);
  if (response.status === UNAUTHORIZED) tellSessionEnd();
  return answerOf(response);
}

export async function signIn(user, password) {
  return answerOf(await send('POST', '/session', { body: { user, password } }));
}

// Null when nobody is signed in.
export async function currentSession() {
  const response = await send('GET', '/session');
  return response.status === UNAUTHORIZED ? null : answerOf(response);
}

export async function signOut() {
  const response = await send('DELETE', '/session');
  if (response.status !== UNAUTHORIZED && !response.ok) await answerOf(response);
}

export const listFolder = (path, signal) => request('GET', `/files?path=${encodePath(path)}`, { signal });
export const listArchive = (path, signal) => request('GET', `/archive?path=${encodePath(path)}`, { signal });
export const checkDestination = (path, signal) => request('GET', `/destination?path=${encodePath(path)}`, { signal });
export const countTree = (paths, signal) => request('POST', '/size', { body: { paths }, signal });
export const listCodepages = () => request('GET', '/codepages');
export const listTasks = async () => (await request('GET', '/tasks')).tasks;

export const downloadUrl = (path) => `/download?path=${encodePath(path)}`;

export async function wordsOf(code) {
  codeWords ??= await request('GET', '/codes');
  return codeWords[code] ?? `error ${code}`;
}

async function call(method, params) {
  const body = { api: API, version: API_VERSION, method, params };
  const { code, data } = await request('POST', '/webapi', { body });
  if (code !== 0) throw new Refusal(await wordsOf(code), { code });
  return data;
}

export async function startTask(sources, destination, options) {
  const data = await call('start', { path: pathList(sources), dest_file_path: pathList([destination]), ...options });
  return data.taskid;
}

export const stopTask = (taskid) => call('stop', { taskid });
export const taskStatus = (taskid) => call('status', { taskid });
