// Makes elements. Texts become text nodes and attributes are set by name, never markup: what a DICOM value says is shown
// as it stands, whatever it says.

const svgSpace = 'http://www.w3.org/2000/svg';

function fill(element, properties, children) {
  for (const [name, value] of Object.entries(properties ?? {})) {
    if (value === undefined || value === null || value === false) continue;
    if (name.startsWith('on')) element.addEventListener(name.slice(2), value);
    else element.setAttribute(name, value === true ? '' : String(value));
  }
  element.append(...children.flat(Infinity).filter((child) => child !== null && child !== undefined && child !== false));
  return element;
}

/** h('a', {href: '#/', class: 'home'}, 'Studies', ...) */
export function h(name, properties, ...children) {
  return fill(document.createElement(name), properties, children);
}

export function svg(name, properties, ...children) {
  return fill(document.createElementNS(svgSpace, name), properties, children);
}

const paths = {
  search: 'M7 12A5 5 0 1 0 7 2a5 5 0 0 0 0 10zM14 14l-3.4-3.4',
  open: 'M9 2h5v5M14 2 7.5 8.5M12 9.5V13a1 1 0 0 1-1 1H3a1 1 0 0 1-1-1V5a1 1 0 0 1 1-1h3.5',
  save: 'M8 2v8M4.5 7 8 10.5 11.5 7M2.5 13.5h11',
  send: 'M8 10V2M4.5 5.5 8 2l3.5 3.5M2.5 13.5h11',
  folder: 'M1.5 3.5h4.5L7.5 5h7v8h-13z',
  braces: 'M6 2C4 2 5 7 2.5 8 5 9 4 14 6 14M10 2c2 0 1 5 3.5 6C11 9 12 14 10 14',
  left: 'M10 3 5 8l5 5',
  right: 'M6 3l5 5-5 5',
  swap: 'M3 5h10M10.5 2.5 13 5l-2.5 2.5M13 11H3M5.5 8.5 3 11l2.5 2.5',
  filter: 'M2 3h12M4 8h8M6.5 13h3',
  compare: 'M8 2v12M2.5 4h3v8h-3zM10.5 4h3v8h-3z',
  cloud: 'M2 2l12 12M5 5.5A3.3 3.3 0 0 0 4.5 12H11M7 4.3A3.6 3.6 0 0 1 11 8a2.2 2.2 0 0 1 2.4 3',
  fault: 'M8 5v4M8 11.5v.2M8 1.8 15 14H1z',
  none: 'M2 5l1.5-3h9L14 5v8H2zM2 6h4l1 2h2l1-2h4',
};

export function icon(name) {
  return svg('svg', { class: 'icon', viewBox: '0 0 16 16', 'aria-hidden': 'true' }, svg('path', { d: paths[name] }));
}

/** A picture that is fetched when it comes into view; `label` stands where there is none. */
export function picture(address, description, label = '') {
  const frame = h('span', { class: 'picture' });
  if (label !== '') frame.append(h('span', { class: 'none' }, label));
  if (!address) return frame;
  const image = h('img', { src: address, alt: description, loading: 'lazy', decoding: 'async', width: 128, height: 128 });
  image.addEventListener('load', () => frame.firstElementChild !== image && frame.firstElementChild.remove());
  image.addEventListener('error', () => image.classList.add('failed'));
  frame.append(image);
  return frame;
}

/** What stands in place of content: what became of it, in words, and what can be done. */
export function state(symbol, title, words, action) {
  return h('div', { class: 'state', role: 'status' }, icon(symbol), h('h2', {}, title), h('p', {}, words),
    action && h('button', { class: 'button', type: 'button', onclick: action.run }, action.label));
}

/** Shapes where content will be. They come late, so that what is quick does not flicker. */
export function waiting(heights) {
  const shapes = h('div', { class: 'waiting', 'aria-busy': 'true' }, h('span', { class: 'unseen' }, 'Loading'));
  const timer = setTimeout(() => {
    for (const height of heights) {
      const bone = h('div', { class: 'bone' });
      bone.style.height = `${height}px`;
      bone.style.marginTop = '10px';
      shapes.append(bone);
    }
  }, 180);
  shapes.stop = () => clearTimeout(timer);
  return shapes;
}

/** Tells those who do not see the page what has changed on it. */
export function announce(text) {
  document.getElementById('announcer').textContent = text;
}

/** The text with every occurrence of `part`, in whatever case, marked. */
export function marked(text, part) {
  if (!part) return [text];
  const pieces = [];
  const low = text.toLowerCase();
  let from = 0;
  // Letters that change their length with their case would shift the marks.
  for (let at = low.indexOf(part); at >= 0 && low.length === text.length; at = low.indexOf(part, from)) {
    pieces.push(text.slice(from, at), h('mark', {}, text.slice(at, at + part.length)));
    from = at + part.length;
  }
  pieces.push(text.slice(from));
  return pieces;
}
