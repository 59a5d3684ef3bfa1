// Files into the archive: dropped anywhere on the page, or chosen.

import { Failure } from './api.js';
import { may } from './change-api.js';
import { announce, h, icon } from './dom.js';
import { amount, bytes } from './format.js';
import { hints } from './keys.js';
import { studyLink, trail } from './study.js';
import { add, cancel, canRetry, clear, isBusy, queue, retry } from './upload-queue.js';
import { filesOfDrop, filesOfInput } from './upload-files.js';

const mostRows = 500;
const mostStudies = 50;
const pause = 100; // [ms] between two looks at what has changed
const words = { refused: 'Refused', unsent: 'Not sent', skipped: 'Skipped', stored: 'Stored', sending: 'Being sent', waiting: 'Waiting' };
const toldStates = ['refused', 'unsent', 'skipped'];

/** Calls `show` now and then while something changes. */
export function follow(view, show) {
  let timer = 0;
  const listener = () => {
    timer ||= setTimeout(() => { timer = 0; show(); }, pause);
  };
  queue.listeners.add(listener);
  view.signal.addEventListener('abort', () => {
    clearTimeout(timer);
    queue.listeners.delete(listener);
  });
  show();
}

const percent = () => (queue.bytes > 0 ? Math.floor((100 * queue.sent) / queue.bytes) : 0);

/** Whatever is dropped on the page, wherever it falls, leads to the upload. */
export function takeDrops() {
  let isOwn = false; // a picture of the page is a file too
  addEventListener('dragstart', () => { isOwn = true; });
  addEventListener('dragend', () => { isOwn = false; });
  const isFiles = (event) => !isOwn && event.dataTransfer?.types.includes('Files');
  const mark = (isOver) => document.body.classList.toggle('drop-over', isOver);
  addEventListener('dragover', (event) => { if (isFiles(event)) { event.preventDefault(); mark(true); } });
  addEventListener('dragleave', (event) => { if (event.relatedTarget === null) mark(false); });
  addEventListener('drop', (event) => {
    if (!isFiles(event)) return;
    event.preventDefault();
    mark(false);
    add(filesOfDrop(event.dataTransfer));
    location.hash = '#/upload';
  });
}

/** Leads to the upload, and tells how far it is. */
export function uploadLink(view) {
  const text = h('span', {});
  follow(view, () => { text.textContent = isBusy() ? `Uploading, ${percent()} %` : 'Upload'; });
  return h('a', { class: 'button upload-link', href: '#/upload' }, icon('send'), text);
}

function chooser(label, symbol, properties) {
  const input = h('input', { type: 'file', class: 'unseen', multiple: true, tabindex: -1, 'aria-hidden': 'true', ...properties });
  input.addEventListener('change', () => {
    add(filesOfInput(input));
    input.value = '';
  });
  return [h('button', { class: 'button', type: 'button', onclick: () => input.click() }, icon(symbol), label), input];
}

function zone() {
  const takesFolders = 'webkitdirectory' in HTMLInputElement.prototype;
  return h('div', { class: 'panel drop-zone' }, icon('send'), h('p', {}, 'Drop DICOM files or folders here'),
    h('div', { class: 'choosers' }, chooser('Choose files', 'send', { id: 'upload-files' }),
      takesFolders && chooser('Choose a folder', 'folder', { id: 'upload-folder', webkitdirectory: true })));
}

function row(item) {
  return h('li', { class: `upload-row is-${item.state}` }, h('span', { class: 'outcome' }, words[item.state]),
    h('span', { class: 'path value' }, item.path), h('span', { class: 'told' }, item.reason));
}

function counts() {
  return Object.entries(words).filter(([state]) => queue.counts[state] > 0).map(([state, word]) =>
    h('span', { class: `outcome-count is-${state}` }, `${word} `, h('b', {}, queue.counts[state].toLocaleString('en'))));
}

function progress() {
  const { refused, skipped, stored } = queue.counts;
  return `${bytes(queue.sent)} of ${bytes(queue.bytes)}, ${(stored + refused).toLocaleString('en')} of ${amount(queue.items.length - skipped, 'object')}`;
}

function finding() {
  const { refused, stored, unsent } = queue.counts;
  return `Done. ${amount(stored, 'object')} in the archive${refused + unsent > 0 ? `, ${amount(refused + unsent, 'file')} not` : ''}.`;
}

class UploadPanel {
  constructor() {
    this.bar = h('progress', { class: 'upload-bar', max: 100, 'aria-label': 'Uploaded' });
    this.line = h('p', { class: 'upload-line' });
    this.counts = h('p', { class: 'upload-counts' });
    this.cancel = h('button', { class: 'button', type: 'button', onclick: cancel }, 'Cancel');
    this.retry = h('button', { class: 'button', type: 'button', onclick: retry }, 'Send again');
    this.clear = h('button', { class: 'button', type: 'button', onclick: clear }, 'Clear');
    this.studies = h('ul', { class: 'upload-studies', 'aria-label': 'Studies' });
    this.rows = h('ol', { class: 'upload-rows', 'aria-label': 'What is not stored, and why' });
    this.more = h('p', { class: 'note' });
    this.panel = h('section', { class: 'panel upload-panel', 'aria-label': 'Progress', tabindex: -1 }, this.bar,
      h('div', { class: 'upload-head' }, this.line, h('div', { class: 'actions' }, this.retry, this.cancel, this.clear)),
      this.counts, this.studies, this.rows, this.more);
    this.wasBusy = isBusy();
  }

  show() {
    const isNow = isBusy();
    this.panel.hidden = queue.items.length === 0;
    this.bar.value = percent();
    this.line.textContent = isNow ? progress() : finding();
    this.counts.replaceChildren(...counts());
    const focused = document.activeElement;
    this.cancel.hidden = !isNow;
    this.retry.hidden = isNow || !canRetry();
    this.clear.hidden = isNow;
    if (focused?.hidden) this.panel.focus();
    this.showStudies();
    this.showRows();
    if (this.wasBusy && !isNow) announce(this.line.textContent);
    this.wasBusy = isNow;
  }

  /** Links stay the elements that they are: one of them may have the focus. */
  showStudies() {
    const shown = [...queue.studies].slice(0, mostStudies);
    while (this.studies.children.length > shown.length) this.studies.lastChild.remove();
    shown.forEach(([uid, count], i) => {
      const entry = this.studies.children[i] ?? this.studies.appendChild(h('li', {}, h('a', { class: 'value' }), h('span', { class: 'soft' })));
      entry.firstChild.href = studyLink(uid);
      entry.firstChild.textContent = `Study ${uid}`;
      entry.lastChild.textContent = amount(count, 'object');
    });
  }

  showRows() {
    const key = toldStates.map((state) => queue.counts[state]).join();
    if (key === this.shownRows) return;
    this.shownRows = key;
    const told = toldStates.flatMap((state) => (queue.counts[state] > 0 ? queue.items.filter((item) => item.state === state) : []));
    this.rows.replaceChildren(...told.slice(0, mostRows).map(row));
    this.more.textContent = told.length > mostRows ? `and ${amount(told.length - mostRows, 'file')} more` : '';
  }
}

export function uploadView(view) {
  if (!may('store')) throw new Failure('absent', 'This server takes no objects from you.');
  view.title('Upload');
  const panel = new UploadPanel();
  view.replace(trail(['Upload']), h('h1', { class: 'unseen' }, 'Upload'), zone(), panel.panel, hints(h, [[['Esc'], 'studies']]));
  follow(view, () => panel.show());
  view.keys = { Escape: () => { location.hash = '#/'; } };
}
