// A sample device of its own for each test file, served on a free port, and clients of it.
import { execFileSync, spawn } from 'node:child_process';
import { mkdtempSync, readFileSync, rmSync, chmodSync } from 'node:fs';
import { tmpdir } from 'node:os';
import path from 'node:path';
import { createInterface } from 'node:readline';

export const build = process.env.KAVO_BUILD;
const program = path.join(build, 'kavo-device');
export const isRoot = process.getuid() === 0;

// Runs the program behind two folders with mounts and a small /tmp of its own, where the two stay.
const ownMounts = `
  mkdir -p "$1/tmp" && mount -t tmpfs -o mode=1777,size=8m tmp "$1/tmp" && for kept in "$1" "$2"; do
    case "$kept" in
      /tmp/*) mkdir -p "$1/tmp\${kept#/tmp}" && mount --bind "$kept" "$1/tmp\${kept#/tmp}" ;;
    esac
  done && mount --move "$1/tmp" /tmp && shift 2 && exec "$@"`;

export class Device {
  static all = new Set();

  // One that is `isolated` has mounts and a /tmp that only it sees; that takes root.
  static async start({ isolated = false, faults = [], env = {} } = {}) {
    const device = new Device();
    Device.all.add(device);
    device.base = mkdtempSync(path.join(tmpdir(), 'kavo-web-'));
    chmodSync(device.base, 0o755);
    device.folder = path.join(device.base, 'nas');
    device.faults = faults.flatMap((rule) => ['--fault', rule]);
    Object.assign(device, { isolated, env: { ...process.env, ...env } });
    execFileSync(program, ['init', device.folder], { stdio: 'pipe' });
    await device.serve();
    return device;
  }

  async serve() {
    const serve = [program, 'serve', this.folder, '--listen', '127.0.0.1:0', ...this.faults];
    const [command, ...args] = this.isolated
      ? ['unshare', '-m', 'sh', '-c', ownMounts, 'sh', this.base, build, ...serve] : serve;
    this.process = spawn(command, args, { env: this.env });
    this.log = '';
    this.process.stderr.on('data', (data) => { this.log += data; });
    this.ended = new Promise((resolve) => { this.process.on('exit', resolve); });
    for await (const line of createInterface({ input: this.process.stdout })) {
      this.url = line.match(/ on (http:.*)\/$/)[1];
      return;
    }
    throw new Error(`no address: ${this.log}`);
  }

  async stop() {
    this.process.kill('SIGTERM');
    return this.ended;
  }

  async remove() {
    Device.all.delete(this);
    await this.stop();
    for (const { pid } of this.processes()) {
      try {
        process.kill(pid, 'SIGKILL');
      } catch {
        // It has ended meanwhile.
      }
    }
    rmSync(this.base, { recursive: true, force: true, maxRetries: 50 });
  }

  // Runs a script where the device sees its mounts; $1 is the device's folder.
  inside(script) {
    execFileSync('nsenter', ['-t', this.process.pid, '-m', 'sh', '-ec', script, 'sh', this.folder],
      { stdio: 'pipe' });
  }

  // The device's /tmp, as others reach it.
  get tmp() {
    return this.isolated ? `/proc/${this.process.pid}/root/tmp` : '/tmp';
  }

  // A path in the device's folder.
  at(...names) {
    return path.join(this.folder, ...names);
  }

  // What runs of the device: launcher, workers, archivers, by their command lines.
  processes() {
    return execFileSync('ps', ['-eo', 'pid=,args='], { encoding: 'utf8' }).split('\n')
      .map((line) => line.trim().match(/^(\d+) (.*)$/))
      .filter((match) => match && match[2].includes(this.folder))
      .map((match) => ({ pid: Number(match[1]), args: match[2] }));
  }

  names(archive) {
    return listing(this.at(archive));
  }
}

// The names in an archive, sorted.
export function listing(archive) {
  return execFileSync('/usr/bin/7z', ['l', '-ba', '-slt', archive], { encoding: 'utf8' })
    .split('\n').filter((line) => line.startsWith('Path = ')).map((line) => line.slice(7)).sort();
}

// Waits until the function answers something true, and returns that.
export async function until(body, seconds = 30) {
  const deadline = Date.now() + seconds * 1000;
  for (;;) {
    const result = await body();
    if (result) {
      return result;
    }
    if (Date.now() > deadline) {
      throw new Error(`not in ${seconds} s: ${body}`);
    }
    await new Promise((resolve) => { setTimeout(resolve, 10); });
  }
}

// A signed-in user without a browser.
export class Client {
  static async signIn(device, user, password = user) {
    const client = new Client();
    client.device = device;
    const response = await fetch(`${device.url}/session`, {
      method: 'POST', body: new URLSearchParams({ user, password }) });
    client.signedIn = { status: response.status, cookie: response.headers.get('set-cookie') };
    client.cookie = client.signedIn.cookie?.split(';')[0] ?? '';
    return client;
  }

  async ask(route, options = {}) {
    const response = await fetch(this.device.url + route, {
      ...options, headers: { Cookie: this.cookie, ...options.headers } });
    const text = await response.text();
    return { status: response.status, text, body: text ? JSON.parse(text) : null };
  }

  async call(method, params) {
    const answer = await this.ask('/webapi', {
      method: 'POST',
      body: new URLSearchParams({
        api: 'KAVO.Zantro.Compress', version: 3, method, ...params }) });
    return answer.body;
  }

  async start(sources, dest, params = {}) {
    const answer = await this.call('start', {
      path: JSON.stringify(sources), dest_file_path: JSON.stringify([dest]), ...params });
    return answer.data.taskid;
  }

  async tasks() {
    return (await this.ask('/tasks')).body.tasks;
  }

  // The task when it is in that state.
  async taskIn(state, taskid) {
    return until(async () => (await this.tasks())
      .find((task) => task.taskid === taskid && task.state === state));
  }
}

export function text(file) {
  return readFileSync(file, 'utf8');
}
