// Brings files into the archive: by dropping them, or by choosing files or a folder. What became of each stands below.

import { config, Failure } from './api.js';
import { announce, h, icon } from './dom.js';
import { amount, bytes } from './format.js';
import { hints } from './keys.js';
import { studyLink, trail } from './study.js';
import { add, cancel, clear, count, queue, retry } from './upload-queue.js';
import { filesOfDrop, filesOfInput } from './upload-files.js';

const mostRows = 500;
const words = { waiting: 'Waiting', stored: 'Stored', known: 'Was there', refused: 'Refused', skipped: 'Passed over', unsent: 'Not sent' };
// Those that ask for something stand above.
const order = ['refused', 'unsent', 'waiting', 'stored', 'known', 'skipped'];

/** Calls `show` with every change, at most once for each picture that the browser draws. */
function follow(view, show) {
  let isAsked = false;
  const listener = () => {
    if (isAsked) return;
    isAsked = true;
    // Browsers draw nothing of a page that is out of sight.
    setTimeout(() => { isAsked = false; if (!view.signal.aborted) show(); }, 100);
  };
  queue.listeners.add(listener);
  view.signal.addEventListener('abort', () => queue.listeners.delete(listener));
  show();
}

const isBusy = () => queue.isRunning || queue.isReading > 0;
const percent = () => (queue.bytes > 0 ? Math.floor((100 * queue.sent) / queue.bytes) : 0);

/** Whatever is dropped on the page is taken, wherever it falls. */
function takeDrops(view, taken) {
  const isFiles = (event) => event.dataTransfer?.types.includes('Files');
  const mark = (isOver) => document.body.classList.toggle('drop-over', isOver);
  const options = { signal: view.signal };
  addEventListener('dragover', (event) => { if (isFiles(event)) { event.preventDefault(); mark(true); } }, options);
  addEventListener('dragleave', (event) => { if (event.relatedTarget === null) mark(false); }, options);
  addEventListener('drop', (event) => {
    if (!isFiles(event)) return;
    event.preventDefault();
    mark(false);
    add(filesOfDrop(event.dataTransfer));
    taken();
  }, options);
  view.signal.addEventListener('abort', () => mark(false));
}

export function dropsLeadToUpload(view) {
  takeDrops(view, () => { location.hash = '#/upload'; });
}

/** Leads to the upload, and tells how far it is. */
export function progressLink(view) {
  const text = h('span', {});
  follow(view, () => { text.textContent = isBusy() ? `Uploading, ${percent()} %` : 'Upload'; });
  return h('a', { class: 'button upload-link', href: '#/upload' }, icon('send'), text);
}

function chooser(label, symbol, properties) {
  const input = h('input', { type: 'file', class: 'unseen', multiple: true, tabindex: -1, 'aria-hidden': 'true', ...properties });
  input.addEventListener('change', async () => {
    await add(filesOfInput(input));
    input.value = '';
  });
  return [h('button', { class: 'button', type: 'button', onclick: () => input.click() }, icon(symbol), label), input];
}

function zone() {
  return h('div', { class: 'panel drop-zone' }, icon('send'), h('p', {}, 'Drop DICOM files or folders here'),
    h('div', { class: 'choosers' }, chooser('Choose files', 'send', { id: 'upload-files' }),
      chooser('Choose a folder', 'folder', { id: 'upload-folder', webkitdirectory: true })));
}

function row(item) {
  const told = item.reason || (item.study ? h('a', { href: studyLink(decodeURIComponent(item.study)) }, 'Study') : '');
  return h('li', { class: `upload-row is-${item.state}` }, h('span', { class: 'path value' }, item.path),
    h('span', { class: 'soft number' }, bytes(item.size)), h('span', { class: 'outcome' }, words[item.state]),
    h('span', { class: 'told' }, told));
}

function counts() {
  return order.map((state) => [state, count(state)]).filter(([, number]) => number > 0)
    .map(([state, number]) => h('span', { class: `outcome-count is-${state}` }, `${words[state]} `, h('b', {}, number)));
}

function finding() {
  const failed = count('refused') + count('unsent');
  return failed > 0 ? `Done. ${amount(failed, 'file')} not stored.` : `Done. ${amount(count('stored') + count('known'), 'object')} in the archive.`;
}

class UploadPanel {
  constructor() {
    this.bar = h('progress', { class: 'upload-bar', max: 100, 'aria-label': 'Uploaded' });
    this.line = h('p', { class: 'upload-line' });
    this.counts = h('p', { class: 'upload-counts' });
    this.cancel = h('button', { class: 'button', type: 'button', onclick: cancel }, 'Cancel');
    this.retry = h('button', { class: 'button', type: 'button', onclick: retry }, 'Send again');
    this.clear = h('button', { class: 'button', type: 'button', onclick: clear }, 'Clear the list');
    this.rows = h('ol', { class: 'upload-rows', 'aria-label': 'What became of each file' });
    this.more = h('p', { class: 'note' });
    this.panel = h('section', { class: 'panel upload-panel', 'aria-label': 'Progress' }, this.bar,
      h('div', { class: 'upload-head' }, this.line, h('div', { class: 'actions' }, this.retry, this.cancel, this.clear)),
      this.counts, this.rows, this.more);
    this.wasBusy = isBusy();
  }

  show() {
    const isNow = isBusy();
    this.panel.hidden = queue.items.length === 0 && !isNow;
    this.bar.value = queue.bytes > 0 ? percent() : isNow ? 0 : 100;
    this.line.textContent = isNow ? `${bytes(queue.sent)} of ${bytes(queue.bytes)}${queue.isReading > 0 ? ', looking for more' : ''}` : finding();
    this.counts.replaceChildren(...counts());
    this.cancel.hidden = !queue.isRunning;
    this.retry.hidden = isNow || !queue.items.some((item) => item.state === 'unsent' && item.uid !== undefined);
    this.clear.hidden = isNow;
    const sorted = order.flatMap((state) => queue.items.filter((item) => item.state === state));
    this.rows.replaceChildren(...sorted.slice(0, mostRows).map(row));
    this.more.textContent = sorted.length > mostRows ? `and ${sorted.length - mostRows} more` : '';
    if (this.wasBusy && !isNow) announce(this.line.textContent);
    this.wasBusy = isNow;
  }
}

export function uploadView(view) {
  if (!config.may.includes('store')) throw new Failure('absent', 'This server takes no objects from you.');
  view.title('Upload');
  const panel = new UploadPanel();
  view.replace(trail(['Upload']), h('h1', { class: 'unseen' }, 'Upload'), zone(), panel.panel, hints(h, [[['Esc'], 'studies']]));
  takeDrops(view, () => {});
  follow(view, () => panel.show());
  view.keys = { Escape: () => { location.hash = '#/'; } };
}
