// The list of studies, searched while one types.

import { addresses, config, Failure, searchStudies } from './api.js';
import { may } from './change-api.js';
import { announce, h, icon, picture, state, waiting } from './dom.js';
import { age, amount, date, first, personName, sexes, time, values } from './format.js';
import { hints, isTyping, roving, vertical } from './keys.js';
import { signOut } from './session.js';
import { follow, uploadLink } from './upload.js';
import { isBusy, queue } from './upload-queue.js';

const pageSize = 50;
const pause = 220; // [ms] without a key before the server is asked
const modalities = ['CR', 'CT', 'DOC', 'DX', 'ECG', 'ES', 'IO', 'IVUS', 'KO', 'MG', 'MR', 'NM', 'OCT', 'OP', 'OPT', 'OT', 'PR', 'PT', 'PX',
  'RF', 'RTDOSE', 'RTIMAGE', 'RTPLAN', 'RTSTRUCT', 'SC', 'SEG', 'SM', 'SR', 'US', 'XA', 'XC'];
const terms = ['name', 'id', 'accession', 'from', 'to', 'modality'];

// Where one was in the list, to come back there.
const last = { query: '', studies: [], isWhole: false, uploads: 0, uid: '', scroll: 0 };

function input(name, properties) {
  return h('input', { id: `by-${name}`, name, class: 'input', autocomplete: 'off', spellcheck: 'false', ...properties });
}

function field(name, label, control, properties = {}) {
  return h('div', { class: 'field', ...properties }, h('label', { for: `by-${name}` }, label), control);
}

function makeForm() {
  const form = h('form', { class: 'fields', role: 'search', 'aria-label': 'Studies' },
    field('name', 'Patient name', input('name', { type: 'search', placeholder: 'Any part of the name' })),
    h('button', { class: 'button more-fields', type: 'button', 'aria-expanded': 'false',
      onclick: (event) => event.currentTarget.setAttribute('aria-expanded', form.classList.toggle('open')) },
    icon('filter'), h('span', { class: 'unseen' }, 'More fields')),
    field('id', 'Patient ID', input('id', { type: 'search' }), { class: 'field less' }),
    field('accession', 'Accession number', input('accession', { type: 'search' }), { class: 'field less' }),
    h('div', { class: 'field less', role: 'group', 'aria-label': 'Study date' }, h('span', { class: 'label' }, 'Study date'),
      h('div', { class: 'range' }, input('from', { type: 'date', 'aria-label': 'From' }), h('span', { class: 'soft' }, '–'),
        input('to', { type: 'date', 'aria-label': 'To' }))),
    field('modality', 'Modality', h('select', { id: 'by-modality', name: 'modality', class: 'input' },
      h('option', { value: '' }, 'Any'), modalities.map((one) => h('option', { value: one }, one))), { class: 'field less' }),
    h('button', { class: 'button clear', type: 'reset' }, 'Clear'));
  return form;
}

function countOf(study, tag) {
  const text = first(study, tag);
  return /^\d+$/.test(text) ? Number(text) : null;
}

function line(text, isSoft = false) {
  return h('span', { class: isSoft ? 'line soft value' : 'line value', title: text.trim() || null }, text);
}

function row(study) {
  const uid = first(study, '0020000D');
  const name = personName(values(study, '00100010')[0]) || 'No name';
  const day = first(study, '00080020');
  const series = countOf(study, '00201206');
  const images = countOf(study, '00201208');
  const who = [first(study, '00100020'), sexes[first(study, '00100040')],
    age(first(study, '00100030'), day)].filter(Boolean).join(' · ');
  const description = first(study, '00081030');
  const accession = first(study, '00080050');
  return h('li', {}, h('a', { class: 'study', href: `#/studies/${encodeURIComponent(uid)}`, 'data-uid': uid, tabindex: -1 },
    picture(addresses.studyPreview(uid), ''),
    h('span', { class: 'who' }, h('span', { class: 'line first value', title: name }, name), line(who || ' ', true)),
    h('span', { class: 'when number' }, line(date(day) || 'No date'), line(time(first(study, '00080030')), true)),
    h('span', { class: 'badges' }, values(study, '00080061').map((one) => h('span', { class: 'badge' }, String(one)))),
    h('span', { class: 'what' }, line(description || 'No description', !description)),
    h('span', { class: 'amount number' }, line(images === null ? '' : amount(images, 'image')),
      line(series === null ? '' : amount(series, 'series', 'series'), true)),
    h('span', { class: 'accession' }, line(accession, true))));
}

const heads = ['', 'Patient', 'Date', 'Modality', 'Description', 'Images', 'Accession'];

class StudyList {
  constructor(view, query) {
    this.view = view;
    this.form = makeForm();
    this.list = h('ol', { class: 'studies', 'aria-label': 'Studies found' });
    this.count = h('div', { class: 'count-line' });
    this.results = h('div', {});
    this.keys = roving(this.list, '.study', vertical);
    this.asking = null;
    this.timer = 0;
    this.take(query);
    this.form.addEventListener('input', () => this.later());
    this.form.addEventListener('submit', (event) => { event.preventDefault(); this.later(0); });
    // The fields are empty only after the event.
    this.form.addEventListener('reset', () => setTimeout(() => this.later(0)));
    this.form.addEventListener('keydown', (event) => this.leaveForm(event));
    this.list.addEventListener('click', (event) => { last.uid = event.target.closest('.study')?.dataset.uid ?? ''; });
    view.signal.addEventListener('abort', () => this.end());
  }

  end() {
    clearTimeout(this.timer);
    this.asking?.abort();
    last.scroll = scrollY;
  }

  take(query) {
    for (const name of terms) this.form.elements[name].value = query.get(name) ?? '';
    if (terms.slice(1).some((name) => query.get(name))) this.form.classList.add('open');
  }

  query() {
    const query = new URLSearchParams();
    for (const name of terms) {
      const value = this.form.elements[name].value.trim();
      if (value) query.set(name, value);
    }
    return query;
  }

  /** From the fields down into the list, or Escape: empties the field, then leaves it. */
  leaveForm(event) {
    if (event.key === 'ArrowDown' && event.target.matches('input[type=search]')) {
      event.preventDefault();
      this.list.querySelector('.study')?.focus();
    } else if (event.key === 'Escape' && isTyping(event)) {
      event.preventDefault();
      if (event.target.value) {
        event.target.value = '';
        this.later(0);
      } else {
        event.target.blur();
      }
    }
  }

  later(delay = pause) {
    clearTimeout(this.timer);
    this.timer = setTimeout(() => {
      const query = this.query().toString();
      history.replaceState(null, '', `#/${query && '?'}${query}`);
      this.find();
    }, delay);
  }

  async find() {
    const query = this.query();
    this.asking?.abort();
    this.asking = new AbortController();
    last.uploads = queue.arrived;
    const shapes = waiting(Array(8).fill(52));
    if (!this.list.isConnected) this.results.replaceChildren(shapes);
    this.results.setAttribute('aria-busy', 'true');
    try {
      const studies = await searchStudies(Object.fromEntries(query), 0, pageSize + 1, this.asking.signal);
      Object.assign(last, { query: query.toString(), studies: studies.slice(0, pageSize), isWhole: studies.length <= pageSize });
      this.show();
      announce(`${this.count.textContent} found`);
    } catch (fault) {
      this.tell(fault);
    } finally {
      shapes.stop();
      this.results.removeAttribute('aria-busy');
    }
  }

  tell(fault) {
    if (fault instanceof Failure && fault.kind === 'gone') return;
    const isOffline = fault instanceof Failure && fault.kind === 'offline';
    this.count.replaceChildren();
    this.results.replaceChildren(state(isOffline ? 'cloud' : 'fault',
      isOffline ? 'The server cannot be reached' : 'The search failed', fault.message,
      { label: 'Try again', run: () => this.find() }));
  }

  show() {
    const { studies, isWhole } = last;
    const isSearch = last.query !== '';
    if (studies.length === 0) {
      this.count.replaceChildren('No studies');
      this.results.replaceChildren(isSearch
        ? state('search', 'No study fits', 'Fewer letters, another spelling or a wider range of dates may find it.')
        : state('none', 'The archive is empty', 'Studies appear here as soon as images arrive.'));
      this.list.remove();
      return;
    }
    this.count.replaceChildren(h('span', {}, isWhole ? amount(studies.length, 'study', 'studies')
      : `The first ${studies.length} studies`), h('span', {}, 'Newest first'));
    this.list.replaceChildren(...studies.map(row));
    this.results.replaceChildren(h('div', { class: 'panel worklist' },
      h('div', { class: 'head', 'aria-hidden': 'true' }, heads.map((one) => h('span', { class: one === 'Images' ? 'amount' : null }, one))),
      this.list, !isWhole && this.further()));
    this.keys.refresh();
  }

  further() {
    const button = h('button', { class: 'button', type: 'button' }, 'Show more');
    button.addEventListener('click', async () => {
      button.disabled = true;
      try {
        const more = await searchStudies(Object.fromEntries(new URLSearchParams(last.query)), last.studies.length,
          pageSize + 1, this.asking?.signal);
        const from = last.studies.length;
        last.studies.push(...more.slice(0, pageSize));
        last.isWhole = more.length <= pageSize;
        this.show();
        this.list.children[from]?.querySelector('.study').focus();
      } catch (fault) {
        this.tell(fault);
      }
    });
    return h('div', { class: 'further' }, button);
  }
}

export function listView(view, query) {
  view.title('Studies');
  const list = new StudyList(view, query);
  view.replace(h('header', { class: 'top' }, h('a', { class: 'home', href: '#/' },
    h('img', { src: 'page/icon.svg', alt: '', width: 24, height: 24 }), h('h1', {}, 'Studies')),
  may('store') && uploadLink(view),
  config.signIn && h('button', { class: 'button leave', type: 'button', onclick: signOut }, 'Sign out')),
  h('div', { class: 'search' }, list.form), list.count, list.results,
  hints(h, [[['/'], 'search'], [['↓', '↑'], 'move'], [['Enter'], 'open'], [['Esc'], 'clear']]));
  view.keys = {
    '/': () => list.form.elements.name.select() ?? list.form.elements.name.focus(),
    ArrowDown: (event) => (event.target.closest('.studies') ? false : list.list.querySelector('.study')?.focus()),
  };
  view.follow = (next) => {
    list.take(next);
    list.find();
    return true;
  };
  // Back from a study: the list as it was, at once, unless there is more by now.
  if (last.uid && last.uploads === queue.arrived && last.query === list.query().toString() && last.studies.length > 0) {
    view.keepsPlace = true;
    list.show();
    const opened = list.list.querySelector(`[data-uid="${CSS.escape(last.uid)}"]`);
    opened?.focus({ preventScroll: true });
    scrollTo(0, last.scroll);
  } else {
    list.find();
  }
  // What is brought in meanwhile shows as soon as all of it is there.
  follow(view, () => { if (!isBusy() && last.uploads !== queue.arrived) list.find(); });
}
