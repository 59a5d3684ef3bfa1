// Two images of a study and in what they differ.

import { addresses, getDifference, getImages } from './api.js';
import { announce, h, icon, picture } from './dom.js';
import { amount, spaced, tagText } from './format.js';
import { hints } from './keys.js';
import { loadStudy, seriesName, studyHead, studyLink } from './study.js';

const mostImages = 1000;

/** The part of each text that the other one does not have, between what both begin and end with. */
function differingPart(mine, theirs) {
  const most = Math.min(mine.length, theirs.length);
  let head = 0;
  while (head < most && mine[head] === theirs[head]) ++head;
  let tail = 0;
  while (tail < most - head && mine[mine.length - 1 - tail] === theirs[theirs.length - 1 - tail]) ++tail;
  return [mine.slice(0, head), mine.slice(head, mine.length - tail), mine.slice(mine.length - tail)];
}

function sideText(side, other) {
  const note = (words) => h('span', { class: 'soft' }, words);
  if (!side) return note('absent');
  if (side.omitted) return note('too long for the tag file');
  if (side.count !== undefined) return note(amount(side.count, 'item'));
  if (side.value === '') return note('empty');
  const cut = side.length ? note(` … ${side.length} characters`) : null;
  const vr = other && other.vr !== side.vr ? note(` ${side.vr}`) : null;
  if (typeof other?.value !== 'string') return [h('mark', {}, side.value), cut, vr];
  const [head, part, tail] = differingPart(side.value, other.value);
  return [head, part && h('mark', {}, part), tail, cut, vr];
}

function row(difference) {
  const path = difference.path.replace(/\.$/, '').replace(/\[(\d+)\]/g, (whole, index) => ` item ${Number(index) + 1}`);
  return h('div', { class: 'difference', role: 'row' },
    h('span', { class: 'what', role: 'rowheader' }, difference.name ? spaced(difference.name) : 'Private',
      h('span', { class: 'tag' }, [path, tagText(difference.tag)].filter(Boolean).join(' › '))),
    h('span', { class: 'text a value', role: 'cell' }, sideText(difference.a, difference.b)),
    h('span', { class: 'text b value', role: 'cell' }, sideText(difference.b, difference.a)));
}

/** One of the two images, and the means to choose another one. */
class Side {
  constructor(view, study, letter, changed) {
    this.view = view;
    this.study = study;
    this.changed = changed;
    this.series = h('select', { class: 'input', 'aria-label': `Series of image ${letter}` },
      study.series.map((one) => h('option', { value: one.key }, seriesName(one))));
    this.image = h('select', { class: 'input', 'aria-label': `Image ${letter}` });
    this.frame = h('span', {});
    this.element = h('div', { class: 'panel side', role: 'group', 'aria-label': `Image ${letter}` }, this.frame,
      h('label', {}, 'Series', this.series), h('label', {}, `Image ${letter}`, this.image));
    this.series.addEventListener('change', () => this.list(this.series.value, null).then(changed, (fault) => view.fail(fault)));
    this.image.addEventListener('change', () => { this.showPicture(); changed(); });
  }

  get key() { return this.image.value; }

  async list(series, key) {
    this.series.value = series;
    this.images = (await getImages(this.study.study, series, 0, mostImages, this.view.signal)).images;
    this.image.replaceChildren(...this.images.map((one, i) => h('option', { value: one.key }, one.number || `${i + 1}.`)));
    if (key) this.image.value = key;
    this.showPicture();
  }

  showPicture() {
    const image = this.images.find((one) => one.key === this.key);
    const frame = picture(image && addresses.imagePreview(this.study.study, this.series.value, image), '', 'no picture');
    this.frame.replaceWith(frame);
    this.frame = frame;
  }
}

/** The images that an address leaves open: the first two of a series, or of two series. */
async function choose(view, study, query) {
  const series = study.series.find((one) => one.images > 1) ?? study.series[0];
  const { images } = await getImages(study.study, series.key, 0, 2, view.signal);
  const other = images[1] ?? images[0];
  return { a: query.get('a') ?? images[0].key, b: query.get('b') ?? other.key };
}

class Comparison {
  constructor(view, study) {
    this.view = view;
    this.study = study;
    this.result = h('div', {});
    const changed = () => this.go(this.a.key, this.b.key);
    this.a = new Side(view, study, 'A', changed);
    this.b = new Side(view, study, 'B', changed);
    this.swap = h('button', { class: 'button', type: 'button', 'aria-label': 'Exchange both', onclick: () => this.go(this.b.key, this.a.key) }, icon('swap'));
  }

  go(a, b) {
    location.hash = studyLink(this.study.study, `/difference?a=${encodeURIComponent(a)}&b=${encodeURIComponent(b)}`);
  }

  async show({ a, b }) {
    const answer = await getDifference(this.study.study, a, b, this.view.signal);
    await Promise.all([this.a.list(answer.a.series, a), this.b.list(answer.b.series, b)]);
    const count = answer.differences.length;
    const words = count === 0 ? 'The images show the same attributes.' : `${amount(count, 'difference')}${answer.complete ? '' : ' and more'}`;
    this.result.replaceChildren(h('p', { class: 'count-line' }, words), count > 0 && h('div', { class: 'panel', role: 'table', 'aria-label': 'Differences' },
      h('div', { class: 'difference head', role: 'row' }, h('span', { class: 'what', role: 'columnheader' }, 'Attribute'),
        h('span', { role: 'columnheader' }, `A: image ${answer.a.image.number}`), h('span', { role: 'columnheader' }, `B: image ${answer.b.image.number}`)),
      answer.differences.map(row)));
    announce(words);
  }
}

export async function differenceView(view, query, uid) {
  const study = await loadStudy(view, uid);
  const comparison = new Comparison(view, study);
  await comparison.show(await choose(view, study, query));
  view.replace(...studyHead(study, '/difference'), h('div', { class: 'sides' }, comparison.a.element, comparison.swap, comparison.b.element),
    comparison.result, hints(h, [[['Esc'], 'study']]));
  view.keys = { Escape: () => { location.hash = studyLink(uid); } };
  view.follow = (next) => {
    choose(view, study, next).then((both) => comparison.show(both)).catch((fault) => view.fail(fault));
    return true;
  };
}
