// What was measured when the page was made.

const kWords = {ok: 'ok', low: 'low', 'very low': 'very-low'};

function supplyBar(label, whole, free, low, state) {
  const bar = element('div', {
    class: `supply ${state}`,
    role: 'img',
    'aria-label': `${label}: ${Math.round((1 - free / whole) * 100)} % used`,
  });
  bar.append(shareOf(element('i'), 'width', 1 - free / whole));
  // The mark where it begins to be short, from the right as what is free.
  bar.append(shareOf(element('b'), 'right', low / whole));
  return bar;
}

function stateOf(free, low, veryLow) {
  if (free < veryLow) return 'very-low';
  return free < low ? 'low' : 'ok';
}

function volumeBlock(volume) {
  const head = element(
    'div', {class: 'volume-head'}, element('h3', {}, nameOf(volume.volume)),
    element('span', {class: kWords[volume.state] || ''}, volume.state));
  const block = element('div', {class: 'volume'}, head);
  block.append(supplyBar('space', volume.size_bytes, volume.free_bytes, volume.low_bytes,
                         stateOf(volume.free_bytes, volume.low_bytes, volume.very_low_bytes)));
  block.append(element('div', {class: 'muted'},
                       `${sizeText(volume.free_bytes)} free of ${sizeText(volume.size_bytes)}; ` +
                         `low below ${sizeText(volume.low_bytes)}`));
  if (volume.inodes > 0) {
    const state = stateOf(volume.free_inodes, volume.low_inodes, volume.very_low_inodes);
    if (state !== 'ok') {
      block.append(supplyBar('inodes', volume.inodes, volume.free_inodes, volume.low_inodes, state));
    }
    block.append(element('div', {class: state === 'ok' ? 'muted' : state},
                         `${countText(volume.free_inodes)} of ${countText(volume.inodes)} inodes free`));
  }
  return block;
}

function showVolumes(data) {
  const into = place('volumes');
  if (data.volumes.length === 0) into.append(element('p', {}, 'There is no local volume here.'));
  into.append(...data.volumes.map(volumeBlock));
}

function showSummary(data, purges) {
  const short = data.volumes.filter((volume) => volume.state !== 'ok').length;
  const at = (urgency) => sum(data.volumes.map((volume) => totalAt(volume, urgency)));
  const known = data.volumes.some((volume) => volume.offers.detail !== 'nothing');
  const lacking = purges.filter((entry) => entry.why !== undefined).length;
  const read = data.history_problem === undefined;
  const tile = (title, main, more) =>
    element('div', {}, element('dt', {}, title), element('dd', {}, main),
            element('dd', {class: 'muted'}, more));
  place('summary').append(
    tile('Volumes', countText(data.volumes.length),
         short === 0 ? 'none short of space' : `${countText(short)} short of space`),
    tile('Could be freed now', known ? sizeText(at(3)) : 'not known',
         known ? `at urgency 3; ${sizeText(at(4))} at urgency 4` : ''),
    tile('Freed', read ? sizeText(sum(purges.map((entry) => Math.max(entry.freed || 0, 0)))) : 'not known',
         read ? `by ${plural(purges.length, 'purge', 'purges')}` : ''),
    tile('Fell short', read ? countText(lacking) : 'not known',
         read ? `of ${plural(purges.length, 'purge', 'purges')}` : ''));
}
