// The attributes of an image as a tree of rows: filtered, opened and walked by keys.

import { h, marked } from './dom.js';
import { amount, spaced, tagText } from './format.js';

const mostRows = 4000;
const kinds = ['study', 'series', 'image', 'hidden'];
const kindOf = (attribute) => (attribute.hidden ? 'hidden' : attribute.origin);

const words = {
  study: 'held by the study, for all of its images',
  series: 'held by the series, for all of its images',
  image: 'held by this image alone',
  hidden: 'marks: this has no value here, although a node above has one',
};

function textOf(attribute) {
  return `${attribute.name} ${spaced(attribute.name)} ${tagText(attribute.tag)} ${attribute.tag} ${attribute.value ?? ''} ${attribute.creator ?? ''}`.toLowerCase();
}

export class AttributeTree {
  constructor(attributes, isComplete) {
    this.attributes = attributes;
    this.isComplete = isComplete;
    this.open = new Set();
    this.texts = new Map();
    this.filter = '';
    this.shownKinds = new Set(kinds);
    this.rows = h('div', { class: 'attributes', role: 'treegrid', 'aria-label': 'Attributes' });
    this.note = h('p', { class: 'note', role: 'status' });
    this.rows.addEventListener('keydown', (event) => this.key(event));
    this.rows.addEventListener('click', (event) => {
      const row = event.target.closest('[aria-expanded]');
      if (row && !getSelection().toString()) this.toggle(row.dataset.path);
    });
    this.rows.addEventListener('focusin', (event) => this.choose(event.target.closest('[role=row]')));
  }

  /** How many attributes each node holds, at the top of the tree. */
  counts() {
    const counts = Object.fromEntries(kinds.map((kind) => [kind, 0]));
    for (const attribute of this.attributes) ++counts[kindOf(attribute)];
    return counts;
  }

  chips() {
    const counts = this.counts();
    return h('div', { class: 'chips', role: 'group', 'aria-label': 'Held by' }, kinds.filter((kind) => counts[kind] > 0).map((kind) =>
      h('button', { class: `chip of-${kind}`, type: 'button', 'aria-pressed': 'true', title: words[kind],
        onclick: (event) => this.toggleKind(kind, event.currentTarget) },
      h('i', {}), `${kind} ${counts[kind]}`)));
  }

  toggleKind(kind, button) {
    const isShown = !this.shownKinds.has(kind);
    if (isShown) this.shownKinds.add(kind);
    else this.shownKinds.delete(kind);
    button.setAttribute('aria-pressed', isShown);
    this.show();
  }

  search(text) {
    this.filter = text.trim().toLowerCase();
    this.show();
  }

  fits(attribute) {
    if (!this.shownKinds.has(kindOf(attribute))) return false;
    if (!this.filter) return true;
    if (!this.texts.has(attribute)) this.texts.set(attribute, textOf(attribute));
    return this.texts.get(attribute).includes(this.filter);
  }

  /** Whether the attribute itself or something in its items is wanted. */
  isWanted(attribute) {
    return this.fits(attribute) || (attribute.items ?? []).some((item) => item.some((one) => this.isWanted(one)));
  }

  isNarrowed() {
    return this.filter !== '' || this.shownKinds.size < kinds.length;
  }

  show() {
    const rows = [];
    this.found = 0;
    this.collect(this.attributes, '', 1, rows);
    this.rows.replaceChildren(...rows.slice(0, mostRows));
    const parts = [];
    if (rows.length === 0) parts.push('No attribute fits.');
    else if (this.isNarrowed()) parts.push(`${amount(this.found, 'attribute')} of ${this.attributes.length} fit.`);
    if (rows.length > mostRows) parts.push(`The first ${mostRows} rows are shown; a filter shows others.`);
    if (!this.isComplete) parts.push('The image has more attributes than are shown here; all of them are in its metadata.');
    this.note.textContent = parts.join(' ');
    this.note.hidden = parts.length === 0;
    this.choose(this.rows.querySelector(`[data-path="${CSS.escape(this.chosen ?? '')}"]`) ?? this.rows.firstElementChild);
  }

  collect(attributes, path, level, rows) {
    for (const attribute of attributes) {
      const at = `${path}/${attribute.tag}`;
      const fits = this.fits(attribute);
      if (this.isNarrowed() && !this.isWanted(attribute)) continue;
      if (fits) ++this.found;
      // What a filter found inside is shown without being opened.
      const isOpen = this.open.has(at) || (this.isNarrowed() && !fits && attribute.items?.length > 0);
      rows.push(this.row(attribute, at, level, isOpen));
      if (isOpen) this.collectItems(attribute, at, level + 1, rows, fits);
    }
  }

  collectItems(attribute, path, level, rows, isWhole) {
    attribute.items.forEach((item, i) => {
      if (!isWhole && !item.some((one) => this.isWanted(one))) return;
      rows.push(h('div', { class: 'attribute item', role: 'row', 'aria-level': level, 'data-path': `${path}/${i}`, tabindex: -1 },
        this.nameCell(level, `Item ${i + 1} of ${attribute.count}`, '')));
      this.collect(item, `${path}/${i}`, level + 1, rows);
    });
    if (attribute.items.length < attribute.count) {
      rows.push(h('div', { class: 'attribute item', role: 'row', 'aria-level': level, tabindex: -1 },
        this.nameCell(level, `${attribute.count - attribute.items.length} more items, not shown`, '')));
    }
  }

  nameCell(level, text, tag, twist = '') {
    const cell = h('span', { class: 'name', role: 'gridcell' }, h('span', { class: 'twist', 'aria-hidden': 'true' }, twist),
      h('span', {}, marked(text, this.filter), ' ', tag && h('span', { class: 'tag number' }, marked(tag, this.filter))));
    cell.style.setProperty('--depth', level - 1);
    return cell;
  }

  row(attribute, path, level, isOpen) {
    const hasItems = attribute.items?.length > 0;
    const kind = kindOf(attribute);
    const name = attribute.name ? spaced(attribute.name) : `Private${attribute.creator ? `, ${attribute.creator}` : ''}`;
    const text = h('span', { class: 'text value', role: 'gridcell' }, this.value(attribute));
    text.style.setProperty('--depth', level - 1);
    return h('div', { class: `attribute${attribute.hidden ? ' hidden-mark' : ''}`, role: 'row', 'aria-level': level, 'data-path': path,
      'aria-expanded': hasItems ? String(isOpen) : null, tabindex: -1 },
    this.nameCell(level, name, tagText(attribute.tag), hasItems ? (isOpen ? '▾' : '▸') : ''),
    h('span', { class: 'vr', role: 'gridcell' }, attribute.vr ?? ''), text,
    h('span', { class: `origin of-${kind}`, role: 'gridcell', title: words[kind] }, h('i', {}), kind));
  }

  value(attribute) {
    const note = (words) => h('span', { class: 'soft' }, words);
    if (attribute.hidden) return note(`not in this ${attribute.origin}, although a node above has it`);
    if (attribute.omitted) return note('too long for the tag file; in the DICOM file');
    if (attribute.items) return note(amount(attribute.count, 'item'));
    if (attribute.value === '') return note('empty');
    const shown = marked(attribute.value, this.filter);
    return attribute.length ? [shown, note(` … ${attribute.length} characters in all`)] : shown;
  }

  choose(row) {
    if (!row) return;
    for (const one of this.rows.querySelectorAll('[tabindex="0"]')) one.tabIndex = -1;
    row.tabIndex = 0;
    this.chosen = row.dataset.path;
  }

  toggle(path) {
    if (!this.open.delete(path)) this.open.add(path);
    const hadFocus = this.rows.contains(document.activeElement);
    this.chosen = path;
    this.show();
    if (hadFocus) this.rows.querySelector('[tabindex="0"]')?.focus();
  }

  key(event) {
    const row = event.target.closest('[role=row]');
    if (!row || event.ctrlKey || event.metaKey || event.altKey) return;
    const rows = [...this.rows.children];
    const at = rows.indexOf(row);
    const expanded = row.getAttribute('aria-expanded');
    const level = Number(row.getAttribute('aria-level'));
    const above = () => rows.slice(0, at).reverse().find((one) => Number(one.getAttribute('aria-level')) < level);
    const move = { ArrowDown: rows[at + 1], ArrowUp: rows[at - 1], Home: rows[0], End: rows[rows.length - 1],
      PageDown: rows[Math.min(at + 15, rows.length - 1)], PageUp: rows[Math.max(at - 15, 0)],
      ArrowLeft: expanded === 'true' ? null : above(), ArrowRight: expanded === 'true' ? rows[at + 1] : null }[event.key];
    const isToggle = (event.key === 'ArrowRight' && expanded === 'false') || (event.key === 'ArrowLeft' && expanded === 'true') ||
      ((event.key === 'Enter' || event.key === ' ') && expanded !== null);
    if (!isToggle && !move) return;
    event.preventDefault();
    if (isToggle) this.toggle(row.dataset.path);
    else move.focus();
  }
}
