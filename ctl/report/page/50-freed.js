// What was freed, by whom, for whom; and why it was not enough.

const kMostBars = 15;

function isPurge(entry) {
  return entry.kind !== 'daily pass';
}

function askerOf(entry) {
  if (entry.client !== undefined) return entry.client;
  return entry.kind === 'low space' ? 'the daemon, because space was low' : 'the daemon, in its daily pass';
}

function added(amounts, name, bytes) {
  if (bytes > 0) amounts.set(name, (amounts.get(name) || 0) + bytes);
}

// The largest first; what is beyond the longest list that one reads is one line.
function ranked(amounts) {
  const all = [...amounts].sort((one, other) => other[1] - one[1]);
  const rest = all.slice(kMostBars);
  const top = all.slice(0, kMostBars).map(([name, bytes]) => ({name, bytes}));
  if (rest.length > 0) {
    top.push({words: `${countText(rest.length)} others`, bytes: sum(rest.map((one) => one[1]))});
  }
  return top;
}

function barList(amounts, otherBytes, colour, nothing) {
  const bars = ranked(amounts);
  if (otherBytes > 0) bars.push({words: 'others, not told apart', bytes: otherBytes});
  if (bars.length === 0) return element('p', {class: 'muted'}, nothing);
  const most = Math.max(...bars.map((bar) => bar.bytes));
  return element('ul', {class: 'bars'}, ...bars.map((bar) => {
    const fill = shareOf(element('i', {class: colour(bar.name)}), 'width', bar.bytes / most);
    return element('li', {}, element('span', {class: 'name'}, bar.words || nameOf(bar.name)),
                   element('span', {class: 'number'}, sizeText(bar.bytes)),
                   element('div', {class: 'bar'}, fill));
  }));
}

function showFreed(data) {
  const byService = new Map();
  const byAsker = new Map();
  let others = 0;
  for (const entry of data.entries) {
    for (const [id, bytes] of Object.entries(entry.services || {})) added(byService, id, bytes);
    others += Math.max(entry.others || 0, 0);
    added(byAsker, askerOf(entry), entry.freed === undefined ? entry.reported || 0 : entry.freed);
  }
  giveColours(ranked(byService).filter((bar) => bar.name !== undefined).map((bar) => bar.name));
  place('freed').append(element(
    'div', {class: 'columns'},
    element('div', {}, element('h3', {}, 'By which service, as they say'),
            barList(byService, others, colourOf, 'No service has said that it freed anything.')),
    element('div', {}, element('h3', {}, 'For whom, as the volumes gained'),
            barList(byAsker, 0, () => 'plain', 'Nothing was freed for anybody.'))));
}

const kReasons = {
  'no services': {
    what: 'found nobody to ask',
    advice: 'No service takes part in purges of that volume. See "spacekeepctl doctor" for services that ' +
      'should, and the rule files of spacekeep-command for caches that are there.',
  },
  'no answer in time': {
    what: 'ended while services had not answered',
    advice: 'A longer wait ("--timeout") may be all it takes; a service that never answers is broken.',
  },
  'nothing more to give': {
    what: 'took all that the services had at that urgency',
    advice: 'A higher urgency gives more where the map above shows more. What is left belongs to no service.',
  },
  cancelled: {what: 'were cancelled', advice: ''},
};

// "refused: TEXT" is one kind whatever the text.
function reasonOf(why) {
  if (Object.hasOwn(kReasons, why)) return {key: why, ...kReasons[why]};
  if (why.startsWith('refused: ')) return {key: why, what: 'were refused', text: why.slice(9), advice: ''};
  return {key: why, what: 'fell short', text: why, advice: ''};
}

function silentText(entries) {
  const times = new Map();
  for (const id of entries.flatMap((entry) => entry.silent || [])) times.set(id, (times.get(id) || 0) + 1);
  const all = [...times].sort((one, other) => other[1] - one[1]).slice(0, 5);
  return all.flatMap(([id, count], index) => [
    index === 0 ? ' Not heard of in time: ' : ', ', nameOf(id), ` (${plural(count, 'time', 'times')})`]);
}

function reasonBlock(reason, entries, purges) {
  const asked = sum(entries.map((entry) => entry.asked || 0));
  const freed = sum(entries.map((entry) => entry.freed || 0));
  const latest = entries.reduce((one, other) => ((other.date || 0) > (one.date || 0) ? other : one));
  const block = element('p', {}, element('strong', {}, `${countText(entries.length)} of ${plural(purges, 'purge', 'purges')}`),
                        ` ${reason.what}`);
  if (reason.text !== undefined) block.append(': ', nameOf(reason.text));
  block.append(`. Asked for ${sizeText(asked)}, freed ${sizeText(freed)}.`, ...silentText(entries));
  if (silentText(entries).length > 0) block.append('.');
  if (latest.date !== undefined) block.append(` The last: ${momentText(latest.date)}`);
  if (latest.date !== undefined && latest.volume !== undefined) block.append(' on ', nameOf(latest.volume));
  if (latest.date !== undefined) block.append('.');
  if (reason.advice !== '') block.append(' ', element('span', {class: 'muted'}, reason.advice));
  return block;
}

function showShort(data, purges) {
  const groups = new Map();
  for (const entry of purges.filter((one) => one.why !== undefined)) {
    if (!groups.has(entry.why)) groups.set(entry.why, []);
    groups.get(entry.why).push(entry);
  }
  const all = [...groups].sort((one, other) => other[1].length - one[1].length);
  const into = place('short');
  if (all.length === 0) {
    into.append(element('p', {class: 'muted'}, purges.length === 0 ? 'There was no purge.'
                                                                   : 'None of them did.'));
  }
  into.append(...all.slice(0, kMostBars)
    .map(([why, entries]) => reasonBlock(reasonOf(why), entries, purges.length)));
  if (all.length > kMostBars) {
    into.append(element('p', {class: 'muted'}, `and ${countText(all.length - kMostBars)} rarer reasons`));
  }
}
