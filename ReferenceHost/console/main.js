// The operator console: search, the live alarm list, state and note changes, history, mutes
// and export, all through /api/v1 of the server that serves this page.

import * as api from './api.js';
import { AlarmTable, STATE_LABELS, displayTime } from './alarmtable.js';
import { download } from './exportfile.js';
import { LiveEvents } from './live.js';

const $ = (id) => document.getElementById(id);

// Live changes of more alarms than this fetch no notes; their state still changes at once.
const MAX_NOTE_REFRESHES = 20;
// An export stops after this many alarms rather than exhaust the browser's memory.
const MAX_EXPORT_ALARMS = 200000;

let search = null; // { body, unhandled } of the list shown
let nextBody = null; // the body that fetches the next older page, when the cap cut the list
let historyOf = null; // the alarm whose history is open, and the button that opened it

const table = new AlarmTable($('alarms').tBodies[0], $('select-all'), {
  onSelection: (count) => {
    $('selection-count').textContent = `${count} selected`;
  },
  onHistory: (id, button) => openHistory(id, button),
});

const live = new LiveEvents({
  onLive: (wasAway) => {
    $('away-notice').hidden = true;
    setLiveStatus('Live', 'live on');
    // Changes made while the connection was away reached no one: read the list again.
    if (wasAway && search) runSearch(search).catch(showError);
  },
  onAway: (text) => {
    const notice = $('away-notice');
    notice.textContent = text;
    notice.hidden = false;
    setLiveStatus('Reconnecting\u2026', 'live away');
  },
  onStopped: (text, code) => {
    setLiveStatus('Not live', 'live off');
    if (code === 4401) signedOut('Your access token is no longer accepted: sign in again.');
    else showError(text);
  },
  onUpdated: (results) => liveChanges(results),
});

function setLiveStatus(text, className) {
  const status = $('live-status');
  status.textContent = text;
  status.className = className;
}

function showError(error) {
  if (error instanceof api.ApiError && error.status === 401) {
    signedOut(error.message);
    return;
  }
  const message = $('message');
  message.textContent = error instanceof Error ? error.message : String(error);
  message.hidden = false;
}

function clearError() {
  $('message').hidden = true;
  $('message').textContent = '';
}

// Runs a button's action once at a time and shows its failure in words. The button stays
// enabled (marked busy), so that it keeps the keyboard focus.
async function busy(button, action) {
  if (button.getAttribute('aria-busy') === 'true') return;
  button.setAttribute('aria-busy', 'true');
  clearError();
  try {
    await action();
  } catch (error) {
    showError(error);
  } finally {
    button.removeAttribute('aria-busy');
  }
}

// --- signing in ---

async function start() {
  try {
    const who = await api.me();
    signedIn(who.user);
  } catch (error) {
    if (error.status === 401) signedOut(api.storedToken() ? error.message : '');
    else showStartFailure(error);
  }
}

function showStartFailure(error) {
  const notice = $('away-notice');
  notice.textContent = `${error.message} Reload the page to try again.`;
  notice.hidden = false;
}

function signedIn(user) {
  $('operator').textContent = `Operator: ${user}`;
  $('sign-out').hidden = !api.storedToken();
  $('sign-in').hidden = true;
  $('console').hidden = false;
  live.start();
  runSearch(readFilters()).catch(showError);
}

function signedOut(problem) {
  live.stop();
  api.storeToken('');
  table.clear();
  setLiveStatus('Not connected', 'live off');
  $('operator').textContent = '';
  $('sign-out').hidden = true;
  $('console').hidden = true;
  $('sign-in').hidden = false;
  $('sign-in-error').textContent = problem || '';
  $('token').focus();
}

$('sign-in').addEventListener('submit', async (event) => {
  event.preventDefault();
  const field = $('token');
  api.storeToken(field.value.trim());
  field.value = '';
  $('sign-in-error').textContent = '';
  try {
    const who = await api.me();
    signedIn(who.user);
  } catch (error) {
    api.storeToken('');
    $('sign-in-error').textContent =
      error.status === 401 ? 'The server does not know this access token.' : error.message;
  }
});

$('sign-out').addEventListener('click', () => signedOut(''));

// --- searching ---

function readFilters() {
  const unhandled = document.querySelector('input[name="scope"]:checked').value === 'unhandled';
  const body = {};
  const text = (id) => $(id).value.trim();
  if (text('f-group')) body.eventGroups = [text('f-group')];
  if (text('f-event')) body.events = [text('f-event')];
  if (text('f-device')) body.devices = [text('f-device')];
  if (text('f-name')) body.names = [text('f-name')];
  if (text('f-from')) body.from = text('f-from');
  if (text('f-to')) body.to = text('f-to');
  if (!unhandled) {
    const states = [...$('f-states').querySelectorAll('input:checked')].map((box) => box.value);
    if (states.length) body.states = states;
  }
  return { body, unhandled };
}

function showPage(answer) {
  table.append(Array.isArray(answer.alarms) ? answer.alarms : []);
  nextBody = answer.truncated && answer.next ? answer.next : null;
  $('cap-notice').hidden = !nextBody;
  if (nextBody)
    $('cap-text').textContent =
      `The server's limit per search cut this list: the ${table.size} newest alarms are ` +
      'listed, older ones are left out.';
  const kind = search.unhandled ? 'unhandled alarms' : 'alarms';
  $('list-caption').textContent = `${table.size} ${kind}, newest first`;
}

let searchesStarted = 0;

// A search replaces the list; reading the same search again keeps the alarms selected. Only
// the answer of the search started last is shown.
async function runSearch(query) {
  const started = ++searchesStarted;
  const answer = await api.search(query.body, query.unhandled);
  if (started !== searchesStarted) return;
  const keep = query === search ? table.selectedIds() : [];
  search = query;
  table.clear();
  showPage(answer);
  table.select(keep);
}

$('filters').addEventListener('submit', (event) => {
  event.preventDefault();
  busy($('search'), () => runSearch(readFilters()));
});

for (const radio of document.querySelectorAll('input[name="scope"]'))
  radio.addEventListener('change', () => {
    $('f-states').disabled = radio.value === 'unhandled' && radio.checked;
  });

$('load-older').addEventListener('click', () =>
  busy($('load-older'), async () => {
    if (!nextBody) return;
    const started = searchesStarted;
    const answer = await api.search(nextBody, search.unhandled);
    if (started === searchesStarted) showPage(answer);
  }));

// --- changing alarms ---

function selectedOrSay(what) {
  const ids = table.selectedIds();
  if (!ids.length) showError(`Select at least one alarm to ${what}.`);
  return ids;
}

function showOutcome(lines) {
  const list = $('outcome');
  list.replaceChildren(
    ...lines.map(([text, failed]) => {
      const item = document.createElement('li');
      item.textContent = text;
      if (failed) item.className = 'failed';
      return item;
    }));
}

function outcomeText(result) {
  if (result.updateResult === 0)
    return [`${result.alarmId}: now ${STATE_LABELS[result.alarmStatus] || result.alarmStatus}`,
            false];
  if (result.updateResult === 1) return [`${result.alarmId}: not found on the server`, true];
  return [`${result.alarmId}: not changed (result ${result.updateResult})`, true];
}

$('apply').addEventListener('click', () =>
  busy($('apply'), async () => {
    const ids = selectedOrSay('change');
    if (!ids.length) return;
    const state = $('a-state').value;
    const note = $('a-note').value;
    const lines = [];
    for (const piece of api.chunks(ids)) {
      let answer;
      try {
        answer = await api.update(piece, state, note);
      } catch (error) {
        if (error.status === 401) throw error;
        for (const id of piece) lines.push([`${id}: not changed: ${error.message}`, true]);
        continue;
      }
      const results = Array.isArray(answer.results) ? answer.results : [];
      const answered = new Set();
      for (const result of results) {
        answered.add(result.alarmId);
        lines.push(outcomeText(result));
        if (result.updateResult === 0) {
          table.markChanged(result.alarmId, result.alarmStatus);
          table.setNote(result.alarmId, note);
        }
      }
      for (const id of piece)
        if (!answered.has(id)) lines.push([`${id}: the server reported no outcome`, true]);
    }
    showOutcome(lines);
  }));

async function sendMute(isMute) {
  const ids = selectedOrSay(isMute ? 'mute' : 'unmute');
  if (!ids.length) return;
  const seconds = Number($('mute-seconds').value);
  for (const piece of api.chunks(ids)) {
    await (isMute ? api.mute(piece, seconds) : api.unmute(piece));
    const until = isMute ? new Date(Date.now() + seconds * 1000).toISOString() : null;
    for (const id of piece) table.setMute(id, until ? until.replace(/\.\d+Z$/, 'Z') : null);
  }
  const what = isMute ? `Mute for ${$('mute-seconds').selectedOptions[0].text}` : 'Unmute';
  showOutcome([[`${what} sent for ${ids.length} alarm(s); the server does not confirm mutes.`,
                false]]);
}

$('mute').addEventListener('click', () => busy($('mute'), () => sendMute(true)));
$('unmute').addEventListener('click', () => busy($('unmute'), () => sendMute(false)));

// --- live changes from any operator ---

async function liveChanges(results) {
  const changed = [];
  for (const result of results) {
    if (!result || result.updateResult !== 0 || !table.has(result.alarmId)) continue;
    table.markChanged(result.alarmId, result.alarmStatus);
    changed.push(result.alarmId);
  }
  if (historyOf && changed.includes(historyOf.id)) loadHistory(historyOf.id).catch(showError);
  // The event names the new state only; the note comes from the alarm's last history entry.
  for (const id of changed.slice(0, MAX_NOTE_REFRESHES)) {
    try {
      const entries = (await api.history(id)).entries;
      if (Array.isArray(entries) && entries.length)
        table.setNote(id, entries[entries.length - 1].Note ?? '');
    } catch (error) {
      showError(error);
      return;
    }
  }
}

// --- history panel ---

async function loadHistory(id) {
  const message = $('history-message');
  message.textContent = 'Loading\u2026';
  const answer = await api.history(id).catch((error) => {
    message.textContent = error.message;
    throw error;
  });
  if (!historyOf || historyOf.id !== id) return;
  const rows = (Array.isArray(answer.entries) ? answer.entries : []).map((entry) => {
    const tr = document.createElement('tr');
    // Date and time on lines of their own, to keep the panel narrow.
    const when = document.createElement('td');
    for (const part of displayTime(entry.Time).split(' ')) {
      const span = document.createElement('span');
      span.textContent = part;
      when.append(span);
    }
    tr.append(when);
    for (const text of [STATE_LABELS[entry.State] || entry.State, entry.Note, entry.User]) {
      const td = document.createElement('td');
      td.textContent = text === null || text === undefined ? '' : String(text);
      tr.append(td);
    }
    return tr;
  });
  $('history-entries').tBodies[0].replaceChildren(...rows);
  message.textContent = rows.length ? `${rows.length} change(s), oldest first` : 'No changes yet.';
}

function openHistory(id, button) {
  historyOf = { id, button };
  $('history-title').textContent = `History of ${id}`;
  $('history-entries').tBodies[0].replaceChildren();
  $('history').hidden = false;
  $('history-title').focus();
  loadHistory(id).catch(showError);
}

function closeHistory() {
  if (!historyOf) return;
  const { button } = historyOf;
  historyOf = null;
  $('history').hidden = true;
  if (button.isConnected) button.focus();
}

$('history-close').addEventListener('click', closeHistory);
document.addEventListener('keydown', (event) => {
  if (event.key === 'Escape' && historyOf) closeHistory();
});

// --- export ---

$('export').addEventListener('click', () =>
  busy($('export'), async () => {
    if (!search) return;
    const format = $('export-format').value;
    const alarms = [];
    let body = search.body;
    while (body) {
      showOutcome([[`Exporting\u2026 ${alarms.length} alarms so far`, false]]);
      const answer = await api.search(body, search.unhandled);
      alarms.push(...(Array.isArray(answer.alarms) ? answer.alarms : []));
      body = answer.truncated && answer.next ? answer.next : null;
      if (body && alarms.length >= MAX_EXPORT_ALARMS) {
        showError(`The export stopped at ${alarms.length} alarms; narrow the time range.`);
        break;
      }
    }
    download(alarms, format);
    showOutcome([[`Exported ${alarms.length} alarms as ${format.toUpperCase()}.`, false]]);
  }));

start();
