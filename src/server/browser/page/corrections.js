// What was corrected in a study, as the audit logs of its images tell it.

import { getCorrections } from './api.js';
import { correctionsAddress } from './change-api.js';
import { h, icon, state } from './dom.js';
import { amount, logTime, spaced, tagText } from './format.js';
import { hints } from './keys.js';
import { imageLink, loadStudy, studyHead, studyLink } from './study.js';

function shown(text) {
  return text === '' ? h('span', { class: 'soft' }, 'empty') : text;
}

function change(one) {
  return h('div', { class: 'change', role: 'row' },
    h('span', { class: 'what', role: 'rowheader' }, one.name ? spaced(one.name) : 'Private', h('span', { class: 'tag' }, tagText(one.tag))),
    h('del', { class: 'old value', role: 'cell' }, shown(one.old)), h('span', { class: 'soft', 'aria-hidden': 'true' }, '→'),
    h('ins', { class: 'new value', role: 'cell' }, shown(one.new)));
}

function panel(study, correction) {
  const { images, count } = correction;
  const [moment, who] = logTime(correction.time);
  return h('article', { class: 'panel correction' },
    h('header', {}, h('h2', { class: 'value' }, moment || 'Unknown time'),
      who && h('span', { class: 'value' }, who), h('span', { class: 'soft' }, amount(count, 'image'))),
    h('div', { class: 'changes', role: 'table', 'aria-label': 'Changes' }, correction.changes.map(change)),
    h('details', { class: 'concerned' }, h('summary', {}, 'Images'),
      h('ul', {}, images.map((key) => h('li', {}, h('a', { href: imageLink(study, key) }, key))),
        count > images.length && h('li', {}, `and ${count - images.length} more`))));
}

function exports(study) {
  const address = correctionsAddress(study);
  return h('div', { class: 'exports' },
    h('a', { class: 'button', href: `${address}?accept=text/csv`, download: `corrections-${study}.csv` }, icon('save'), 'CSV'),
    h('a', { class: 'button', href: `${address}?accept=application/json`, download: `corrections-${study}.json` }, icon('braces'), 'JSON'));
}

export async function correctionsView(view, query, uid) {
  const [study, found] = await Promise.all([loadStudy(view, uid), getCorrections(uid, view.signal)]);
  const { corrections, complete, unreadable } = found;
  view.replace(...studyHead(study, '/corrections'),
    unreadable > 0 && h('p', { class: 'note' }, `The audit log of ${amount(unreadable, 'image')} cannot be read.`),
    (corrections.length > 0 || unreadable > 0) && exports(uid),
    corrections.length > 0 ? corrections.map((one) => panel(uid, one))
      : state('none', 'Nothing was corrected', 'All images show what their DICOM files say.'),
    !complete && h('p', { class: 'note' }, 'There are more corrections than are shown here.'),
    hints(h, [[['Esc'], 'study']]));
  view.keys = { Escape: () => { location.hash = studyLink(uid); } };
}
