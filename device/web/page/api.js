// The device's HTTP interface: one function per request, and failures as one kind of error.
import { encodePath, pathList } from './names.js';

const API = 'KAVO.Zantro.Compress';
const API_VERSION = 3;
const UNAUTHORIZED = 401;

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

async function send(method, url, body) {
  const headers = body ? { 'Content-Type': 'application/json' } : {};
  try {
    return await fetch(url, { method, headers, body: body && JSON.stringify(body), cache: 'no-store' });
  } catch {
    throw new Refusal('the device does not answer');
  }
}

async function answerOf(response) {
  const answer = await response.json().catch(() => ({}));
  if (response.ok) return answer;
  throw new Refusal(answer.error ?? `the device answered ${response.status}`, {
    status: response.status,
    code: answer.code,
    retryAfter: Number(response.headers.get('Retry-After')),
  });
}

async function request(method, url, body) {
  const response = await send(method, url, body);
  if (response.status === UNAUTHORIZED) tellSessionEnd();
  return answerOf(response);
}

export async function signIn(user, password) {
  return answerOf(await send('POST', '/session', { user, password }));
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

export function listFolder(path) {
  return request('GET', '/files?path=' + encodePath(path));
}

export async function listTasks() {
  return (await request('GET', '/tasks')).tasks;
}

export async function wordsOf(code) {
  codeWords ??= await request('GET', '/codes');
  return codeWords[code] ?? `error ${code}`;
}

async function call(method, params) {
  const { code, data } = await request('POST', '/webapi', { api: API, version: API_VERSION, method, params });
  if (code !== 0) throw new Refusal(await wordsOf(code), { code });
  return data;
}

export async function startTask(sources, destination, options) {
  const data = await call('start', { path: pathList(sources), dest_file_path: pathList([destination]), ...options });
  return data.taskid;
}

export function stopTask(taskid) {
  return call('stop', { taskid });
}

export function taskStatus(taskid) {
  return call('status', { taskid });
}
