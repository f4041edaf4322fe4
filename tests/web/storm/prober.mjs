// Asks the device at fixed times, from a thread of its own: a late answer puts off no question, and
// the storm's own work no answer. Tells first how long answers take when nothing else is asked.
import { parentPort, workerData } from 'node:worker_threads';

import { Client } from '../device.mjs';

const idleMs = 1500;
const pauseMs = 40;
const { url, cookie } = workerData;
const client = Object.assign(new Client(), { device: { url }, cookie });
const answers = [];

async function ask() {
  const begin = performance.now();
  await client.call('status', { taskid: 'none' });
  answers.push({ asked: performance.timeOrigin + begin, took: performance.now() - begin });
}

await ask();
answers.pop();  // it had the connection's code to load
const underWay = [];
const asking = setInterval(() => underWay.push(ask()), pauseMs);
setTimeout(() => parentPort.postMessage(answers.splice(0)), idleMs);
parentPort.once('message', async () => {
  clearInterval(asking);
  await Promise.all(underWay);
  parentPort.postMessage(answers);
});
