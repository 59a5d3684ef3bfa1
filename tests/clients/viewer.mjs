// Opens studies in a viewer's page under headless Chromium: the list, and a picture that is not blank of each study named.
//
// usage: node viewer.mjs http://HOST:PORT FOLDER STUDY...      FOLDER receives screenshots

import { createRequire } from 'node:module';
import { check, report, root } from './archive.mjs';

const require = createRequire(process.env.KDD_NODE_MODULES + '/');
const puppeteer = require('puppeteer-core');
const [folder, ...studies] = process.argv.slice(3);

// More than the slowest machine needs; nothing waits for it to pass.
const kPatience = { timeout: 120000 };

const browser = await puppeteer.launch({
  executablePath: process.env.CHROMIUM ?? '/usr/bin/chromium',
  // Nothing but this machine can be reached, at a place of care too.
  args: ['--no-sandbox', '--host-resolver-rules=MAP * ~NOTFOUND, EXCLUDE localhost, EXCLUDE 127.0.0.1', '--use-gl=angle', '--use-angle=swiftshader', '--enable-unsafe-swiftshader'],
});
const page = await browser.newPage();
await page.setViewport({ width: 1400, height: 900 });
page.setDefaultNavigationTimeout(kPatience.timeout);
const failed = [];
page.on('response', answer => {
  if (answer.status() >= 400) failed.push(`${answer.status()} ${answer.url()}`);
});
page.on('requestfailed', request => console.log('unreachable', request.url().slice(0, 120), request.failure()?.errorText));
page.on('pageerror', error => failed.push(String(error)));

/// Whether a viewport shows something: grey values that differ.
async function hasPicture() {
  return page.evaluate(() => [...document.querySelectorAll('canvas')].some(canvas => {
    const small = document.createElement('canvas');
    small.width = small.height = 32;
    const context = small.getContext('2d');
    context.drawImage(canvas, 0, 0, 32, 32);
    const { data } = context.getImageData(0, 0, 32, 32);
    let least = 255;
    let most = 0;
    for (let i = 0; i < data.length; i += 4) {
      least = Math.min(least, data[i]);
      most = Math.max(most, data[i]);
    }
    return most - least > 40;
  }));
}

await page.goto(`${root}/viewer/`, { waitUntil: 'domcontentloaded' });
await page.waitForFunction(() => /\d+ ?- ?\d+ of|Number of studies|Studies/i.test(document.body.innerText), kPatience)
  .catch(() => check(false, 'the list of studies does not appear'));
await new Promise(done => setTimeout(done, 1500));
await page.screenshot({ path: `${folder}/viewer-list.png` });
const rows = await page.$$eval('[data-cy="study-list-results"] tr, [data-cy="studyRow"]', found => found.length).catch(() => 0);
console.log(`${rows} rows in the list`);

for (const study of studies) {
  const before = failed.length;
  await page.goto(`${root}/viewer/viewer?StudyInstanceUIDs=${study}`, { waitUntil: 'domcontentloaded' });
  let isShown = false;
  for (let round = 0; round < 120 && !isShown; ++round) {
    await new Promise(done => setTimeout(done, 500));
    isShown = await hasPicture().catch(() => false);
  }
  await page.screenshot({ path: `${folder}/viewer-${study}.png` });
  check(isShown, `no picture of ${study}`);
  check(failed.length === before, `${study}: ${failed.slice(before).join('\n  ')}`);
}
await browser.close();
report(`${studies.length} studies`);
