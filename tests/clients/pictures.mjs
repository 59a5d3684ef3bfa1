// A viewer's page under headless Chromium, and what its viewports show.

import { createRequire } from 'node:module';

const require = createRequire(process.env.KDD_NODE_MODULES + '/');
const puppeteer = require('puppeteer-core');

// More than the slowest machine needs; nothing waits for it to pass.
export const kPatience = 180000;

export const launch = () => puppeteer.launch({
  executablePath: process.env.CHROMIUM ?? '/usr/bin/chromium',
  // Nothing but this machine can be reached, at a place of care too.
  args: ['--no-sandbox', '--host-resolver-rules=MAP * ~NOTFOUND, EXCLUDE localhost, EXCLUDE 127.0.0.1', '--use-gl=angle', '--use-angle=swiftshader', '--enable-unsafe-swiftshader'],
  protocolTimeout: 2 * kPatience,
});

/// In the page: notes when the first viewport shows something, by its own clock [ms].
function watchPictures() {
  localStorage.setItem('shownTours', '["basicViewerTour"]');
  const small = document.createElement('canvas');
  small.width = small.height = 64;
  const context = small.getContext('2d', { willReadFrequently: true });
  /// Of each viewport how far its grey values reach, and how many of its pixels have a colour.
  window.looks = () => [...document.querySelectorAll('.cornerstone-canvas, .viewport-element canvas')].map((canvas) => {
    context.clearRect(0, 0, 64, 64);
    context.drawImage(canvas, 0, 0, 64, 64);
    const { data } = context.getImageData(0, 0, 64, 64);
    const look = { least: 255, most: 0, colours: 0 };
    for (let i = 0; i < data.length; i += 4) {
      const [red, green, blue] = data.slice(i, i + 3);
      look.least = Math.min(look.least, green);
      look.most = Math.max(look.most, green);
      if (Math.max(red, green, blue) - Math.min(red, green, blue) > 30) ++look.colours;
    }
    return look;
  });
  const timer = setInterval(() => {
    if (!window.looks().some(({ least, most }) => most - least > 40)) return;
    window.firstPicture = performance.now();
    clearInterval(timer);
  }, 25);
}

/// A page that watches its pictures.
export async function newPage(browser) {
  const page = await browser.newPage();
  await page.setViewport({ width: 1400, height: 900 });
  page.setDefaultTimeout(kPatience);
  await page.evaluateOnNewDocument(watchPictures);
  return page;
}

/// In the page, null before a first picture: when [ms] data was first asked for, when the first frame was asked for and there,
/// and when the first picture was seen; how long the longest answer until that frame took, and how long in all at least one
/// answer was waited for.
export function timing() {
  const asked = performance.getEntriesByType('resource').filter((one) => one.name.includes('/dicom-web/'));
  const frame = asked.find((one) => one.name.includes('/frames/'));
  if (!window.firstPicture || !frame) return null;
  const busy = asked.filter((one) => one.startTime <= frame.startTime);
  let waited = 0;
  let until = 0;
  for (const one of busy.sort((a, b) => a.startTime - b.startTime)) {
    const end = Math.min(one.responseEnd, frame.responseEnd);
    waited += Math.max(0, end - Math.max(until, one.startTime));
    until = Math.max(until, end);
  }
  const round = Math.round;
  return {
    'first request': round(asked[0].startTime),
    'frame asked for': round(frame.startTime),
    'frame there': round(frame.responseEnd),
    'first picture': round(window.firstPicture),
    'longest answer': round(Math.max(...busy.map((one) => one.duration))),
    'waited for the archive': round(waited),
  };
}
