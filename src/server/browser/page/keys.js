// The keyboard: lists are one stop of the Tab key, and arrows move inside of them.

/**
 * Lets arrows move the focus among the elements of `container` that match `selector`. `step` says for a key how many
 * places to go; Home and End lead to the ends. The element that had the focus last is the one that Tab comes back to.
 */
export function roving(container, selector, step) {
  const all = () => [...container.querySelectorAll(selector)].filter((one) => one.offsetParent !== null);
  const choose = (chosen) => {
    for (const one of container.querySelectorAll(selector)) one.tabIndex = one === chosen ? 0 : -1;
  };
  container.addEventListener('keydown', (event) => {
    if (event.ctrlKey || event.metaKey || event.altKey || !event.target.matches(selector)) return;
    const elements = all();
    const at = elements.indexOf(event.target);
    const places = { Home: -at, End: elements.length - 1 - at }[event.key] ?? step(event.key, event.target);
    if (!places && event.key !== 'Home' && event.key !== 'End') return;
    event.preventDefault();
    const next = elements[Math.min(Math.max(at + places, 0), elements.length - 1)];
    choose(next);
    next.focus();
    next.scrollIntoView({ block: 'nearest', inline: 'nearest' });
  });
  container.addEventListener('focusin', (event) => event.target.matches(selector) && choose(event.target));
  return { choose, refresh: () => !container.querySelector(`:is(${selector})[tabindex="0"]`) && choose(all()[0]) };
}

export const vertical = (key) => ({ ArrowDown: 1, ArrowUp: -1, PageDown: 10, PageUp: -10 })[key];
export const horizontal = (key) => ({ ArrowRight: 1, ArrowLeft: -1, PageDown: 8, PageUp: -8 })[key];

export function isTyping(event) {
  return event.target.matches('input, select, textarea');
}

/** "/ search" */
export function hints(h, pairs) {
  return h('p', { class: 'keys', 'aria-label': 'Keys' },
    pairs.map(([keys, meaning]) => h('span', {}, keys.map((key) => [h('kbd', { class: 'key' }, key), ' ']), meaning)));
}
