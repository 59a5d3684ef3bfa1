// The volumes of a study and their geometry.

import { addresses } from './api.js';
import { h, picture, state, svg } from './dom.js';
import { amount, number } from './format.js';
import { hints, roving, vertical } from './keys.js';
import { loadStudy, seriesName, studyHead, studyLink } from './study.js';

// The patient's sides: towards larger coordinates, and towards smaller ones.
const sides = [['L', 'R'], ['P', 'A'], ['H', 'F']];

function sideOf(direction, sign) {
  let axis = 0;
  for (let i = 1; i < 3; ++i) if (Math.abs(direction[i]) > Math.abs(direction[axis])) axis = i;
  if (!direction[axis]) return '';
  return sides[axis][direction[axis] * sign > 0 ? 0 : 1];
}

/** The letters that a viewer writes on the edges of a picture. */
function compass(volume) {
  const [rows, columns] = volume.axes;
  return [['right', rows, 1], ['left', rows, -1], ['below', columns, 1], ['above', columns, -1]].map(([edge, direction, sign]) =>
    h('span', { class: `compass ${edge}`, 'aria-hidden': 'true' }, sideOf(direction, sign)));
}

function histogram(values) {
  const { bins, min, max } = values;
  // One value, air, often outnumbers all others a hundred times; its bar is cut, so that the others are seen.
  const sorted = [...bins].sort((a, b) => b - a);
  const top = Math.max(sorted[Math.min(2, sorted.length - 1)], 1);
  const bars = bins.map((bin, i) => {
    const height = bin > 0 ? Math.max(1, Math.min(50, (50 * bin) / top)) : 0;
    return svg('rect', { x: i, y: 50 - height, width: 0.86, height });
  });
  return h('figure', { class: 'histogram' },
    svg('svg', { viewBox: `0 0 ${bins.length} 50`, preserveAspectRatio: 'none', role: 'img', 'aria-label': `How often values from ${number(min)} to ${number(max)} occur` }, bars),
    h('figcaption', {}, h('span', {}, number(min)), h('span', {}, `${amount(values.total, 'stored value')}`), h('span', {}, number(max))));
}

function fact(label, ...content) {
  return [h('dt', {}, label), h('dd', {}, content)];
}

const triple = (values, digits) => values.map((one) => number(one, digits)).join(' × ');

function plane(volume) {
  if (!volume.plane) return 'unknown';
  return volume.oblique < 0.5 ? volume.plane : `${volume.plane}, ${number(volume.oblique, 2)}° oblique`;
}

function geometry(volume) {
  const extent = volume.dims.map((count, i) => count * (volume.spacing[i] ?? NaN));
  const padding = volume.padding === undefined ? null
    : `${volume.padding}${volume.paddingLimit === undefined ? '' : ` to ${volume.paddingLimit}`}`;
  return h('dl', { class: 'geometry' },
    fact('Voxels', h('span', { class: 'number' }, triple(volume.dims, 9))),
    fact('Spacing', `${triple(volume.spacing)} mm`),
    fact('Extent', `${triple(extent, 3)} mm`),
    fact('Plane', plane(volume)),
    fact('Origin', `${volume.origin.map((one) => number(one)).join(', ')} mm`),
    fact('Rescale', `× ${number(volume.slope)} ${volume.intercept < 0 ? '−' : '+'} ${number(Math.abs(volume.intercept))}`),
    volume.bitLoss > 0 && fact('Precision', `${number(volume.bitLoss, 2)} bits lost`),
    padding && fact('Padding', padding),
    fact('Images', amount(volume.images, 'image')),
    volume.slices !== volume.images && fact('Slices', String(volume.slices)),
    volume.lossy > 0 && fact('Lossy', amount(volume.lossy, 'image')),
    volume.overlays > 0 && fact('Overlays', amount(volume.overlays, 'plane')));
}

function panel(study, series, volume) {
  const address = volume.preview ? addresses.volumePreview(study.study, series.key, volume.index) : null;
  const frame = picture(address, 'Its middle slice', 'no picture');
  if (!volume.bare) frame.append(...compass(volume));
  return h('article', { class: 'panel volume', tabindex: -1, 'aria-label': `Volume of series ${seriesName(series)}` },
    h('h2', {}, series.attributes.Modality && h('span', { class: 'badge' }, series.attributes.Modality), h('span', { class: 'value' }, seriesName(series))),
    frame,
    volume.bare ? h('p', { class: 'soft' }, `${amount(volume.images, 'image')}. Its geometry is not known: it is a part of a volume that a correction divided, or has not been read yet.`)
      : geometry(volume),
    volume.histogram && histogram(volume.histogram));
}

export async function volumesView(view, query, uid) {
  const study = await loadStudy(view, uid);
  const panels = study.series.flatMap((series) => series.volumes.map((volume) => panel(study, series, volume)));
  const list = h('div', { class: 'volumes' }, panels);
  if (panels.length > 0) roving(list, '.volume', vertical).refresh();
  view.replace(...studyHead(study, '/volumes'), panels.length > 0 ? list
    : state('none', 'No volumes', 'None of the series was stacked. "kdd stack" makes volume files of those that can be.'),
  hints(h, [[['↑', '↓'], 'move'], [['Esc'], 'study']]));
  view.keys = {
    ArrowDown: (event) => (event.target.closest('.volumes') ? false : list.querySelector('[tabindex="0"]')?.focus()),
    Escape: () => { location.hash = studyLink(uid); },
  };
}
