// Finds the view for the page's address and puts it in place.
//
//   #/?name=doe&modality=CT                 studies that fit
//   #/upload                                for those who may
//   #/studies/1.2                           a study
//   #/studies/1.2/volumes, /corrections
//   #/studies/1.2/correct, /delete          for those who may
//   #/studies/1.2/images/1.4                an image
//   #/studies/1.2/difference?a=1.4&b=1.5

import { config, Failure, readConfig } from './api.js';
import { h, state } from './dom.js';
import { isTyping } from './keys.js';
import { listView } from './list.js';
import { may } from './change-api.js';
import { correctView } from './correct.js';
import { correctionsView } from './corrections.js';
import { differenceView } from './difference.js';
import { imageView } from './image.js';
import { removeView } from './remove.js';
import { returnToPlace } from './session.js';
import { studyView } from './study.js';
import { takeDrops, uploadView } from './upload.js';
import { volumesView } from './volumes.js';

const views = [
  [/^\/?$/, listView],
  [/^\/upload$/, uploadView],
  [/^\/studies\/([^/]+)$/, studyView],
  [/^\/studies\/([^/]+)\/volumes$/, volumesView],
  [/^\/studies\/([^/]+)\/corrections$/, correctionsView],
  [/^\/studies\/([^/]+)\/correct$/, correctView],
  [/^\/studies\/([^/]+)\/delete$/, removeView],
  [/^\/studies\/([^/]+)\/images\/([^/]+)$/, imageView],
  [/^\/studies\/([^/]+)\/difference$/, differenceView],
];

const main = document.getElementById('main');
let current = null;

function addressNow() {
  const [path, query = ''] = location.hash.replace(/^#/, '').split(/\?(.*)/s);
  return { path, query: new URLSearchParams(query) };
}

/** "%" without digits behind it is nothing that this page writes. */
function decoded(text) {
  try {
    return decodeURIComponent(text);
  } catch (fault) {
    return text;
  }
}

const faces = {
  offline: ['cloud', 'The server cannot be reached'],
  absent: ['none', 'Nothing is here'],
  busy: ['fault', 'The study is being written'],
  failed: ['fault', 'This could not be shown'],
};

function tellFailure(view, fault) {
  if (fault instanceof Failure && fault.kind === 'gone') return;
  const known = fault instanceof Failure;
  const [symbol, title] = faces[known ? fault.kind : 'failed'];
  if (!known) console.error(fault);
  view.replace(h('nav', { class: 'top' }, h('a', { class: 'home', href: '#/' }, '‹ Studies')),
    state(symbol, title, known ? fault.message : 'The page met an answer that it does not understand.',
      { label: 'Try again', run: () => show(true) }));
}

/** Pictures that nobody will see would keep the next view waiting: a browser asks a server for six things at a time. */
function stopPictures() {
  for (const image of main.querySelectorAll('img')) if (!image.complete) image.removeAttribute('src');
}

/** What a view may do with the page while it is the one that is shown. */
function makeView() {
  const ending = new AbortController();
  return {
    signal: ending.signal,
    end: () => ending.abort(),
    replace: (...content) => !ending.signal.aborted && main.replaceChildren(...content.flat().filter(Boolean)),
    title: (text) => {
      document.title = text;
    },
    keys: {},
    fail(fault) {
      if (!ending.signal.aborted) tellFailure(this, fault);
    },
  };
}

async function show(isRetry = false) {
  const { path, query } = addressNow();
  // A view that only follows its own query stays, with what has the focus in it.
  if (!isRetry && current?.path === path && current.view.follow?.(query)) return;
  current?.view.end();
  stopPictures();
  const isFirst = current === null;
  const view = makeView();
  current = { path, view };
  const [pattern, make] = views.find(([one]) => one.test(path)) ?? [null, null];
  try {
    if (make === null) throw new Failure('absent', 'This address leads nowhere.');
    await make(view, query, ...pattern.exec(path).slice(1).map(decoded));
  } catch (fault) {
    view.fail(fault);
  }
  if (view.signal.aborted) return;
  if (!isFirst && !view.keepsPlace) {
    scrollTo(0, 0);
    main.focus({ preventScroll: true });
  }
}

addEventListener('hashchange', () => show());
addEventListener('keydown', (event) => {
  if (event.ctrlKey || event.metaKey || event.altKey || event.defaultPrevented) return;
  const act = current?.view.keys[event.key];
  if (act && (event.key === 'Escape' || !isTyping(event)) && act(event) !== false) event.preventDefault();
});

const offline = document.getElementById('offline');
addEventListener('offline', () => { offline.hidden = false; });
addEventListener('online', () => {
  offline.hidden = true;
  if (main.querySelector('.state')) show(true);
});
offline.hidden = navigator.onLine;

// Without it the page is whole but for links to what else the server has.
returnToPlace();
await readConfig().catch(() => config);
if (may('store')) takeDrops();
show();
