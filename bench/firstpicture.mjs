// How long a viewer takes to show a study's first picture, by the page's own clock, as JSON.
//
// usage: node firstpicture.mjs ADDRESS        a study in a viewer, with nothing kept from an earlier visit

import { kPatience, launch, newPage, timing } from '../tests/clients/pictures.mjs';

const browser = await launch();
const page = await newPage(browser);
await page.goto(process.argv[2], { waitUntil: 'domcontentloaded' });
await page.waitForFunction(() => window.firstPicture, { polling: 100, timeout: kPatience });
console.log(JSON.stringify(await page.evaluate(timing)));
await browser.close();
