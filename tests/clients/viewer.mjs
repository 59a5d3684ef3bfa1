// Opens studies of each kind in a viewer's page under headless Chromium, as readers do, and looks at what is shown. Answers
// that failed, errors of the page's programs and dialogs that tell of failures are faults.
//
// usage: node viewer.mjs http://localhost:PORT FOLDER FILE [KIND...]
//
// FOLDER receives screenshots. FILE is brought in by the viewer before anything is opened. The one kind "reading" is for a
// server that takes no objects.

import { check, report, root, value } from './archive.mjs';
import { kPatience, launch, newPage as newViewerPage, timing } from './pictures.mjs';

const [folder, file, ...chosen] = process.argv.slice(3);

const kUrl = 'viewer?StudyInstanceUIDs=';

// What is asked for, and what has to be seen of it. `series` is opened by two clicks, for kinds that are not what comes first.
const kinds = [
  { name: 'ct', query: 'PatientID=VIEWER-CT', sees: 'picture' },
  { name: 'seg', query: 'PatientID=VIEWER-CT', series: 'SEG', sees: 'colour' },
  { name: 'mpr', query: 'ModalitiesInStudy=MR&PatientName=*', mode: '&hangingprotocolId=mpr', sees: 'picture', viewports: 3 },
  { name: 'pet', query: 'PatientID=VIEWER-PT', sees: 'picture' },
  { name: 'us', query: 'PatientID=VIEWER-US', sees: 'colour' },
  { name: 'xa', query: 'PatientID=VIEWER-XA', sees: 'picture' },
  { name: 'ecg', query: 'PatientID=VIEWER-ECG', sees: 'colour' },
  { name: 'pdf', query: 'PatientID=VIEWER-DOC', sees: 'document' },
  { name: 'sr', query: 'ModalitiesInStudy=SR&PatientName=*', series: 'SR', sees: 'text' },
];

// Searches as the list writes them into its address, and who has to be the only one left.
const searches = [
  ['patientName=viewer', 'Viewer,'],
  ['mrn=VIEWER-XA', 'Viewer, XA'],
  ['accession=ACC-5', 'Viewer, ECG'],
  ['description=trial of PT', 'Viewer, PT'],
  ['modalities=ECG', 'Viewer, ECG'],
  ['startDate=20260301&endDate=20260301', 'Viewer,'],
];

/// In the page, whether it shows what is to be seen.
const sights = {
  picture: (viewports) => window.looks().filter(({ least, most }) => most - least > 40).length >= viewports,
  colour: () => window.looks().some(({ colours }) => colours > 4),
  document: () => document.querySelector('object[data], iframe[src], embed[src]') !== null,
  text: () => /Findings|Measurement|Report|Content/i.test(document.querySelector('[data-cy="viewport-pane"], [data-viewportid]')?.innerText ?? ''),
};

const browser = await launch();

/// A new page whose faults are told under the name.
async function newPage(name) {
  const page = await newViewerPage(browser);
  page.on('response', (answer) => check(answer.status() < 400, `${name}: ${answer.status()} ${answer.url()}`));
  page.on('requestfailed', (request) => check(request.failure()?.errorText === 'net::ERR_ABORTED',
    `${name}: ${request.failure()?.errorText} ${request.url().slice(0, 200)}`));
  page.on('pageerror', (error) => check(false, `${name}: ${error}`));
  page.on('console', (message) => check(message.type() !== 'error', `${name}: ${message.text().slice(0, 300)}`));
  page.on('dialog', (dialog) => check(false, `${name}: ${dialog.message()}`) ?? dialog.dismiss());
  return page;
}

async function openKind({ name, query, mode = '', series, sees, viewports = 1 }) {
  const answer = await fetch(`${root}/dicom-web/studies?${query}&limit=1`);
  const study = value((await answer.json())[0], '0020000D');
  if (!study) return check(false, `${name}: the archive has no such study`);
  const page = await newPage(name);
  await page.goto(`${root}/viewer/${kUrl}${study}${mode}`, { waitUntil: 'domcontentloaded' });
  if (series) {
    const entry = await page.waitForFunction((modality) => [...document.querySelectorAll('[data-cy^="study-browser-thumbnail"]')]
      .find((one) => one.innerText.trim().startsWith(modality)), {}, series);
    await entry.click({ count: 2 });
  }
  await page.waitForFunction(sights[sees], { polling: 100 }, viewports).catch(() => check(false, `${name}: nothing is shown`));
  // A document's own viewer keeps its request.
  await page.waitForNetworkIdle({ idleTime: 500, concurrency: 1 }).catch(() => check(false, `${name}: requests do not end`));
  const told = await page.evaluate(() => document.body.innerText.match(/[^\n]*(not available|went wrong|failed|error)[^\n]*/i)?.[0]);
  check(!told, `${name}: "${told}" is shown`);
  await page.screenshot({ path: `${folder}/${name}.png` });
  console.log(name.padEnd(6), JSON.stringify(await page.evaluate(timing)));
  await page.close();
}

/// The list of studies, searched by each of its fields.
async function searchList() {
  const page = await newPage('list');
  for (const [query, left] of searches) {
    await page.goto(`${root}/viewer/?${encodeURI(query)}`, { waitUntil: 'domcontentloaded' });
    await page.waitForFunction((who) => {
      const rows = [...document.querySelectorAll('tbody tr')].map((one) => one.innerText.trim()).filter((one) => one && !one.endsWith('Reset'));
      return rows.length > 0 && rows.every((one) => one.startsWith(who));
    }, { polling: 100, timeout: kPatience / 3 }, left).catch(() => check(false, `list: ${query} does not leave ${left} alone`));
  }
  await page.screenshot({ path: `${folder}/list.png` });
  await page.close();
}

const buttonOf = (page, words) => page.waitForFunction((text) => [...document.querySelectorAll('button')]
  .find((one) => one.innerText.trim() === text), { polling: 100 }, words);

async function openList(name) {
  const page = await newPage(name);
  await page.goto(`${root}/viewer/`, { waitUntil: 'domcontentloaded' });
  await page.waitForFunction(() => document.querySelectorAll('tbody tr').length > 1, { polling: 100 });
  return page;
}

async function findNoUpload() {
  const page = await openList('reading');
  check(!await page.evaluate(() => [...document.querySelectorAll('button')].some((one) => one.innerText.trim() === 'Upload')),
    'reading: an upload is offered by a server that takes no objects');
  await page.close();
}

/// Drops the file on the dialogue; the list shows its study then.
async function uploadFile() {
  const page = await openList('upload');
  await (await buttonOf(page, 'Upload')).click();
  const place = await page.waitForFunction(() => [...document.querySelectorAll('div')]
    .find((one) => one.innerText === 'or drag images or folders here'), { polling: 100 });
  const { x, y } = await place.clickablePoint();
  const link = await page.createCDPSession();
  for (const type of ['dragEnter', 'dragOver', 'drop'])
    await link.send('Input.dispatchDragEvent', { type, x, y, data: { items: [], files: [file], dragOperationsMask: 1 } });
  const close = await buttonOf(page, 'Close');
  check(await page.evaluate(() => document.body.innerText.includes('Completed!')), 'upload: it is not told as completed');
  await page.screenshot({ path: `${folder}/upload.png` });
  await close.click();
  await page.waitForFunction(() => [...document.querySelectorAll('tbody tr')].some((one) => one.innerText.startsWith('Viewer, XA')),
    { polling: 100 }).catch(() => check(false, 'upload: the list does not show what was brought in'));
  await page.close();
}

if (chosen.includes('reading')) {
  await findNoUpload();
  await browser.close();
  report('1 list');
}
await uploadFile();
if (chosen.length === 0 || chosen.includes('list')) await searchList();
const opened = kinds.filter(({ name }) => chosen.length === 0 || chosen.includes(name));
for (const kind of opened) await openKind(kind).catch((error) => check(false, `${kind.name}: ${error.message}`));
await browser.close();
report(`${opened.length + 2} kinds`);
