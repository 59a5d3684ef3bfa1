// Walks the study browser in headless Chromium by keyboard, as a reader does: list, study, image, differences, volumes,
// corrections, uploads. A study of the archive bears a name that is markup, and nothing of it may come alive.
//
// usage: node page.mjs http://HOST:PORT FOLDER-TO-UPLOAD [FOLDER FOR PICTURES]
//
// Modules are looked for in KDD_NODE_MODULES, the browser in CHROMIUM.

import { createRequire } from 'node:module';
import { mkdirSync, readdirSync, readFileSync } from 'node:fs';
import { join } from 'node:path';

const [, , root, uploads, folder] = process.argv;
const require = createRequire(`${process.env.KDD_NODE_MODULES}/`);
const puppeteer = require('puppeteer-core');

const looks = [];
for (const scheme of ['light', 'dark'])
  for (const [size, width, height] of [['wide', 1440, 900], ['narrow', 390, 844]]) looks.push({ scheme, size, width, height });

const faults = [];
let checks = 0;

function check(holds, what) {
  ++checks;
  if (!holds) faults.push(what);
}

const browser = await puppeteer.launch({
  executablePath: process.env.CHROMIUM ?? '/usr/bin/chromium', args: ['--no-sandbox', '--disable-gpu'],
});
const page = await browser.newPage();
page.setDefaultTimeout(30000);
page.on('pageerror', (error) => faults.push(`script: ${error.message}`));
page.on('console', (message) => message.type() === 'error' && faults.push(`console: ${message.text()} ${message.location()?.url ?? ''}`));
page.on('dialog', (dialog) => { faults.push(`dialog: ${dialog.message()}`); dialog.dismiss(); });
page.on('request', (request) => request.url().startsWith(root) || request.url().startsWith('data:') || faults.push(`asks ${request.url()}`));

const all = (selector) => page.$$eval(selector, (found) => found.length);
const text = (selector) => page.$eval(selector, (found) => found.textContent);
const focused = (selector) => page.evaluate((one) => document.activeElement?.matches(one) ?? false, selector);
const address = () => page.evaluate(() => decodeURIComponent(location.hash));

/** Until the condition holds in the page; what it waited for is the fault when it never does. */
async function until(what, condition, ...values) {
  ++checks;
  await page.waitForFunction(condition, {}, ...values).catch(() => faults.push(`waited in vain: ${what}`));
}

const present = (selector) => until(selector, (one) => document.querySelector(one) !== null, selector);

/** Pictures in sight have come, or it is known that there are none. */
async function settled() {
  await until('pictures', () => [...document.querySelectorAll('img')].every((one) => {
    const place = one.getBoundingClientRect();
    const isSeen = place.width > 0 && place.bottom > 0 && place.top < innerHeight && place.right > 0 && place.left < innerWidth;
    return !isSeen || one.complete;
  }) && !document.querySelector('[aria-busy=true]'));
}

async function shoot(name) {
  if (!folder) return;
  mkdirSync(folder, { recursive: true });
  for (const { scheme, size, width, height } of looks) {
    await page.emulateMediaFeatures([{ name: 'prefers-color-scheme', value: scheme }]);
    await page.setViewport({ width, height });
    await settled();
    const overflow = await page.evaluate(() => document.documentElement.scrollWidth - innerWidth);
    check(overflow <= 0, `${name}, ${size}: the page is ${overflow} pixels wider than the window`);
    await page.screenshot({ path: join(folder, `${name}-${size}-${scheme}.png`) });
  }
  await page.emulateMediaFeatures([]);
  await page.setViewport({ width: 1440, height: 900 });
}

async function search(name) {
  await page.keyboard.press('/');
  check(await focused('#by-name'), '"/" does not lead to the search');
  await page.keyboard.type(name);
  await until(`a list of ${name}`, (part) => {
    const rows = [...document.querySelectorAll('.study .first')];
    return rows.length > 0 && rows.every((row) => row.textContent.toLowerCase().includes(part));
  }, name.toLowerCase());
}

async function walkList() {
  await page.goto(`${root}/`);
  await present('.study');
  const whole = await all('.study');
  await settled();
  await shoot('list');
  await search('<img');
  check((await text('.study .first')).startsWith('<img src'), 'the name that is markup is not shown as text');
  check((await text('.study .what')).includes('<script>'), 'the description that is markup is not shown as text');
  await page.keyboard.press('Escape');
  await until('the whole list', (count) => document.querySelectorAll('.study').length === count, whole);
  await page.keyboard.press('ArrowDown');
  check(await focused('.study'), 'an arrow does not lead into the list');
  await page.keyboard.press('End');
  check(await page.evaluate(() => document.activeElement === [...document.querySelectorAll('.study')].pop()), 'End does not lead to the last study');
}

async function openStudy(query) {
  await page.goto(`${root}/#/?${query}`);
  await until(`one study of ${query}`, () => document.querySelectorAll('.study').length === 1);
  await page.keyboard.press('ArrowDown');
  await page.keyboard.press('Enter');
  await present('.strip .tile[href]');
}

async function walkStudy() {
  await openStudy('name=ller&modality=CT');
  check((await address()).startsWith('#/studies/'), 'Enter does not open the study');
  await present('.sizes');
  await shoot('study');
  await page.keyboard.press('ArrowDown');
  check(await focused('.strip .tile'), 'an arrow does not lead into the strip');
  await present('.series:nth-child(2) .tile[tabindex="0"]');
  await page.keyboard.press('ArrowDown');
  check(await focused('.series:nth-child(2) .tile'), 'an arrow does not lead to the next strip');
  for (let i = 0; i < 3; ++i) await page.keyboard.press('ArrowRight');
  await page.keyboard.press('Enter');
  await present('.attribute');
}

async function walkImage() {
  const first = await address();
  const rows = await all('.attribute');
  check(rows > 30, `only ${rows} attributes are shown`);
  for (const origin of ['study', 'series', 'image']) check(await all(`.attribute .origin.of-${origin}`) > 0, `nothing is held by the ${origin}`);
  await shoot('image');
  await page.keyboard.press('/');
  await page.keyboard.type('patient name');
  await until('the filtered tree', () => document.querySelectorAll('.attribute').length < 5);
  check((await text('.attribute .text')).includes('ller'), 'the filter does not find the patient');
  await page.keyboard.press('Escape');
  await page.keyboard.press('Escape');
  await page.keyboard.press('ArrowDown');
  check(await focused('.attribute'), 'an arrow does not lead into the tree');
  await page.$eval('.attribute[aria-expanded=false]', (row) => row.focus());
  await page.keyboard.press('ArrowRight');
  check(await page.$eval('.attribute:focus', (row) => row.getAttribute('aria-expanded')) === 'true', 'a sequence does not open');
  await page.keyboard.press('ArrowLeft');
  await page.keyboard.press('n');
  await until('the next image', (former) => decodeURIComponent(location.hash) !== former, first);
  await page.goBack();
  await until('the image before', (former) => decodeURIComponent(location.hash) === former, first);
  await page.reload();
  await present('.attribute');
  check(await address() === first, 'a reload leads elsewhere');
}

async function walkSides() {
  await page.$eval('.aside .button[href*=difference]', (link) => link.focus());
  await page.keyboard.press('Enter');
  await present('.difference .b');
  check(await all('.difference mark') > 0, 'no difference is marked');
  await shoot('difference');
  await page.keyboard.press('Escape');
  await present('.tabs');
  await page.$eval('.tabs a[href$=volumes]', (link) => link.focus());
  await page.keyboard.press('Enter');
  await present('.volume .geometry');
  await shoot('volumes');
}

async function walkHostile() {
  await openStudy('name=%3Cimg');
  await page.$eval('.tabs a[href$=corrections]', (link) => link.focus());
  await page.keyboard.press('Enter');
  await present('.correction');
  check((await text('.correction header')).startsWith('2024-06-01 09:30:00anna'), 'the time of a correction is not the job\'s');
  await shoot('corrections');
  check(await page.evaluate(() => window.owned === undefined && !document.querySelector('img[src=x], main script')), 'markup of a value came alive');
  await page.goto(`${root}/#/studies/1.2.3.4.5.6.7.8.9`);
  await until('words for a study that is not there', () => document.querySelector('.state')?.textContent.includes('no such study'));
}

async function fill(selector, words) {
  await page.$eval(selector, (field) => { field.focus(); field.select(); });
  await page.keyboard.type(words);
}

/** Corrects a series behind a preview, by keyboard; a value is markup again. */
async function walkCorrect() {
  await openStudy('name=ller&modality=CT');
  const study = await address();
  await page.$eval('.tabs a[href$=correct]', (link) => link.focus());
  await page.keyboard.press('Enter');
  await present('.correcting');
  await page.select('.correcting select', '00100020');
  await fill('.correcting input[aria-label="New value"]', '<b>8</b>');
  await fill('#login', 'berta');
  await page.keyboard.press('Enter');
  await present('.preview .correction');
  check(await focused('.preview'), 'the preview does not get the focus');
  check((await text('.preview ins')) === '<b>8</b>', 'the new value is not shown as text');
  check(await page.$eval('.preview del', (old) => old.textContent !== '<b>8</b>'), 'the old value is not shown');
  await shoot('correct');
  await fill('.correcting input[aria-label="New value"]', 'x'.repeat(65));
  check(await all('.preview .correction') === 0, 'a preview stays although something else would be done');
  await page.select('.correcting select', '00100030');
  await page.keyboard.press('Enter');
  await present('.refusal');
  check((await text('.refusal')).includes('is no date'), 'it is not told why a correction is refused');
  await page.select('.correcting select', '00100020');
  await fill('.correcting input[aria-label="New value"]', '<b>9</b>');
  await page.keyboard.press('Enter');
  await present('.preview .button.main');
  await page.$eval('.preview .button.main', (button) => button.focus());
  await page.keyboard.press('Enter');
  await until('word of what was corrected', () => document.querySelector('.preview h2')?.textContent === 'Corrected');
  await page.goto(`${root}/${study}/corrections`);
  await present('.correction');
  check((await text('.correction header')).includes('berta'), 'it is not told who corrected');
  check(await all('.exports a[download]') === 2, 'the history cannot be taken along');
  check((await text('.correction ins')) === '<b>9</b>' && await all('main b b, .value b') === 0, 'markup of a value came alive');
  return study;
}

/** Deletes an image and then the study, but nothing before the words are typed. */
async function walkDelete(study) {
  await page.goto(`${root}/${study}/delete`);
  await present('#typed');
  const count = Number((await text('.change-form label b')).split(' ')[1]);
  await fill('#typed', `delete ${count + 1}`);
  check(await page.$eval('.button.danger', (button) => button.disabled), 'what is not confirmed can be deleted');
  await page.keyboard.press('Enter');
  await shoot('delete');
  check(await all('.preview h2') === 0, 'something was deleted that was not confirmed');
  await page.select('#choice', '1');
  const part = Number((await text('.change-form label b')).split(' ')[1]);
  check(part > 0 && part < count, 'a series is not named by its images');
  await fill('#typed', `delete ${part}`);
  await page.keyboard.press('Enter');
  await until('word of what was deleted', () => document.querySelector('.preview h2')?.textContent === 'Deleted');
  check((await text('.preview p')).startsWith(`${part} image`), 'it is not told how much is gone');
  await page.goto(`${root}/${study}`);
  await present('.series');
}

/** "Refused 1, Stored 3" */
const outcomes = () => page.$$eval('.outcome-count', (all) => all.map((one) => one.textContent).join(', '));

async function uploaded(what, expected) {
  await until(`the end of ${what}`, (counts) => document.querySelector('.upload-line')?.textContent.startsWith('Done') &&
    [...document.querySelectorAll('.outcome-count')].map((one) => one.textContent).join(', ') === counts, expected);
  const found = await outcomes();
  check(found === expected, `${what}: ${found}, not ${expected}`);
}

/** By the keyboard. */
async function choose(...files) {
  const waiting = page.waitForFileChooser();
  await page.focus('.choosers .button');
  await page.keyboard.press('Enter');
  await (await waiting).accept(files.map((one) => join(uploads, one)));
}

async function press(label) {
  const button = await page.evaluateHandle((words) => [...document.querySelectorAll('.button')].find((one) => one.textContent === words), label);
  await button.focus();
  await page.keyboard.press('Enter');
}

/** Files by the button, then their folder by dropping it on the list; some are there by then. */
async function walkUpload() {
  await page.goto(`${root}/#/`);
  await present('.study');
  await page.focus('.upload-link');
  await page.keyboard.press('Enter');
  await present('.drop-zone');
  await shoot('upload-empty');
  await choose(...readdirSync(uploads, { withFileTypes: true }).filter((one) => one.isFile()).map((one) => one.name));
  await uploaded('the files', 'Refused 1, Skipped 2, Stored 3');
  check((await text('.upload-row.is-refused')).startsWith('Refused4.dcmIt is damaged'), 'it is not told what is refused, and why');
  check(await page.$$eval('.is-skipped .path', (all) => all.some((one) => one.textContent === '<b>read-me<b>.txt')), 'a name that is markup is not shown as text');
  const study = await page.$eval('.upload-studies a', (link) => link.textContent.split(' ')[1]);
  await page.keyboard.press('Escape');
  await present(`.study[data-uid="${study}"]`);
  const link = await page.createCDPSession();
  const drop = (type) => link.send('Input.dispatchDragEvent', { type, x: 300, y: 300, data: { items: [], files: [uploads], dragOperationsMask: 1 } });
  for (const type of ['dragEnter', 'dragOver', 'drop']) await drop(type);
  await uploaded('the folder', 'Refused 2, Skipped 4, Stored 8');
  check(await address() === '#/upload', 'a drop on the list does not lead to the upload');
  await shoot('upload');
}

/** What does not get through, and what somebody breaks off, is sent when it is asked for again. */
async function walkUploadFaults() {
  await page.setOfflineMode(true);
  await choose('1.dcm', '2.dcm');
  await uploaded('files without a network', 'Refused 2, Not sent 2, Skipped 4, Stored 8');
  check((await text('.is-unsent .told')).includes('cannot be reached'), 'it is not told that the server cannot be reached');
  await page.setOfflineMode(false);
  await press('Send again');
  await uploaded('what was sent again', 'Refused 2, Skipped 4, Stored 10');
  await page.emulateNetworkConditions({ upload: 2000, download: 1e7, latency: 0 });
  await choose('1.dcm', '2.dcm', '3.dcm');
  await present('.upload-line');
  await until('the beginning', () => document.querySelector('.outcome-count.is-sending') !== null);
  await shoot('upload-busy');
  await press('Cancel');
  await uploaded('what is cancelled', 'Refused 2, Not sent 3, Skipped 4, Stored 10');
  await page.emulateNetworkConditions(null);
  await press('Send again');
  await uploaded('what was cancelled', 'Refused 2, Skipped 4, Stored 13');
  await press('Clear');
  await until('an empty list', () => document.querySelector('.upload-panel').hidden);
}

async function imagesThere() {
  const answer = await fetch(`${root}/dicom-web/studies?includefield=NumberOfStudyRelatedInstances`);
  return (await answer.json()).reduce((sum, one) => sum + one['00201208'].Value[0], 0);
}

/** Whatever a page of another origin can have a browser send, nothing is stored by it. */
async function walkForged() {
  const before = await imagesThere();
  const other = await browser.newPage();
  await other.goto('data:text/html,<form method=post enctype=multipart/form-data><input name=a value=b></form>');
  const object = readFileSync(join(uploads, '..', 'forged.dcm')).toString('base64');
  await other.evaluate(async (target, base64) => {
    const bytes = Uint8Array.from(atob(base64), (one) => one.charCodeAt(0));
    for (const type of ['application/dicom', 'text/plain', 'multipart/form-data; boundary=a'])
      for (const mode of ['cors', 'no-cors']) await fetch(target, { method: 'POST', mode, credentials: 'include', headers: { 'Content-Type': type }, body: bytes }).catch(() => null);
    navigator.sendBeacon(target, new Blob([bytes], { type: 'text/plain' }));
    await new Promise((done) => { Object.assign(new Image(), { onload: done, onerror: done, src: target }); });
  }, `${root}/dicom-web/studies`, object);
  const [answer] = await Promise.all([other.waitForNavigation(), other.$eval('form', (form, target) => { form.action = target; form.submit(); }, `${root}/dicom-web/studies`)]);
  check(answer.status() === 403, `a form of another page is answered by ${answer.status()}`);
  await other.close();
  check(await imagesThere() === before, 'a page of another origin stored something');
}

async function walkOffline() {
  await page.goto(`${root}/#/`);
  await present('.study');
  await page.setOfflineMode(true);
  await until('word of the lost connection', () => !document.getElementById('offline').hidden);
  await page.keyboard.press('ArrowDown');
  await page.keyboard.press('Enter');
  await until('words for a server that is out of reach', () => document.querySelector('.state')?.textContent.includes('cannot be reached'));
  await page.setOfflineMode(false);
  await present('.banner');
}

/** What Chromium says of an answer that the walk expects to fail is no fault of the page. */
function isExpected(fault) {
  return fault.startsWith('console: Failed to load resource') &&
    (fault.includes('/browser/studies/1.2.3.4.5.6.7.8.9') || fault.includes('/corrections?preview=true') ||
      fault.endsWith('/dicom-web/studies') || fault.includes('ERR_INTERNET_DISCONNECTED'));
}

try {
  await walkList();
  await walkStudy();
  await walkImage();
  await walkSides();
  await walkHostile();
  await walkDelete(await walkCorrect());
  await walkUpload();
  await walkUploadFaults();
  await walkForged();
  await walkOffline();
} catch (error) {
  faults.push(String(error));
}
await browser.close();
const found = faults.filter((fault) => !isExpected(fault));
for (const fault of found) console.error(fault);
console.log(`${checks} checks, ${found.length} faults`);
process.exitCode = found.length > 0 ? 1 : 0;
