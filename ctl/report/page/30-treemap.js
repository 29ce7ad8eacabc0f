// What could be freed now: an area for each service, as large as what it could give.

function totalAt(volume, urgency) {
  const offers = (volume.offers.urgencies || []).find((one) => one.urgency === urgency);
  return offers === undefined ? 0 : Math.max(offers.total_bytes, 0);
}

function tilesOf(volume, urgency) {
  const offers = (volume.offers.urgencies || []).find((one) => one.urgency === urgency);
  if (offers === undefined) return [];
  if (volume.offers.detail !== 'services') {
    return offers.total_bytes > 0 ? [{id: 'all services together', bytes: offers.total_bytes}] : [];
  }
  return offers.services.filter((service) => service.bytes > 0)
    .sort((one, other) => other.bytes - one.bytes);
}

// The worst of the ratios of the sides when these areas fill a strip along a side.
function worstRatio(areas, side) {
  const width = sum(areas) / side;
  return Math.max(...areas.map((area) => {
    const length = area / width;
    return Math.max(width / length, length / width);
  }));
}

// Areas in a box, sorted from large to small, each as near to a square as a strip lets it be.
function squarified(weights, box) {
  const scale = (box.width * box.height) / sum(weights);
  const areas = weights.map((weight) => weight * scale);
  const places = [];
  let {left, top, width, height} = box;
  for (let at = 0; at < areas.length;) {
    const side = Math.min(width, height);
    let end = at + 1;
    while (end < areas.length && worstRatio(areas.slice(at, end + 1), side) <=
                                   worstRatio(areas.slice(at, end), side)) {
      end += 1;
    }
    const strip = areas.slice(at, end);
    const thickness = sum(strip) / side;
    let along = 0;
    for (const area of strip) {
      const length = area / thickness;
      places.push(width >= height ? {left, top: top + along, width: thickness, height: length}
                                  : {left: left + along, top, width: length, height: thickness});
      along += length;
    }
    if (width >= height) {
      left += thickness;
      width -= thickness;
    } else {
      top += thickness;
      height -= thickness;
    }
    at = end;
  }
  return places;
}

function putAt(node, spot, box) {
  shareOf(node, 'left', spot.left / box.width);
  shareOf(node, 'top', spot.top / box.height);
  shareOf(node, 'width', spot.width / box.width);
  shareOf(node, 'height', spot.height / box.height);
  return node;
}

function tileNode(service, volume, spot, box) {
  const words = `${shown(service.id)} could free ${sizeText(service.bytes)} on ${shown(volume.volume)}`;
  const small = spot.width < 56 || spot.height < 34;
  const node = element(
    'div', {
      class: `tile ${colourOf(service.id)}${small ? ' small' : ''}`,
      title: words,
      role: 'img',
      'aria-label': words,
      tabindex: 0,
    },
    nameOf(service.id), element('br'), sizeText(service.bytes));
  return putAt(node, spot, box);
}

const kTitleHeight = 24;

function groupNode(volume, tiles, spot, box) {
  const titled = spot.height > 2 * kTitleHeight && spot.width > kTitleHeight;
  const inner = {left: 0, top: 0, width: Math.max(spot.width - 2, 1),
                 height: Math.max(spot.height - (titled ? kTitleHeight : 0) - 1, 1)};
  const places = squarified(tiles.map((tile) => tile.bytes), inner);
  const nodes = tiles.map((tile, index) => tileNode(tile, volume, places[index], inner));
  const title = element('div', {class: 'title'}, nameOf(volume.volume),
                        `: ${sizeText(sum(tiles.map((tile) => tile.bytes)))}`);
  return putAt(element('div', {class: `group${titled ? '' : ' bare'}`}, title, element('div', {class: 'tiles'}, ...nodes)),
               spot, box);
}

function drawMap(map, data, urgency) {
  const box = {left: 0, top: 0, width: map.clientWidth || 800, height: map.clientHeight || 350};
  const groups = data.volumes.map((volume) => ({volume, tiles: tilesOf(volume, urgency)}))
                   .filter((group) => group.tiles.length > 0)
                   .map((group) => ({...group, bytes: sum(group.tiles.map((tile) => tile.bytes))}))
                   .sort((one, other) => other.bytes - one.bytes);
  map.classList.toggle('empty', groups.length === 0);
  if (groups.length === 0) {
    map.replaceChildren(element('p', {}, `At urgency ${urgency} nothing could be freed.`));
    return;
  }
  const places = squarified(groups.map((group) => group.bytes), box);
  map.replaceChildren(...groups.map(
    (group, index) => groupNode(group.volume, group.tiles, places[index], box)));
}

function urgencyChoice(changed) {
  const meanings = ['what nobody will miss', '', 'the default', 'all that can be given'];
  const labels = meanings.map((meaning, index) => {
    const urgency = index + 1;
    const button = element('input', {
      type: 'radio', name: 'urgency', value: urgency, checked: urgency === 3 ? '' : undefined});
    button.addEventListener('change', () => changed(urgency));
    return element('label', {}, button, ` ${urgency}${meaning === '' ? '' : `, ${meaning}`}`);
  });
  return element('fieldset', {}, element('legend', {}, 'At urgency'), ...labels);
}

// The same in numbers, for those who cannot see areas.
function offersTable(data) {
  const urgencies = [1, 2, 3, 4];
  const rows = [];
  for (const volume of data.volumes.filter((one) => one.offers.detail !== 'nothing')) {
    const names = new Set(urgencies.flatMap((urgency) => tilesOf(volume, urgency).map((tile) => tile.id)));
    for (const name of names) {
      const cells = urgencies.map((urgency) => {
        const tile = tilesOf(volume, urgency).find((one) => one.id === name);
        return element('td', {class: 'number'}, tile === undefined ? '-' : sizeText(tile.bytes));
      });
      rows.push(element('tr', {}, element('td', {}, nameOf(volume.volume)),
                        element('td', {}, nameOf(name)), ...cells));
    }
  }
  if (rows.length === 0) return '';
  const heads = urgencies.map((urgency) => element('th', {scope: 'col', class: 'number'}, `urgency ${urgency}`));
  const head = element('tr', {}, element('th', {scope: 'col'}, 'Volume'),
                       element('th', {scope: 'col'}, 'Service'), ...heads);
  return element('details', {}, element('summary', {}, 'In numbers'),
                 element('div', {class: 'scroll'},
                         element('table', {}, element('thead', {}, head), element('tbody', {}, ...rows))));
}

// Who could give the most gets the clearest colours.
function colourServices(data) {
  const most = new Map();
  for (const volume of data.volumes) {
    for (const tile of tilesOf(volume, 4)) most.set(tile.id, (most.get(tile.id) || 0) + tile.bytes);
  }
  giveColours([...most].sort((one, other) => other[1] - one[1]).map(([id]) => id));
}

function showOffers(data) {
  const into = place('offers');
  colourServices(data);
  if (data.volumes.every((volume) => volume.offers.detail === 'nothing')) {
    into.append(unknown());
    return;
  }
  const map = element('div', {class: 'map'});
  let urgency = 3;
  const draw = () => drawMap(map, data, urgency);
  into.append(urgencyChoice((chosen) => {
    urgency = chosen;
    draw();
  }), map, offersTable(data));
  whenWidthChanges(map, draw);
}
