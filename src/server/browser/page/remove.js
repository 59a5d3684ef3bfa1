// Deletes a study, a series or an image, for whoever types how much that is.

import { deleteObjects, may } from './change-api.js';
import { choiceField, choicesOf, showTab } from './choice.js';
import { h, state } from './dom.js';
import { amount } from './format.js';
import { hints } from './keys.js';
import { loadStudy, studyHead, studyLink } from './study.js';

class RemovalForm {
  constructor(study, choices) {
    this.study = study;
    this.result = h('section', { class: 'preview', tabindex: -1, 'aria-label': 'What became of it' });
    this.words = h('p', {});
    this.typed = h('input', { class: 'input', id: 'typed', autocomplete: 'off', spellcheck: 'false' });
    this.label = h('label', { for: 'typed' });
    this.button = h('button', { class: 'button danger', type: 'submit', disabled: true }, 'Delete');
    this.element = h('form', { class: 'panel change-form' },
      choiceField('Delete', choices, (choice) => this.choose(choice)), this.words,
      h('div', { class: 'field' }, this.label, this.typed), h('div', { class: 'actions' }, this.button));
    this.typed.addEventListener('input', () => { this.button.disabled = !this.isConfirmed(); });
    this.element.addEventListener('submit', (event) => { event.preventDefault(); this.remove(); });
    this.choose(choices[0]);
  }

  choose(choice) {
    this.choice = choice;
    this.sentence = `delete ${choice.count}`;
    this.words.textContent = `${choice.name} of this patient, ${amount(choice.count, 'image')}, will be gone from the archive at once. The DICOM files stay on the server's disk and come back when somebody adds them again.`;
    this.label.replaceChildren('To go on, type ', h('b', {}, this.sentence));
    this.typed.value = '';
    this.button.disabled = true;
    this.result.replaceChildren();
  }

  isConfirmed() {
    return this.typed.value.trim().toLowerCase() === this.sentence;
  }

  async remove() {
    if (!this.isConfirmed()) return;
    this.button.disabled = true;
    const { series, image } = this.choice;
    try {
      const report = await deleteObjects(this.study.study, series, image);
      const isAll = report.images >= this.study.images;
      this.element.remove();
      this.tell(h('h2', {}, 'Deleted'), h('p', { role: 'status' }, `${amount(report.images, 'image')} ${report.images === 1 ? 'is' : 'are'} gone.`),
        ...(report.pending ? [h('p', { class: 'note' }, 'The server could not write all of it yet, and goes on as soon as it can.')] : []),
        h('div', { class: 'actions' }, h('a', { class: 'button main', href: isAll ? '#/' : studyLink(this.study.study) }, isAll ? 'To the studies' : 'To the study')));
    } catch (fault) {
      if (fault.kind === undefined) console.error(fault);
      this.tell(h('p', { class: 'refusal', role: 'alert' }, fault.kind ? fault.message : 'The page met an answer that it does not understand.'));
      this.button.disabled = !this.isConfirmed();
    }
  }

  tell(...content) {
    this.result.replaceChildren(...content);
    this.result.focus();
  }
}

export async function removeView(view, query, uid) {
  const study = await loadStudy(view, uid);
  const head = studyHead(study, '/delete');
  view.keys = { Escape: () => { location.hash = studyLink(uid); } };
  if (!may('delete')) {
    view.replace(...head, state('none', 'Deleting is not for you', 'The server does not delete, or you have no right to it.'));
    return;
  }
  const form = new RemovalForm(study, await choicesOf(study, query, view.signal));
  view.replace(...head, form.element, form.result, hints(h, [[['Tab'], 'next field'], [['Esc'], 'study']]));
  showTab();
}
