// Which images of a study are meant: all, those of a series, or one.

import { getAttributes } from './api.js';
import { isNamed } from './change-api.js';
import { h } from './dom.js';
import { amount } from './format.js';
import { seriesName } from './study.js';

/** The choices that a study leaves, the first of which is the one that the address names. */
export async function choicesOf(study, query, signal) {
  const choices = study.series.filter((series) => isNamed(series.key)).map((series) => ({
    name: `Series ${seriesName(series)}`, count: series.images, series: series.key, told: { ...study.attributes, ...series.attributes } }));
  choices.unshift({ name: 'The whole study', count: study.images, told: study.attributes });
  const key = query.get('image');
  if (key && isNamed(key)) {
    const image = await getAttributes(study.study, key, signal);
    const series = study.series.find((one) => one.key === image.series);
    choices.unshift({ name: `Image ${image.image.number || image.position + 1} of series ${series ? seriesName(series) : ''}`, count: 1,
      series: image.series, image: key, told: { ...study.attributes, ...series?.attributes } });
  }
  const wanted = choices.findIndex((one) => !one.image && one.series === query.get('series'));
  if (query.get('series') && wanted > 0) choices.unshift(...choices.splice(wanted, 1));
  return choices;
}

/** A list to choose from; `changed` is called with the choice. */
export function choiceField(label, choices, changed) {
  const list = h('select', { class: 'input', id: 'choice' },
    choices.map((one, i) => h('option', { value: i }, `${one.name} (${amount(one.count, 'image')})`)));
  list.addEventListener('change', () => changed(choices[list.value]));
  return h('div', { class: 'field' }, h('label', { for: 'choice' }, label), list);
}

/** Where there is little room the last tabs are out of sight. */
export function showTab() {
  document.querySelector('.tabs [aria-current]')?.scrollIntoView({ block: 'nearest', inline: 'center' });
}
