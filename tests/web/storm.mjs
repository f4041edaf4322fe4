// Load and faults on served devices: storm.mjs [--short] [SEED] [NAME...]. One line for each storm;
// the exit status tells whether all held. The seed of a run is printed, so that it can be repeated.
import { Device, isRoot } from './device.mjs';
import { archiver, stores, volumes } from './storm/faults.mjs';
import { jobs, kills, memory, stops } from './storm/load.mjs';
import { calmCheck, names, seed } from './storm/tools.mjs';

const storms = { jobs, memory, stops, kills, volumes, archiver, stores };
for (const name of names.filter((each) => !(each in storms))) {
  console.error(`no storm '${name}'; there are ${Object.keys(storms).join(', ')}`);
  process.exit(2);
}

// A storm answers what to say, and what is left behind on purpose.
async function run(storm) {
  if (storm.takesRoot && !isRoot) return ['skip ', 'it takes root'];
  const device = await Device.start();
  try {
    const isCalm = calmCheck(device);
    const [said, left] = await storm(device, isCalm);
    await isCalm(left);
    return ['ok   ', said];
  } finally {
    await device.remove();
  }
}

console.log(`seed ${seed}`);
for (const name of Object.keys(storms).filter((each) => !names.length || names.includes(each))) {
  const begin = performance.now();
  const [result, said] = await run(storms[name]).catch((error) => {
    process.exitCode = 1;
    return ['FAILS', error.message];
  });
  console.log(`${result} ${name}: ${said} (${((performance.now() - begin) / 1000).toFixed(0)} s)`);
}
process.exit();
