// A sample device of its own for each test file, served on a free port, and clients of it.
import { execFileSync, spawn, spawnSync } from 'node:child_process';
import { chmodSync, chownSync, mkdtempSync, rmSync, truncateSync, writeFileSync } from 'node:fs';
import { tmpdir } from 'node:os';
import path from 'node:path';
import { createInterface } from 'node:readline';
import { setTimeout as sleep } from 'node:timers/promises';

export const build = process.env.KAVO_BUILD;
export const program = path.join(build, 'kavo-device');
export const isRoot = process.getuid() === 0;

// Runs the program behind two folders with mounts and a small /tmp of its own, where the two stay.
const ownMounts = `
  mkdir -p "$1/tmp" && mount -t tmpfs -o mode=1777,size=8m tmp "$1/tmp" && for kept in "$1" "$2"; do
    case "$kept" in
      /tmp/*) mkdir -p "$1/tmp\${kept#/tmp}" && mount --bind "$kept" "$1/tmp\${kept#/tmp}" ;;
    esac
  done && mount --move "$1/tmp" /tmp && shift 2 && exec "$@"`;

export class Device {
  // Root's has mounts and a /tmp that only it sees, unless it is run by an `owner`, a uid and gid.
  static async start({ faults = [], owner = {} } = {}) {
    const device = new Device();
    device.base = mkdtempSync(path.join(tmpdir(), 'kavo-web-'));
    chmodSync(device.base, 0o755);
    chownSync(device.base, owner.uid ?? process.getuid(), owner.gid ?? process.getgid());
    device.folder = path.join(device.base, 'nas');
    device.at = (...names) => path.join(device.folder, ...names);
    device.faults = faults.flatMap((rule) => ['--fault', rule]);
    device.isolated = isRoot && !owner.uid;
    device.options = { ...owner, cwd: device.base, env: process.env };
    execFileSync(program, ['init', device.folder], { ...owner, stdio: 'pipe' });
    device.add('vol1/photo/endless', 2 ** 40);
    await device.serve();
    return device;
  }

  async serve() {
    const serve = [program, 'serve', this.folder, '--listen', '127.0.0.1:0', ...this.faults];
    const [command, ...args] = this.isolated
      ? ['unshare', '-m', 'sh', '-c', ownMounts, 'sh', this.base, build, ...serve] : serve;
    this.process = spawn(command, args, this.options);
    this.tmp = this.isolated ? `/proc/${this.process.pid}/root/tmp` : '/tmp';
    this.log = '';
    this.process.stderr.on('data', (data) => { this.log += data; });
    this.ended = new Promise((resolve) => { this.process.on('exit', resolve); });
    const { value } = await createInterface(this.process.stdout)[Symbol.asyncIterator]().next();
    if (!value) throw new Error(`no address: ${this.log}`);
    this.url = value.match(/ on (http:.*)\/$/)[1];
  }

  stop() {
    this.process.kill('SIGTERM');
    return this.ended;
  }

  async remove() {
    await this.stop();
    this.processes().forEach(({ pid }) => kill(pid));
    rmSync(this.base, { recursive: true, force: true, maxRetries: 50 });
  }

  // Runs a script where the device sees its mounts; $1 is the device's folder.
  inside(script) {
    execFileSync('nsenter', ['-t', this.process.pid, '-m', 'sh', '-ec', script, 'sh', this.folder],
      { stdio: 'pipe' });
  }

  // Makes a file of alice's; a number as content is the length of a sparse one.
  add(name, content = 'x') {
    const file = Buffer.concat([Buffer.from(`${this.folder}/`), Buffer.from(name)]);
    writeFileSync(file, typeof content === 'number' ? '' : content);
    if (typeof content === 'number') truncateSync(file, content);
    if (isRoot) chownSync(file, 65001, 65100);
  }

  // What runs of the device, of these kinds or all. A worker's group has its archiver and 7z too.
  processes(...kinds) {
    const archivers = [];
    const kindOf = (pid, parent, group, args) => {
      if (args.startsWith('kavo-web') && parent === this.process.pid) return 'front end';
      if (archivers.includes(parent)) return '7z';
      if (!args.includes(this.folder)) return null;
      if (pid === this.process.pid) return 'launcher';
      if (args.includes('-progress')) return archivers.push(pid) && 'archiver';
      return pid === group ? 'worker' : 'request';
    };
    return execFileSync('ps', ['-eo', 'pid=,ppid=,pgid=,args=', '--sort=start_time,pid'], { encoding: 'utf8' })
      .split('\n')
      .map((line) => line.match(/(\d+) +(\d+) +(\d+) (.*)/)).filter((match) => match)
      .map(([, pid, parent, group, args]) =>
        ({ pid: +pid, group: +group, args, kind: kindOf(+pid, +parent, +group, args) }))
      .filter(({ kind }) => kind && (kinds.length === 0 || kinds.includes(kind)));
  }
}

// False when it has ended by itself meanwhile.
export const kill = (pid, signal = 'KILL') => spawnSync('kill', [`-${signal}`, pid]).status === 0;

// The names in an archive, each with the checksum of a file's content.
export function contents(archive) {
  const listed = execFileSync('/usr/bin/7z', ['l', '-ba', '-slt', archive], { encoding: 'utf8' });
  return new Map([...listed.matchAll(/^Path = (.*)[^]*?^CRC = (\w*)/gm)].map((row) => row.slice(1)));
}
export const listing = (archive) => [...contents(archive).keys()].sort();

// Waits until the function answers something true, and returns that.
export async function until(body, seconds = 30) {
  for (const deadline = Date.now() + seconds * 1000; Date.now() < deadline; await sleep(10)) {
    const result = await body();
    if (result) return result;
  }
  throw new Error(`not in ${seconds} s: ${body}`);
}

// A signed-in user without a browser.
export class Client {
  static async signIn(device, user, password = user) {
    const client = Object.assign(new this(), { device, user, cookie: '' });
    client.signedIn = await client.ask('/session', {
      method: 'POST', body: new URLSearchParams({ user, password }) });
    client.cookie = client.signedIn.headers.get('set-cookie')?.split(';')[0] ?? '';
    return client;
  }

  fetch(route, options = {}) {
    const headers = { Cookie: this.cookie, ...options.headers };
    return fetch(this.device.url + route, { ...options, headers });
  }

  async ask(route, options) {
    const response = await this.fetch(route, options);
    const [{ status, headers }, text] = [response, await response.text()];
    return { status, headers, text, body: text.startsWith('{') ? JSON.parse(text) : null };
  }

  // Opens a stream of events; `events` are those of a kind that have come.
  async follow() {
    const ending = new AbortController();
    const { status, headers, body } = await this.fetch('/events', { signal: ending.signal });
    let text = '';
    const read = async () => { for await (const part of body) text += Buffer.from(part); };
    read().catch(() => {});  // it is closed
    const events = (kind) => [...text.matchAll(new RegExp(`^event: ${kind}\ndata: (.*)\n\n`, 'gm'))]
      .map(([, data]) => JSON.parse(data));
    return { status, headers, events, close: () => ending.abort() };
  }

  async call(method, params) {
    const body = JSON.stringify({ api: 'KAVO.Zantro.Compress', version: 3, method, params });
    return (await this.ask('/webapi', { method: 'POST', body })).body;
  }

  async start(sources, dest, params = {}) {
    const [path, dest_file_path] = [sources, [dest]].map((paths) => JSON.stringify(paths));
    return (await this.call('start', { path, dest_file_path, ...params })).data.taskid;
  }

  // A job without an end, when it packs: its task and the process of its worker.
  async startEndless() {
    const others = this.device.processes('7z').map(({ pid }) => pid);
    const level = 'fastest';  // in a zip, which leaves the machine's other processors alone
    const taskid = await this.start(['/photo/endless'], '/photo/endless.zip', { level });
    const packing = () => this.device.processes('7z').find(({ pid }) => !others.includes(pid));
    return { taskid, worker: (await until(packing)).group };
  }

  async tasks() {
    return (await this.ask('/tasks')).body.tasks;
  }

  // The task when it is in that state.
  taskIn(state, taskid) {
    return until(async () => (await this.tasks())
      .find((task) => task.taskid === taskid && task.state === state));
  }
}
