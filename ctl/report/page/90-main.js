// The page from its data, from top to bottom.

function showAbout(data) {
  const parts = ['Made ', momentText(data.made)];
  if (data.host !== '') parts.push(' on ', nameOf(data.host));
  if (data.volume !== undefined) parts.push(', only the volume ', nameOf(data.volume));
  if (data.since !== undefined) parts.push(`, entries since ${momentText(data.since)}`);
  place('about').append(...parts, '.');
}

function showNotices(data) {
  const texts = [];
  if (data.history_problem !== undefined) texts.push(`What was freed is not known: ${data.history_problem}.`);
  if (data.offers_problem !== undefined) texts.push(`What could be freed now is not known: ${data.offers_problem}.`);
  if (data.older_left_out) texts.push('There are more entries than this page can show; the oldest are left out.');
  if (data.volumes.some((volume) => volume.offers.somebody_was_late)) {
    texts.push('Some services took longer to answer than the daemon waits; what they could free is missing.');
  }
  place('notices').append(...texts.map((text) => element('p', {class: 'notice'}, shown(text))));
}

const data = JSON.parse(place('data').textContent);
const purges = data.entries.filter(isPurge);
showAbout(data);
showNotices(data);
showSummary(data, purges);
showVolumes(data);
showOffers(data);
if (data.history_problem !== undefined && data.entries.length === 0) {
  for (const id of ['space', 'freed', 'short', 'table']) place(id).append(unknown());
} else {
  showSpace(data);
  showFreed(data);
  showShort(data, purges);
  showTable(data);
}
document.documentElement.dataset.drawn = String(Math.round(performance.now()));
