// Sends files to the archive, some at a time, each by a request of its own, so that of each it is known what became of it.
// Browsers read files as they send them: however many there are, they take no memory. It goes on while the page shows
// something else.

import { config, reasonIn } from './api.js';
import { isObject } from './upload-files.js';

const atOnce = 4; // a browser has six connections to a server, and the page wants to show something meanwhile
const attempts = 4;
const pause = 2000; // [ms] before the first repeat, and more before each further one

const failed = 0x0110;

const reasons = {
  [failed]: 'The archive failed; it may be sent again.',
  0x0111: 'The study has another object of this UID.',
  0x0124: 'It is of a study that you may not store into.',
  0xA700: 'There is no room for it, or it is too large.',
  0xA900: 'Its meta information names another object than its header.',
  0xC000: 'It is damaged, or lacks the UIDs by which it would be found.',
};

/** What became of all that was given since the page was opened. Listeners are called with every change. */
export const queue = {
  items: [], // {path, file, size, loaded, state, reason}; the file is null when it is not needed any more
  counts: { waiting: 0, sending: 0, stored: 0, refused: 0, unsent: 0, skipped: 0 }, // of the items, by their states
  bytes: 0, // of all that are objects, or may be
  sent: 0, // of these bytes
  studies: new Map(), // how many objects were stored in each, by UID
  arrived: 0, // objects that were ever stored
  listeners: new Set(),
};

let reading = 0; // so many gifts are still being looked through
let senders = 0;
let waiting = [];
let ending = new AbortController();

export const isBusy = () => senders > 0 || reading > 0;
export const canRetry = () => queue.items.some((item) => item.state === 'unsent' && item.file !== null);

function changed() {
  for (const listener of queue.listeners) listener();
}

function load(item, bytes) {
  queue.sent += bytes - item.loaded;
  item.loaded = bytes;
}

function become(item, state, reason = '') {
  if (item.state) --queue.counts[item.state];
  ++queue.counts[state];
  Object.assign(item, { state, reason });
  load(item, state === 'stored' || state === 'refused' ? item.size : 0);
  if (state === 'skipped') queue.bytes -= item.size;
  if (['stored', 'refused', 'skipped'].includes(state)) item.file = null;
  changed();
}

function arrive(study) {
  ++queue.arrived;
  queue.studies.set(study, (queue.studies.get(study) ?? 0) + 1);
}

function wait(item) {
  become(item, 'waiting');
  waiting.push(item);
  if (senders < atOnce) sendAll();
}

/** Takes what a source yields, {path, file}, and begins to send. */
export async function add(files) {
  const { signal } = ending;
  ++reading;
  try {
    for await (const { path, file } of files) {
      if (signal.aborted) break;
      const item = { path, file, size: file?.size ?? 0, loaded: 0, state: '', reason: '' };
      queue.items.push(item);
      queue.bytes += item.size;
      if (file === null) become(item, 'unsent', 'It cannot be read.');
      else wait(item);
    }
  } finally {
    --reading;
    changed();
  }
}

export function retry() {
  for (const item of queue.items) if (item.state === 'unsent' && item.file !== null) wait(item);
}

function giveUp(reason) {
  const left = waiting;
  waiting = [];
  for (const item of left) become(item, 'unsent', reason);
}

/** What is on its way is broken off; what the archive has by then it keeps. */
export function cancel() {
  ending.abort();
  ending = new AbortController();
  giveUp('Cancelled.');
}

export function clear() {
  if (isBusy()) return;
  for (const item of queue.items) --queue.counts[item.state];
  Object.assign(queue, { items: [], bytes: 0, sent: 0, studies: new Map() });
  changed();
}

async function sendAll() {
  ++senders;
  while (waiting.length > 0) await send(waiting.shift(), ending.signal);
  --senders;
  changed();
}

/** A server that is busy or starts anew is asked again. When it is of no use, what waits need not find that out one by one. */
async function send(item, signal) {
  become(item, 'sending');
  for (let attempt = 1; ; ++attempt) {
    const is = await isObject(item.file).catch(() => null);
    if (is === null) return become(item, 'unsent', 'It cannot be read.');
    if (!is) return become(item, 'skipped', 'It is no DICOM object.');
    const answer = signal.aborted ? null : await post(item, signal);
    if (signal.aborted) return become(item, 'unsent', 'Cancelled.');
    const outcome = outcomeOf(answer);
    if (outcome.state === 'stored') arrive(outcome.study);
    if (outcome.state) return become(item, outcome.state, outcome.reason);
    if (!outcome.isPassing || attempt === attempts || !navigator.onLine) {
      giveUp(outcome.reason);
      return become(item, 'unsent', outcome.reason);
    }
    load(item, 0);
    await rest(pause * attempt, signal);
  }
}

function rest(time, signal) {
  return new Promise((done) => {
    const timer = setTimeout(done, time);
    signal.addEventListener('abort', () => { clearTimeout(timer); done(); }, { once: true });
  });
}

/** The request when it has ended. Only by this means browsers tell how much is sent. */
function post(item, signal) {
  return new Promise((done) => {
    const request = new XMLHttpRequest();
    const abort = () => request.abort();
    request.open('POST', `${config.dicomWeb}/studies`);
    request.setRequestHeader('Accept', 'application/dicom+json');
    request.setRequestHeader('Content-Type', 'application/dicom');
    request.upload.addEventListener('progress', (event) => {
      load(item, Math.min(event.loaded, item.size));
      changed();
    });
    request.addEventListener('loadend', () => {
      signal.removeEventListener('abort', abort);
      done(request);
    });
    signal.addEventListener('abort', abort);
    request.send(item.file);
  });
}

const first = (object, tag) => object?.[tag]?.Value?.[0];

function reportIn(request, type) {
  try {
    return type.startsWith('application/dicom+json') ? JSON.parse(request.responseText) : {};
  } catch (fault) {
    return {};
  }
}

/** With a state: of this object. Without: of the server, for a moment (`isPassing`) or until somebody does something. */
function outcomeOf(request) {
  const { status } = request;
  if (status === 0) return { reason: 'The server cannot be reached.', isPassing: true };
  const type = request.getResponseHeader('Content-Type') ?? '';
  const report = reportIn(request, type);
  const stored = first(report, '00081199');
  if (stored) return { state: 'stored', study: decodeURIComponent(/\/studies\/([^/]+)/.exec(first(stored, '00081190'))?.[1] ?? '') };
  const code = first(first(report, '00081198') ?? first(report, '0008119A'), '00081197');
  const reason = code === undefined ? reasonIn(status, type, request.responseText)
    : reasons[code] ?? `The archive refuses it (${code.toString(16).toUpperCase()}).`;
  if ([408, 502, 503, 504].includes(status)) return { reason, isPassing: true };
  if (code !== undefined) return { state: code === failed ? 'unsent' : 'refused', reason };
  if (status === 400 || status === 413) return { state: 'refused', reason };
  return { reason: status === 401 ? 'Your session has ended. Sign in again in another tab, and send again.' : reason };
}

addEventListener('beforeunload', (event) => { if (isBusy()) event.preventDefault(); });
