// Texts and elements. Every text reaches the page as text, never as markup.

const kUnits = ['B', 'KiB', 'MiB', 'GiB', 'TiB', 'PiB', 'EiB'];

// Steps of 1024, one decimal, cut off rather than carried up, as the tool itself prints sizes.
function sizeText(bytes) {
  if (typeof bytes !== 'number') return '';
  let amount = Math.abs(bytes);
  let unit = 0;
  while (amount >= 1024 && unit < kUnits.length - 1) {
    amount /= 1024;
    unit += 1;
  }
  const sign = bytes < 0 ? '-' : '';
  const digits = unit === 0 ? String(Math.floor(amount)) : (Math.floor(amount * 10) / 10).toFixed(1);
  return `${sign}${digits} ${kUnits[unit]}`;
}

function unknown() {
  return element('p', {class: 'muted'}, 'Not known.');
}

function countText(count) {
  return count.toLocaleString('en');
}

function plural(count, one, many) {
  return `${countText(count)} ${count === 1 ? one : many}`;
}

const kMoment = new Intl.DateTimeFormat(undefined, {dateStyle: 'medium', timeStyle: 'short'});
const kDay = new Intl.DateTimeFormat(undefined, {day: 'numeric', month: 'short', year: '2-digit'});
const kDayAndHour = new Intl.DateTimeFormat(
  undefined, {day: 'numeric', month: 'short', hour: '2-digit', minute: '2-digit'});
const kSecond = new Intl.DateTimeFormat(
  undefined, {hour: '2-digit', minute: '2-digit', second: '2-digit'});
const kHour = new Intl.DateTimeFormat(undefined, {hour: '2-digit', minute: '2-digit'});

function momentText(seconds) {
  return typeof seconds === 'number' ? kMoment.format(seconds * 1000) : '';
}

function durationText(seconds) {
  if (typeof seconds !== 'number') return '';
  if (seconds < 1) return `${Math.round(seconds * 1000)} ms`;
  return seconds < 120 ? `${seconds.toFixed(1)} s` : `${Math.floor(seconds / 60)} min`;
}

// Control characters, and those that turn the direction of what stands around them, are shown by
// their numbers: a name must not look like another one.
const kInvisible = /[\u0000-\u001f\u007f-\u009f\u00ad\u061c\u200b-\u200f\u2028-\u202e\u2060-\u206f\ufeff]/g;

function shown(text) {
  return String(text).replace(kInvisible, (letter) => {
    const number = letter.charCodeAt(0).toString(16).toUpperCase().padStart(4, '0');
    return `[U+${number}]`;
  });
}

// A name from elsewhere, kept apart from the direction of the text around it. It may be broken where
// it has parts.
function nameOf(text) {
  const parts = shown(text).split(/(?<=[.:])|(?<=[^/])(?=\/)/);
  return element('bdi', {}, ...parts.flatMap((part) => [part, element('wbr')]).slice(0, -1));
}

function filled(node, attributes, children) {
  for (const [name, value] of Object.entries(attributes)) {
    if (value !== undefined && value !== null && value !== false) node.setAttribute(name, value);
  }
  node.append(...children);
  return node;
}

function element(tag, attributes = {}, ...children) {
  return filled(document.createElement(tag), attributes, children);
}

function drawn(tag, attributes = {}, ...children) {
  return filled(document.createElementNS('http://www.w3.org/2000/svg', tag), attributes, children);
}

function place(id) {
  return document.getElementById(id);
}

// How much of a length something takes; the style sheet says where.
function shareOf(node, property, share) {
  node.style.setProperty(property, `${(Math.min(Math.max(share, 0), 1) * 100).toFixed(3)}%`);
  return node;
}

const kColours = 8;
const coloured = new Map();

// Gives each of these a colour, the first ones one of their own.
function giveColours(names) {
  for (const name of names) {
    if (!coloured.has(name)) coloured.set(name, `tile-${Math.min(coloured.size + 1, kColours)}`);
  }
}

// The last colour, a grey, is that of all who are not among the first.
function colourOf(name) {
  return coloured.get(name) || `tile-${kColours}`;
}

function sum(numbers) {
  return numbers.reduce((total, number) => total + number, 0);
}
