// Corrects attributes of a study: what is to be replaced, then what that would change image by image, then the change.

import { config } from './api.js';
import { applyCorrection, may, previewCorrection } from './change-api.js';
import { choiceField, choicesOf, showTab } from './choice.js';
import { announce, h, icon, state } from './dom.js';
import { amount, spaced, tagText } from './format.js';
import { hints } from './keys.js';
import { imageLink, loadStudy, studyHead, studyLink } from './study.js';

const attributes = [
  ['00100010', 'PatientName'], ['00100020', 'PatientID'], ['00100030', 'PatientBirthDate'], ['00100040', 'PatientSex'],
  ['00080050', 'AccessionNumber'], ['00081030', 'StudyDescription'], ['00080020', 'StudyDate'], ['00080030', 'StudyTime'],
  ['00080090', 'ReferringPhysicianName'], ['0008103E', 'SeriesDescription'], ['00200011', 'SeriesNumber'], ['00080060', 'Modality'],
  ['00180015', 'BodyPartExamined'], ['0020000D', 'StudyInstanceUID'], ['0020000E', 'SeriesInstanceUID'],
];
const moving = { '0020000D': 'moves the images to that study', '0020000E': 'moves the images to that series' };
const other = 'other';

/** One attribute and what it gets. */
class Row {
  constructor(form, tag) {
    this.form = form;
    this.which = h('select', { class: 'input', 'aria-label': 'Attribute' },
      attributes.map(([digits, name]) => h('option', { value: digits }, `${spaced(name)} ${tagText(digits)}`)), h('option', { value: other }, 'Another, by its tag'));
    this.which.value = tag;
    this.digits = h('input', { class: 'input', placeholder: '00104000', maxlength: 9, spellcheck: 'false', autocomplete: 'off', 'aria-label': 'Tag, eight hexadecimal digits' });
    this.value = h('input', { class: 'input', spellcheck: 'false', autocomplete: 'off', 'aria-label': 'New value' });
    this.note = h('p', { class: 'soft note-below' });
    const gone = h('button', { class: 'button', type: 'button', 'aria-label': 'Remove this attribute', onclick: () => form.drop(this) }, '×');
    this.element = h('div', { class: 'correcting' }, h('div', {}, this.which, this.digits), h('span', { class: 'soft', 'aria-hidden': 'true' }, '→'),
      h('div', {}, this.value, this.note), gone);
    this.which.addEventListener('change', () => this.refresh());
    this.refresh();
  }

  refresh() {
    const [, name] = attributes.find(([digits]) => digits === this.which.value) ?? [];
    const now = this.form.choice.told[name];
    this.digits.hidden = this.which.value !== other;
    this.value.placeholder = now ? `now ${now}` : '';
    this.note.textContent = moving[this.which.value] ?? '';
  }

  get tag() {
    return this.which.value === other ? this.digits.value.replace(/[(),\s]/g, '') : this.which.value;
  }
}

function changeRow(one) {
  return h('div', { class: 'change', role: 'row' },
    h('span', { class: 'what', role: 'rowheader' }, one.keyword ? spaced(one.keyword) : 'Private', h('span', { class: 'tag' }, tagText(one.tag))),
    h('del', { class: 'old value', role: 'cell' }, one.old === '' ? h('span', { class: 'soft' }, 'empty') : one.old),
    h('span', { class: 'soft', 'aria-hidden': 'true' }, '→'),
    h('ins', { class: 'new value', role: 'cell' }, one.new === '' ? h('span', { class: 'soft' }, 'empty') : one.new));
}

const shownImages = 20;

function group(study, one) {
  return h('article', { class: 'panel correction' }, h('header', {}, h('h3', {}, amount(one.count, 'image'))),
    h('div', { class: 'changes', role: 'table', 'aria-label': 'Changes' }, one.attributes.map(changeRow)),
    h('details', { class: 'concerned' }, h('summary', {}, 'Images'),
      h('ul', {}, one.images.slice(0, shownImages).map((key) => h('li', {}, study ? h('a', { href: imageLink(study, key) }, key) : key)),
        one.count > shownImages && h('li', {}, `and ${one.count - shownImages} more`))));
}

/** In one sentence. */
function summary(report, isDone) {
  const words = [isDone ? `${amount(report.changed, 'image')} ${report.changed === 1 ? 'was' : 'were'} changed`
    : `${amount(report.changed, 'image')} of ${report.images} would change`];
  if (report.moved > 0) words.push(`${report.moved} ${isDone ? 'moved' : 'would move'}${report.oldStudy ? ' to another study' : ''}`);
  if (report.notFound.length > 0) words.push(`${report.notFound.length} not found`);
  return `${words.join(', ')}.`;
}

const shownGroups = 50;

class CorrectionForm {
  constructor(view, study, choices) {
    this.view = view;
    this.study = study;
    [this.choice] = choices;
    this.rows = [];
    this.list = h('div', { class: 'correcting-list' });
    this.result = h('section', { class: 'preview', tabindex: -1, 'aria-label': 'What would change' });
    this.login = h('input', { class: 'input', id: 'login', autocomplete: 'username', maxlength: 64 });
    this.look = h('button', { class: 'button main', type: 'submit' }, icon('compare'), 'Preview');
    this.element = h('form', { class: 'panel change-form' },
      choiceField('Images', choices, (choice) => { this.choice = choice; for (const row of this.rows) row.refresh(); this.forget(); }),
      h('fieldset', {}, h('legend', {}, 'Replace'), this.list,
        h('button', { class: 'button', type: 'button', onclick: () => this.add().which.focus() }, '+ Attribute')),
      config.caller ? h('p', { class: 'soft' }, 'The audit log will name ', h('b', { class: 'value' }, config.caller), '.')
        : h('div', { class: 'field who' }, h('label', { for: 'login' }, 'Who corrects, for the audit log'), this.login),
      h('div', { class: 'actions' }, this.look));
    this.element.addEventListener('input', () => this.forget());
    this.element.addEventListener('submit', (event) => { event.preventDefault(); this.preview(); });
    this.add();
  }

  add() {
    const used = this.rows.map((row) => row.tag);
    const row = new Row(this, (attributes.find(([tag]) => !used.includes(tag)) ?? [other])[0]);
    this.rows.push(row);
    this.list.append(row.element);
    this.forget();
    return row;
  }

  drop(row) {
    if (this.rows.length === 1) return;
    this.rows = this.rows.filter((one) => one !== row);
    row.element.remove();
    this.forget();
    this.rows[this.rows.length - 1].value.focus();
  }

  /** What was shown is not what would be done any more. */
  forget() {
    this.result.replaceChildren();
  }

  job() {
    const job = { tags: this.rows.map((row) => ({ tag: row.tag, value: row.value.value })) };
    if (!config.caller && this.login.value.trim() !== '') job.login = this.login.value.trim();
    if (this.choice.image) job.images = [this.choice.image];
    else if (this.choice.series) job.series = [this.choice.series];
    else job.wholeStudy = true;
    return job;
  }

  tell(...content) {
    this.result.replaceChildren(...content.flat().filter(Boolean));
    this.result.focus();
    this.result.scrollIntoView({ block: 'nearest' });
  }

  fail(fault) {
    if (fault.kind === 'gone') return;
    if (fault.kind === undefined) console.error(fault);
    this.tell(h('p', { class: 'refusal', role: 'alert' }, fault.kind ? fault.message : 'The page met an answer that it does not understand.'));
  }

  async preview() {
    const job = this.job();
    this.look.disabled = true;
    try {
      const report = await previewCorrection(this.study.study, job, this.view.signal);
      const words = summary(report, false);
      const apply = h('button', { class: 'button main', type: 'button', onclick: () => this.apply(job, apply) },
        `Apply to ${amount(report.changed, 'image')}`);
      this.tell(h('h2', {}, 'Preview'), h('p', {}, words), report.changes.slice(0, shownGroups).map((one) => group(this.study.study, one)),
        (report.changes.length > shownGroups || !report.complete) && h('p', { class: 'note' }, 'There are more changes than are shown here.'),
        report.changed > 0 && h('div', { class: 'actions' }, apply));
      announce(words);
    } catch (fault) {
      this.fail(fault);
    } finally {
      this.look.disabled = false;
    }
  }

  async apply(job, button) {
    button.disabled = true;
    try {
      const report = await applyCorrection(this.study.study, job);
      const words = summary(report, true);
      this.tell(h('h2', {}, report.pending ? 'Kept' : 'Corrected'), h('p', { role: 'status' }, words),
        report.pending && h('p', { class: 'note' }, 'The server could not write all of it yet. It is kept, and shown as soon as the server can.'),
        report.changes.slice(0, shownGroups).map((one) => group(report.study, one)),
        h('div', { class: 'actions' }, h('a', { class: 'button main', href: studyLink(report.study) }, report.oldStudy ? 'To the new study' : 'To the study'),
          h('a', { class: 'button', href: studyLink(report.study, '/corrections') }, 'All corrections')));
    } catch (fault) {
      this.fail(fault);
    }
  }
}

export async function correctView(view, query, uid) {
  const study = await loadStudy(view, uid);
  const head = studyHead(study, '/correct');
  view.keys = { Escape: () => { location.hash = studyLink(uid); } };
  if (!may('correct')) {
    view.replace(...head, state('none', 'Corrections are not for you', 'The server takes none, or you have no right to them.'));
    return;
  }
  const form = new CorrectionForm(view, study, await choicesOf(study, query, view.signal));
  view.replace(...head, form.element, form.result, hints(h, [[['Tab'], 'next field'], [['Enter'], 'preview'], [['Esc'], 'study']]));
  showTab();
}
