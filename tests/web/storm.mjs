// Load and faults on served devices: storm.mjs [--short] [SEED] [NAME...]. One line for each storm;
// the exit status tells whether all held. The seed of a run is printed, so that it can be repeated.
import { Device } from './device.mjs';
import { archiverIsMissing, clockIsSetBack, storeIsDamaged, volumesAreFull } from
  './storm/faults.mjs';
import { killsAtRandom } from './storm/kills.mjs';
import { hoursOfUse, manyJobsAtOnce, stopsAtAnyMoment } from './storm/load.mjs';
import { names, seed } from './storm/tools.mjs';

const storms = { jobs: manyJobsAtOnce, stops: stopsAtAnyMoment, kills: killsAtRandom,
  volumes: volumesAreFull, archiver: archiverIsMissing, clock: clockIsSetBack,
  stores: storeIsDamaged, use: hoursOfUse };
for (const name of names.filter((each) => !(each in storms))) {
  console.error(`no storm '${name}'; there are ${Object.keys(storms).join(', ')}`);
  process.exit(2);
}
console.log(`seed ${seed}`);
for (const [name, storm] of Object.entries(storms)) {
  if (names.length > 0 && !names.includes(name)) {
    continue;
  }
  const begin = performance.now();
  const told = await storm().then((said) => `ok    ${name}: ${said}`, (error) => {
    process.exitCode = 1;
    return `FAILS ${name}: ${error.message}`;
  });
  await Promise.all([...Device.all].map((device) => device.remove()));
  console.log(`${told} (${((performance.now() - begin) / 1000).toFixed(0)} s)`);
}
process.exit();
