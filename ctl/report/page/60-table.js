// All entries, a page at a time: a browser lays out a few rows at once, and ten thousand not.

const kPageRows = 50;

function resultText(entry) {
  if (entry.why === undefined) return isPurge(entry) ? 'reached' : 'done';
  const reason = reasonOf(entry.why);
  return reason.text === undefined ? entry.why : shown(reason.text);
}

function searchText(entry) {
  return [entry.volume, askerOf(entry), entry.kind, entry.why, ...Object.keys(entry.services || {}),
          ...(entry.silent || [])].join('\n').toLowerCase();
}

function detailOf(entry) {
  const lines = Object.entries(entry.services || {}).sort((one, other) => other[1] - one[1])
    .map(([id, bytes]) => element('li', {}, nameOf(id), ` freed ${sizeText(bytes)}, as it says`));
  if (entry.others > 0) lines.push(element('li', {}, `others freed ${sizeText(entry.others)}`));
  lines.push(...(entry.silent || []).map((id) => element('li', {}, nameOf(id), ' had not answered')));
  if (entry.begin !== undefined && entry.end !== undefined) {
    lines.push(element('li', {}, `free before ${sizeText(entry.begin)}, after ${sizeText(entry.end)}`));
  }
  if (lines.length === 0) lines.push(element('li', {}, 'nothing more is known'));
  return element('tr', {class: 'detail'}, element('td', {colspan: 9}, element('ul', {}, ...lines)));
}

const kColumns = [
  {title: 'When', class: 'when'},
  {title: 'What', class: 'when', text: (entry) => entry.kind},
  {title: 'Volume', text: (entry) => entry.volume},
  {title: 'For', text: askerOf},
  {title: 'Asked', class: 'number', text: (entry) => sizeText(entry.asked)},
  {title: 'Freed', class: 'number', text: (entry) => sizeText(entry.freed === undefined ? entry.reported : entry.freed)},
  {title: 'Urgency', class: 'number', text: (entry) => entry.urgency},
  {title: 'Took', class: 'number', text: (entry) => durationText(entry.seconds)},
  {title: 'Result', text: resultText},
];

function rowOf(entry) {
  const button = element('button', {class: 'more', type: 'button', 'aria-expanded': 'false'},
                         momentText(entry.date) || 'unknown');
  const cells = kColumns.slice(1).map((column) => {
    const text = column.text(entry);
    const cell = element('td', {class: column.class, 'data-label': column.title});
    if (text !== undefined && text !== '') cell.append(column.class === 'number' ? String(text) : nameOf(text));
    return cell;
  });
  if (entry.why !== undefined) cells[cells.length - 1].classList.add('low');
  const row = element('tr', {}, element('td', {class: 'when'}, button), ...cells);
  button.addEventListener('click', () => {
    const open = button.getAttribute('aria-expanded') === 'true';
    button.setAttribute('aria-expanded', String(!open));
    if (open) row.nextSibling.remove(); else row.after(detailOf(entry));
  });
  return row;
}

function filtersFor(changed) {
  const text = element('input', {type: 'search', 'aria-label': 'Search', placeholder: 'service, volume, program'});
  const kind = element('select', {'aria-label': 'Kind'},
                       ...[['', 'all kinds'], ['purge', 'purges'], ['low space', 'low space'], ['daily pass', 'daily passes']]
                         .map(([value, words]) => element('option', {value}, words)));
  const short = element('input', {type: 'checkbox'});
  const wanted = () => ({text: text.value.toLowerCase(), kind: kind.value, short: short.checked});
  for (const input of [text, kind, short]) input.addEventListener('input', () => changed(wanted()));
  return element('div', {class: 'filters', role: 'search'}, text, kind,
                 element('label', {}, short, 'fell short'));
}

function pagerFor(turned) {
  const status = element('span', {role: 'status'});
  const buttons = [['First', () => 0], ['Newer', (page) => page - 1], ['Older', (page) => page + 1],
                   ['Last', (page, last) => last]]
    .map(([words, target]) => {
      const button = element('button', {type: 'button'}, words);
      button.addEventListener('click', () => turned(target));
      return button;
    });
  const show = (page, last, count) => {
    const from = page * kPageRows;
    status.textContent = count === 0 ? 'No entry.' :
      `${countText(from + 1)} to ${countText(Math.min(from + kPageRows, count))} of ${plural(count, 'entry', 'entries')}`;
    buttons.forEach((button, index) => {
      button.disabled = index < 2 ? page === 0 : page >= last;
    });
  };
  return {node: element('nav', {class: 'pager', 'aria-label': 'Pages'}, ...buttons, status), show};
}

function showTable(data) {
  const into = place('table');
  if (data.entries.length === 0) {
    into.append(element('p', {class: 'muted'}, 'No entry is known.'));
    return;
  }
  const texts = new Map();
  const textOf = (entry) => {
    if (!texts.has(entry)) texts.set(entry, searchText(entry));
    return texts.get(entry);
  };
  const body = element('tbody');
  let found = data.entries;
  let page = 0;
  const last = () => Math.max(0, Math.ceil(found.length / kPageRows) - 1);
  const draw = () => {
    const from = page * kPageRows;
    body.replaceChildren(...found.slice(from, from + kPageRows).map(rowOf));
    pager.show(page, last(), found.length);
  };
  const pager = pagerFor((target) => {
    page = Math.max(0, Math.min(target(page, last()), last()));
    draw();
  });
  const filters = filtersFor((wanted) => {
    found = data.entries.filter((entry) => (wanted.kind === '' || entry.kind === wanted.kind) &&
      (!wanted.short || entry.why !== undefined) && (wanted.text === '' || textOf(entry).includes(wanted.text)));
    page = 0;
    draw();
  });
  const heads = kColumns.map((column) => element('th', {scope: 'col', class: column.class}, column.title));
  into.append(filters, element('div', {class: 'scroll'}, element(
    'table', {class: 'entries'}, element('thead', {}, element('tr', {}, ...heads)), body)), pager.node);
  draw();
}
