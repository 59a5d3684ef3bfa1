// A study: who and what, what it takes, and its series with strips of pictures.

import { addresses, config, getImages, getSizes, getStudy } from './api.js';
import { h, icon, picture, state, waiting } from './dom.js';
import { age, amount, bytes, date, personName, sexes, time } from './format.js';
import { hints, horizontal, roving } from './keys.js';

const stripSize = 200;

export const studyLink = (study, rest = '') => `#/studies/${encodeURIComponent(study)}${rest}`;
export const imageLink = (study, image) => studyLink(study, `/images/${encodeURIComponent(image)}`);

/** "2 T1 axial": what tells a series from its neighbours. */
export function seriesName(series) {
  const told = series.attributes;
  // A label begins with the number already.
  return series.label || [told.SeriesNumber, told.SeriesDescription || told.ProtocolName || 'Series'].filter(Boolean).join(' ');
}

export function trail(...steps) {
  return h('nav', { class: 'top', 'aria-label': 'Where you are' }, h('a', { class: 'home', href: '#/', 'aria-label': 'Studies' },
    h('img', { src: 'page/icon.svg', alt: '', width: 24, height: 24 })),
  h('ol', { class: 'trail' }, h('li', {}, h('a', { href: '#/' }, 'Studies')),
    steps.map(([text, link]) => h('li', {}, link ? h('a', { href: link, class: 'value' }, text)
      : h('span', { 'aria-current': 'page', class: 'value' }, text)))));
}

export function patientOf(study) {
  return personName(study.attributes.PatientName) || 'No name';
}

function fact(label, text) {
  return text && h('span', {}, `${label} `, h('b', { class: 'value' }, text));
}

function banner(study) {
  const told = study.attributes;
  const uid = study.study;
  return h('header', { class: 'banner' },
    h('div', { class: 'who' }, h('h1', { class: 'value' }, patientOf(study)),
      h('p', { class: 'facts' }, fact('ID', told.PatientID), fact('born', date(told.PatientBirthDate)),
        fact('', [sexes[told.PatientSex], age(told.PatientBirthDate, told.StudyDate, told.PatientAge)].filter(Boolean).join(', '))),
      h('p', { class: 'facts' }, fact('', told.StudyDescription || 'No description'),
        fact('on', [date(told.StudyDate), time(told.StudyTime)].filter(Boolean).join(' ')),
        fact('accession', told.AccessionNumber), fact('referred by', personName(told.ReferringPhysicianName)))),
    h('div', { class: 'actions' },
      config.viewer && h('a', { class: 'button main', href: addresses.viewer(uid) }, icon('open'), 'Open in viewer'),
      h('a', { class: 'button', href: addresses.zip(uid), download: `${uid}.zip` }, icon('save'), 'ZIP'),
      h('a', { class: 'button', href: addresses.metadata(uid), download: `${uid}.json` }, icon('braces'), 'Metadata')));
}

/** The sides of a study, the present one marked. */
export function tabs(study, current) {
  const volumes = study.series.reduce((sum, series) => sum + series.volumes.length, 0);
  const entries = [['', 'Series', study.series.length], ['/volumes', 'Volumes', volumes],
    ['/difference', 'Differences', null], ['/corrections', 'Corrections', study.corrected ? null : 0]];
  if (config.may.includes('correct')) entries.push(['/correct', 'Correct', null]);
  if (config.may.includes('delete')) entries.push(['/delete', 'Delete', null]);
  return h('nav', { class: 'tabs', 'aria-label': 'Sides of the study' }, entries.map(([rest, name, count]) =>
    h('a', { href: studyLink(study.study, rest), 'aria-current': rest === current ? 'page' : null }, name,
      count !== null && h('span', { class: 'count' }, count))));
}

/** The head that all sides of a study have. */
export function studyHead(study, current) {
  return [trail([patientOf(study)]), banner(study), tabs(study, current)];
}

function size(label, count, whole, words) {
  const fill = h('i', {});
  fill.style.width = `${whole > 0 ? Math.min(100, (100 * count) / whole) : 0}%`;
  return h('div', { class: 'size' }, h('dt', {}, label), h('dd', {}, bytes(count), ' ', h('span', { class: 'soft' }, words)),
    h('div', { class: 'bar', 'aria-hidden': 'true' }, fill));
}

function sizesPanel(study, sizes) {
  const whole = Math.max(sizes.dicom, 1);
  const { tagFile, previews } = study.sizes;
  const share = sizes.attributes > 0 && tagFile > previews ? `1/${Math.max(1, Math.round(sizes.attributes / (tagFile - previews)))} of the headers` : '';
  return h('dl', { class: 'panel sizes', 'aria-label': 'Sizes' },
    size('DICOM files', sizes.dicom, whole, sizes.missing > 0 ? `${amount(sizes.missing, 'file')} not there` : `in ${amount(sizes.files, 'file')}`),
    size('Their headers', sizes.attributes, whole, 'attributes kept'),
    size('Tag file', tagFile, whole, share),
    size('of which previews', previews, whole, ''));
}

/** Of an image without a picture only the number, in less room. */
function tile(study, series, image) {
  const name = image.number || '–';
  const address = addresses.imagePreview(study, series, image);
  return h('a', { class: address ? 'tile' : 'tile bare', href: imageLink(study, image.key), tabindex: -1, 'aria-label': `Image ${name}` },
    address ? [picture(address, ''), image.frames > 1 ? `${name} · ${image.frames} frames` : name] : picture(null, '', name));
}

function volumeTile(study, series, volume) {
  return h('a', { class: 'tile', href: studyLink(study, '/volumes'), tabindex: -1 },
    picture(addresses.volumePreview(study, series.key, volume.index), ''), 'Volume');
}

/** The pictures of a series, asked for when it comes into view. */
class Strip {
  constructor(view, study, series) {
    this.view = view;
    this.study = study;
    this.series = series;
    this.element = h('div', { class: 'strip', role: 'group', 'aria-label': `Images of series ${seriesName(series)}` });
    for (let i = 0; i < Math.min(series.images, 8); ++i) this.element.append(h('span', { class: 'tile' }, picture(null, ''), ' '));
    this.keys = roving(this.element, '.tile[href], button.tile', horizontal);
    this.shown = 0;
  }

  async load() {
    try {
      const list = await getImages(this.study, this.series.key, this.shown, stripSize, this.view.signal);
      if (this.shown === 0) this.element.replaceChildren(...this.series.volumes.filter((one) => one.preview).map((one) => volumeTile(this.study, this.series, one)));
      this.element.querySelector('button')?.remove();
      this.element.append(...list.images.map((image) => tile(this.study, this.series.key, image)));
      const [firstNew] = [...this.element.children].slice(-list.images.length);
      const had = this.shown;
      this.shown += list.images.length;
      if (this.shown < list.count && list.images.length > 0) this.element.append(this.more(list.count - this.shown));
      this.keys.refresh();
      if (had > 0) firstNew?.focus();
    } catch (fault) {
      if (fault.kind !== 'gone') this.element.replaceChildren(h('p', { class: 'note' }, fault.message));
    }
  }

  more(count) {
    return h('button', { class: 'tile more', type: 'button', tabindex: -1, onclick: () => this.load() },
      picture(null, '', `+ ${count}`), 'more');
  }
}

function seriesPanel(study, series, strip) {
  const told = series.attributes;
  const volumes = series.volumes.length;
  return h('section', { class: 'panel series', 'aria-label': `Series ${seriesName(series)}` },
    h('div', { class: 'about' },
      h('h2', {}, told.Modality && h('span', { class: 'badge' }, told.Modality), h('span', { class: 'value' }, seriesName(series))),
      told.SeriesDescription && !seriesName(series).endsWith(told.SeriesDescription) && h('p', { class: 'value' }, told.SeriesDescription),
      h('p', { class: 'soft' }, [amount(series.images, 'image'), volumes > 0 && amount(volumes, 'volume'),
        time(told.SeriesTime)].filter(Boolean).join(' · ')),
      h('p', { class: 'soft value' }, [told.BodyPartExamined, told.ManufacturerModelName].filter(Boolean).join(' · ')),
      h('p', { class: 'soft' }, `${amount(series.own, 'value')} of its own`)),
    strip.element);
}

/** Up and down lead from strip to strip. */
function linkStrips(container) {
  container.addEventListener('keydown', (event) => {
    const step = { ArrowDown: 1, ArrowUp: -1 }[event.key];
    const strip = event.target.closest('.strip');
    if (!step || !strip) return;
    const strips = [...container.querySelectorAll('.strip')];
    const next = strips[strips.indexOf(strip) + step]?.querySelector('[tabindex="0"]');
    if (!next) return;
    event.preventDefault();
    next.focus();
  });
}

export async function loadStudy(view, uid) {
  const shapes = waiting([64, 40, 120, 120, 120]);
  view.replace(trail(['Study']), shapes);
  try {
    const study = await getStudy(uid, view.signal);
    view.title(`${patientOf(study)} – ${date(study.attributes.StudyDate) || 'Study'}`);
    view.keys = { Escape: () => { location.hash = '#/'; } };
    return study;
  } finally {
    shapes.stop();
  }
}

export async function studyView(view, query, uid) {
  const study = await loadStudy(view, uid);
  const sizes = h('div', {});
  const list = h('div', {});
  const seen = new IntersectionObserver((entries) => {
    for (const entry of entries) {
      if (!entry.isIntersecting) continue;
      seen.unobserve(entry.target);
      strips.get(entry.target).load();
    }
  }, { rootMargin: '400px' });
  view.signal.addEventListener('abort', () => seen.disconnect());
  const strips = new Map();
  for (const series of study.series) {
    const strip = new Strip(view, uid, series);
    const panel = seriesPanel(study, series, strip);
    strips.set(panel, strip);
    list.append(panel);
    seen.observe(panel);
  }
  if (study.series.length === 0) list.append(state('none', 'No series', 'The study has no images any more.'));
  linkStrips(list);
  view.replace(...studyHead(study, ''), list, sizes,
    hints(h, [[['←', '→'], 'along a series'], [['↑', '↓'], 'other series'], [['Enter'], 'open image'], [['Esc'], 'studies']]));
  view.keys.ArrowDown = (event) => (event.target.closest('.strip') ? false : list.querySelector('.strip [tabindex="0"]')?.focus());
  // Their files may lie on a slow disk, and nobody waits for the figures.
  getSizes(uid, view.signal).then((found) => sizes.replaceChildren(sizesPanel(study, found)), () => {});
}
