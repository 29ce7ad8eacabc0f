// Free space over time: a line for each volume, through what was measured before and after.

// Drawn once the width is known, and again when it changes.
function whenWidthChanges(node, draw) {
  let width = node.clientWidth;
  draw();
  new ResizeObserver(() => {
    if (node.clientWidth === width) return;
    width = node.clientWidth;
    draw();
  }).observe(node);
}

function pointsOf(volume, data) {
  const points = [];
  for (const entry of data.entries) {
    if (entry.volume !== volume || typeof entry.date !== 'number') continue;
    if (typeof entry.begin === 'number') points.push({at: entry.date - (entry.seconds || 0), free: entry.begin});
    if (typeof entry.end === 'number') points.push({at: entry.date, free: entry.end});
  }
  const now = data.volumes.find((one) => one.volume === volume);
  if (now !== undefined) points.push({at: data.made, free: now.free_bytes});
  return points.sort((one, other) => one.at - other.at);
}

// No more than four points for each column of pixels: the first, the lowest, the highest, the last.
function thinned(points, columns, columnOf) {
  if (points.length <= columns * 4) return points;
  const kept = [];
  let bucket = [];
  const flush = () => {
    if (bucket.length === 0) return;
    let lowest = bucket[0];
    let highest = bucket[0];
    for (const point of bucket) {
      if (point.free < lowest.free) lowest = point;
      if (point.free > highest.free) highest = point;
    }
    const wanted = new Set([bucket[0], lowest, highest, bucket[bucket.length - 1]]);
    kept.push(...bucket.filter((point) => wanted.has(point)));
    bucket = [];
  };
  let column = -1;
  for (const point of points) {
    if (columnOf(point) !== column) flush();
    column = columnOf(point);
    bucket.push(point);
  }
  flush();
  return kept;
}

// A round size above, of which a quarter is round too.
function roundAbove(bytes) {
  let unit = 1;
  while (bytes / unit >= 1024) unit *= 1024;
  let power = 1;
  while (power * 10 <= bytes / unit) power *= 10;
  const factor = [1, 1.2, 1.6, 2, 2.4, 3.2, 4, 5, 6, 8, 10].find((one) => one * power * unit >= bytes);
  return (factor === undefined ? 10 : factor) * power * unit;
}

// Where moments and sizes stand in the picture.
function scaleFor(points, low, width, height) {
  const first = points[0].at;
  const span = Math.max(points[points.length - 1].at - first, 1);
  let most = low || 0;
  for (const point of points) most = Math.max(most, point.free);
  const top = roundAbove(Math.max(most, 1));
  const box = {left: 66, right: width - 8, top: 8, bottom: height - 22};
  return {
    first, span, top, box,
    x: (at) => box.left + ((at - first) / span) * (box.right - box.left),
    y: (free) => box.bottom - (free / top) * (box.bottom - box.top),
  };
}

function frameOf(scale) {
  const {box, top} = scale;
  const parts = [];
  for (const share of [0, 0.25, 0.5, 0.75, 1]) {
    const y = scale.y(top * share);
    parts.push(drawn('line', {class: 'frame', x1: box.left, x2: box.right, y1: y, y2: y}));
    parts.push(drawn('text', {class: 'mark', x: box.left - 6, y: y + 4, 'text-anchor': 'end'},
                     sizeText(top * share)));
  }
  const marks = Math.max(2, Math.min(7, Math.floor((box.right - box.left) / 125)));
  const format = scale.span > 7 * 24 * 3600 ? kDay : scale.span > 24 * 3600 ? kDayAndHour : scale.span > 1200 ? kHour : kSecond;
  for (let mark = 0; mark < marks; mark += 1) {
    const at = scale.first + (scale.span * mark) / (marks - 1);
    const anchor = mark === 0 ? 'start' : mark === marks - 1 ? 'end' : 'middle';
    parts.push(drawn('text', {class: 'mark', x: scale.x(at), y: box.bottom + 16, 'text-anchor': anchor},
                     format.format(at * 1000)));
  }
  return parts;
}

function lineThrough(points, scale) {
  return points.map((point, index) =>
    `${index === 0 ? 'M' : 'L'}${scale.x(point.at).toFixed(1)} ${scale.y(point.free).toFixed(1)}`).join('');
}

function nearest(points, at) {
  let low = 0;
  let high = points.length - 1;
  while (low < high) {
    const middle = (low + high) >> 1;
    if (points[middle].at < at) low = middle + 1; else high = middle;
  }
  return low > 0 && at - points[low - 1].at < points[low].at - at ? low - 1 : low;
}

function drawChart(svg, points, low) {
  const width = svg.clientWidth || 800;
  const height = svg.clientHeight || 176;
  const scale = scaleFor(points, low, width, height);
  const {box} = scale;
  const kept = thinned(points, Math.ceil(width), (point) => Math.round(scale.x(point.at)));
  const line = lineThrough(kept, scale);
  const end = `L${scale.x(points[points.length - 1].at).toFixed(1)} ${box.bottom}L${box.left} ${box.bottom}Z`;
  const cursor = drawn('line', {class: 'cursor', y1: box.top, y2: box.bottom, visibility: 'hidden'});
  const dot = drawn('circle', {class: 'dot', r: 4, visibility: 'hidden'});
  const threshold = low > 0 ? [drawn('rect', {
    class: 'threshold', x: box.left, width: Math.max(box.right - box.left, 0),
    y: scale.y(low), height: box.bottom - scale.y(low)})] : [];
  svg.replaceChildren(...threshold, ...frameOf(scale), drawn('path', {class: 'below', d: line + end}),
                      drawn('path', {class: 'space', d: line}), cursor, dot);
  svg.setAttribute('viewBox', `0 0 ${width} ${height}`);
  return {scale, show(point) {
    for (const part of [cursor, dot]) part.setAttribute('visibility', 'visible');
    cursor.setAttribute('x1', scale.x(point.at));
    cursor.setAttribute('x2', scale.x(point.at));
    dot.setAttribute('cx', scale.x(point.at));
    dot.setAttribute('cy', scale.y(point.free));
  }};
}

function chartOf(volume, data) {
  const points = pointsOf(volume, data);
  const now = data.volumes.find((one) => one.volume === volume);
  const figure = element('figure', {class: 'chart'}, element('h3', {}, nameOf(volume)));
  const svg = drawn('svg', {
    role: 'img', tabindex: 0,
    'aria-label': `Free space on ${shown(volume)} from ${momentText(points[0].at)} to ` +
      `${momentText(points[points.length - 1].at)}. Left and right arrow keys read the points.`});
  const reading = element('output', {}, now === undefined ? 'not mounted now' :
    `The band at the bottom is where the volume counts as low: below ${sizeText(now.low_bytes)}`);
  figure.append(svg, reading);
  let picture = null;
  let index = points.length - 1;
  const read = (at) => {
    index = Math.max(0, Math.min(points.length - 1, at));
    reading.textContent = `${momentText(points[index].at)}: ${sizeText(points[index].free)} free`;
    picture.show(points[index]);
  };
  svg.addEventListener('pointermove', (event) => {
    const {scale} = picture;
    const x = event.clientX - svg.getBoundingClientRect().left;
    const share = (x - scale.box.left) / (scale.box.right - scale.box.left);
    read(nearest(points, scale.first + share * scale.span));
  });
  svg.addEventListener('keydown', (event) => {
    const steps = {ArrowLeft: -1, ArrowRight: 1, Home: -points.length, End: points.length};
    if (!(event.key in steps)) return;
    event.preventDefault();
    read(index + steps[event.key]);
  });
  figure.draw = () => whenWidthChanges(svg, () => {
    picture = drawChart(svg, points, now === undefined ? 0 : now.low_bytes);
  });
  return figure;
}

function showSpace(data) {
  const mounted = data.volumes.map((volume) => volume.volume);
  const past = data.entries.map((entry) => entry.volume).filter((volume) => volume !== undefined);
  const volumes = [...new Set([...mounted, ...past])];
  const hasPast = (volume) => pointsOf(volume, data).length > 1;
  const figures = volumes.filter(hasPast).map((volume) => chartOf(volume, data));
  const others = volumes.filter((volume) => !hasPast(volume));
  place('space').append(...figures);
  if (others.length > 0) {
    place('space').append(element(
      'p', {class: 'muted'}, 'Nothing but the present was measured on ',
      ...others.flatMap((volume, index) => (index === 0 ? [nameOf(volume)] : [', ', nameOf(volume)])), '.'));
  }
  if (volumes.length === 0) place('space').append(element('p', {}, 'There is nothing to draw yet.'));
  for (const figure of figures) figure.draw();
}
