// Sends files to the archive, some at a time, one request after the other. It goes on while the page shows something else.

import { config, reasonOf } from './api.js';
import { objectUID } from './upload-files.js';

const mostBytes = 8 * 1024 * 1024; // of a request, which may be one larger file
const mostFiles = 40;
const attempts = 4;
const pause = 2000; // [ms] before the first repeat

const failed = 0x0110;

const reasons = {
  [failed]: 'The archive failed. It may be sent again.',
  0x0111: 'The study has another object of this UID.',
  0xA700: 'There is no room for it, or it is too large.',
  0xA900: 'Its header names two different objects.',
  0xC000: 'It is no sound DICOM object.',
  0xC001: 'It is of another study.',
};

/** What became of everything that was given since the page was opened. Listeners are called with every change. */
export const queue = {
  items: [], // {path, file, size, state, reason, study}
  bytes: 0, // of all that can be sent
  sent: 0, // of those of which something was told
  isRunning: false,
  isReading: 0, // so many givings are still being looked through
  listeners: new Set(),
};

let waiting = [];
let ending = null;

function changed() {
  for (const listener of queue.listeners) listener();
}

export function count(state) {
  return queue.items.reduce((sum, item) => sum + (item.state === state ? 1 : 0), 0);
}

/** Takes what a source of files yields, and begins to send. */
export async function add(files) {
  ++queue.isReading;
  changed();
  try {
    for await (const { file, path } of files) {
      const item = { path, file, size: file.size, state: 'waiting', reason: '', study: '' };
      const uid = await objectUID(file).catch(() => undefined);
      if (uid === undefined) Object.assign(item, { state: 'unsent', reason: 'The file cannot be read.' });
      else if (uid === null) Object.assign(item, { state: 'skipped', reason: 'It is no DICOM object.' });
      else take(Object.assign(item, { uid }));
      queue.items.push(item);
      changed();
    }
  } finally {
    --queue.isReading;
    changed();
  }
}

function take(item) {
  queue.bytes += item.size;
  waiting.push(item);
  if (!queue.isRunning) run();
}

/** Whatever was not sent waits again. */
export function retry() {
  for (const item of queue.items.filter((one) => one.state === 'unsent' && one.uid !== undefined)) {
    queue.sent -= item.size;
    queue.bytes -= item.size;
    Object.assign(item, { state: 'waiting', reason: '' });
    take(item);
  }
  changed();
}

/** What is on its way is broken off; what the archive has by then it keeps. */
export function cancel() {
  const left = waiting;
  waiting = [];
  for (const item of left) settle(item, 'unsent', 'It was cancelled.');
  ending?.abort();
  changed();
}

export function clear() {
  if (queue.isRunning || queue.isReading > 0) return;
  Object.assign(queue, { items: [], bytes: 0, sent: 0 });
  changed();
}

function settle(item, state, reason = '', study = '') {
  Object.assign(item, { state, reason, study });
  queue.sent += item.size;
}

/** At most so many, and no two of one UID: of these nobody could tell which one an answer is about. */
function nextBatch() {
  const batch = [];
  const uids = new Set();
  let bytes = 0;
  while (waiting.length > 0 && batch.length < mostFiles) {
    const [item] = waiting;
    if (batch.length > 0 && (bytes + item.size > mostBytes || uids.has(item.uid))) break;
    batch.push(waiting.shift());
    uids.add(item.uid);
    bytes += item.size;
  }
  return batch;
}

async function run() {
  queue.isRunning = true;
  ending = new AbortController();
  // What is given at once goes together.
  await new Promise((done) => { setTimeout(done, 50); });
  while (waiting.length > 0) {
    const batch = nextBatch();
    await sendPatiently(batch, ending.signal);
    if (ending.signal.aborted) ending = new AbortController();
    changed();
  }
  queue.isRunning = false;
  changed();
}

function rest(time, signal) {
  return new Promise((done) => {
    const timer = setTimeout(done, time);
    signal.addEventListener('abort', () => { clearTimeout(timer); done(); });
  });
}

/** A server that is busy or starts anew is asked again: what it has already it knows. */
async function sendPatiently(batch, signal) {
  let reason = '';
  for (let attempt = 0; attempt < attempts && !signal.aborted; ++attempt) {
    if (attempt > 0) await rest(pause * attempt, signal);
    try {
      const answer = await send(batch, signal);
      if (answer.report) {
        tell(batch, answer.report);
        return;
      }
      reason = answer.reason;
      if (!answer.isPassing) break;
    } catch (fault) {
      reason = 'The server cannot be reached.';
    }
  }
  for (const item of batch) settle(item, 'unsent', signal.aborted ? 'It was cancelled.' : reason);
}

async function send(batch, signal) {
  const boundary = `upload-${crypto.getRandomValues(new Uint32Array(4)).join('-')}`;
  // Files are read as they are sent.
  const body = new Blob([...batch.flatMap((item) =>
    [`\r\n--${boundary}\r\nContent-Type: application/dicom\r\n\r\n`, item.file]), `\r\n--${boundary}--\r\n`]);
  const response = await fetch(`${config.dicomWeb}/studies`, { method: 'POST', body, signal, credentials: 'same-origin',
    headers: { Accept: 'application/dicom+json', 'Content-Type': `multipart/related; type="application/dicom"; boundary=${boundary}` } });
  const type = response.headers.get('Content-Type') ?? '';
  if ([200, 202, 409].includes(response.status) && type.startsWith('application/dicom+json')) return { report: await response.json() };
  return { reason: await reasonOf(response), isPassing: response.status === 503 || response.status === 502 || response.status === 504 };
}

function items(report, sequence) {
  return report[sequence]?.Value ?? [];
}

const first = (object, tag) => object[tag]?.Value?.[0];

/** What is named in no list is one of those of which the server knows no name. */
function tell(batch, report) {
  const byUID = new Map(batch.map((item) => [item.uid, item]));
  const left = new Set(batch);
  const settleOne = (object, state) => {
    const item = byUID.get(first(object, '00081155'));
    if (!left.delete(item)) return;
    const code = first(object, '00081197');
    const study = /\/studies\/([^/]+)/.exec(first(object, '00081190') ?? '')?.[1] ?? '';
    settle(item, code === failed ? 'unsent' : state, code === undefined ? '' : reasons[code] ?? `The archive refuses it (${code}).`, study);
  };
  for (const object of items(report, '00081199')) settleOne(object, first(object, '00091001') === 'KNOWN' ? 'known' : 'stored');
  for (const object of items(report, '00081198')) settleOne(object, 'refused');
  for (const item of left) settle(item, 'refused', reasons[0xC000]);
}

addEventListener('beforeunload', (event) => { if (queue.isRunning) event.preventDefault(); });
