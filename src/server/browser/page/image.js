// An image: its picture, its neighbours, and every attribute with the node of the tree that holds it.

import { addresses, getAttributes, getStudy } from './api.js';
import { isNamed, may } from './change-api.js';
import { announce, h, icon, picture, waiting } from './dom.js';
import { amount, date } from './format.js';
import { hints } from './keys.js';
import { imageLink, patientOf, seriesName, studyLink, trail } from './study.js';
import { AttributeTree } from './tree.js';

// What was looked for in one image is looked for in the next one, too.
let lastFilter = '';

function stepButton(study, key, symbol, words) {
  return key ? h('a', { class: 'button', href: imageLink(study, key), 'aria-label': words }, icon(symbol))
    : h('span', { class: 'button', 'aria-disabled': 'true', role: 'link', 'aria-label': words }, icon(symbol));
}

function aside(study, series, image) {
  const uid = study.study;
  const other = image.next ?? image.previous;
  return h('aside', { class: 'aside', 'aria-label': 'The image' },
    picture(addresses.imagePreview(uid, image.series, image.image), `Preview of image ${image.image.number}`, 'no picture'),
    h('div', { class: 'steps' }, stepButton(uid, image.previous, 'left', 'Previous image'),
      h('span', {}, `${image.position + 1} of ${image.count}`), stepButton(uid, image.next, 'right', 'Next image')),
    h('dl', { class: 'facts' },
      h('dt', {}, 'Series'), h('dd', { class: 'value' }, series ? seriesName(series) : image.series),
      image.image.frames > 1 && [h('dt', {}, 'Frames'), h('dd', {}, image.image.frames)]),
    h('p', { class: 'soft' }, `The study holds ${amount(image.own.study, 'value')}, the series ${image.own.series} and the image ${image.own.image}.`),
    other && h('a', { class: 'button', href: studyLink(uid, `/difference?a=${encodeURIComponent(image.key)}&b=${encodeURIComponent(other)}`) },
      icon('compare'), 'Compare with another'),
    isNamed(image.key) && [['correct', 'Correct'], ['delete', 'Delete']].filter(([right]) => may(right)).map(([right, name]) =>
      h('a', { class: 'button', href: studyLink(uid, `/${right}?image=${encodeURIComponent(image.key)}`) }, `${name} this image`)));
}

export async function imageView(view, query, uid, key) {
  const shapes = waiting([300, 24, 24, 24, 24, 24, 24]);
  if (!document.querySelector('.image-view')) view.replace(trail(['Study', studyLink(uid)], ['Image']), shapes);
  const [study, image] = await Promise.all([getStudy(uid, view.signal), getAttributes(uid, key, view.signal)])
    .finally(() => shapes.stop());
  const series = study.series.find((one) => one.key === image.series);
  const name = `Image ${image.image.number || image.position + 1}`;
  view.title(`${name} – ${patientOf(study)}, ${date(study.attributes.StudyDate)}`);

  const tree = new AttributeTree(image.attributes, image.complete);
  const filter = h('input', { class: 'input', type: 'search', placeholder: 'Filter: name, tag or value', 'aria-label': 'Filter attributes',
    autocomplete: 'off', spellcheck: 'false', value: lastFilter });
  filter.addEventListener('input', () => {
    lastFilter = filter.value;
    tree.search(filter.value);
    announce(tree.note.textContent);
  });
  filter.addEventListener('keydown', (event) => {
    if (event.key === 'ArrowDown') {
      event.preventDefault();
      tree.rows.querySelector('[tabindex="0"]')?.focus();
    } else if (event.key === 'Escape') {
      event.preventDefault();
      if (filter.value === '') filter.blur();
      filter.value = '';
      lastFilter = '';
      tree.search('');
    }
  });
  tree.search(lastFilter);

  view.replace(trail([patientOf(study), studyLink(uid)], [series ? seriesName(series) : 'Series', studyLink(uid)], [name]),
    h('h1', { class: 'unseen' }, name),
    h('div', { class: 'image-view' }, aside(study, series, image),
      h('section', { class: 'panel', 'aria-label': amount(image.attributes.length, 'attribute') },
        h('div', { class: 'tree-tools' }, filter, tree.chips()), tree.rows, tree.note)),
    hints(h, [[['/'], 'filter'], [['↑', '↓'], 'move'], [['→', '←'], 'open and close'], [['N', 'P'], 'next, previous image'], [['Esc'], 'study']]));
  const go = (target) => target && (location.hash = imageLink(uid, target).slice(1));
  view.keys = {
    '/': () => { filter.focus(); filter.select(); },
    n: () => go(image.next),
    p: () => go(image.previous),
    ArrowDown: (event) => (event.target.closest('.attributes') ? false : tree.rows.querySelector('[tabindex="0"]')?.focus()),
    Escape: () => { location.hash = studyLink(uid); },
  };
}
