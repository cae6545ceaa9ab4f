// The alarm list: one row per alarm, newest first, with a check box to select it and a button
// for its history. Every text from the server goes in as text, never as markup.

export const STATE_LABELS = {
  Unhandled: 'Unhandled',
  Processing: 'Processing',
  Handled: 'Handled',
  FalseAlarm: 'False alarm',
};

export function displayTime(iso) {
  return iso ? String(iso).replace('T', ' ').replace(/Z$/, '') : '';
}

function cell(text, className) {
  const td = document.createElement('td');
  td.textContent = text === null || text === undefined ? '' : String(text);
  if (className) td.className = className;
  return td;
}

function eventText(alarm) {
  return alarm.SubEvent ? `${alarm.EventClass}: ${alarm.SubEvent}` : alarm.EventClass;
}

export class AlarmTable {
  // onSelection(count), onHistory(alarmId, button)
  constructor(tbody, selectAll, { onSelection, onHistory }) {
    this.tbody = tbody;
    this.selectAll = selectAll;
    this.onSelection = onSelection;
    this.onHistory = onHistory;
    this.rows = new Map();
    selectAll.addEventListener('change', () => {
      for (const row of this.rows.values()) row.checkbox.checked = selectAll.checked;
      this.selectionChanged();
    });
  }

  get size() {
    return this.rows.size;
  }

  clear() {
    this.rows.clear();
    this.tbody.replaceChildren();
    this.selectAll.checked = false;
    this.selectionChanged();
  }

  // Adds the alarms below the rows already listed (older pages come last); repeats are skipped.
  append(alarms) {
    const fragment = document.createDocumentFragment();
    for (const alarm of alarms) {
      if (!alarm || typeof alarm.AlarmID !== 'string' || this.rows.has(alarm.AlarmID)) continue;
      fragment.append(this.createRow(alarm));
    }
    this.tbody.append(fragment);
  }

  createRow(alarm) {
    const id = alarm.AlarmID;
    const tr = document.createElement('tr');
    tr.dataset.id = id;

    const select = document.createElement('td');
    const checkbox = document.createElement('input');
    checkbox.type = 'checkbox';
    checkbox.setAttribute('aria-label', `Select alarm ${id}`);
    checkbox.addEventListener('change', () => this.selectionChanged());
    select.append(checkbox);

    const stateCell = cell('', 'state');
    const noteCell = cell(alarm.Note, 'note');
    const muteCell = cell('', 'muted');

    const historyCell = document.createElement('td');
    const historyButton = document.createElement('button');
    historyButton.type = 'button';
    historyButton.textContent = 'History';
    historyButton.setAttribute('aria-label', `History of alarm ${id}`);
    historyButton.addEventListener('click', () => this.onHistory(id, historyButton));
    historyCell.append(historyButton);

    // The state comes early, so that a history panel over the right of the list leaves it seen.
    tr.append(select, cell(displayTime(alarm.ServerTime), 'time'), stateCell, cell(id, 'id'),
              cell(alarm.AlarmName, 'name'), cell(alarm.DeviceName, 'device'),
              cell(eventText(alarm), 'event'), noteCell, muteCell, historyCell);
    const row = { alarm: { ...alarm }, tr, checkbox, stateCell, noteCell, muteCell };
    this.rows.set(id, row);
    this.showState(row);
    this.showMute(row);
    return tr;
  }

  showState(row) {
    const state = String(row.alarm.State || '');
    const badge = document.createElement('span');
    badge.className = `badge state-${state.toLowerCase().replace(/[^a-z]/g, '')}`;
    badge.textContent = STATE_LABELS[state] || state;
    row.stateCell.replaceChildren(badge);
    if (row.mark) row.stateCell.append(' ', row.mark);
  }

  showMute(row) {
    const muted = row.alarm.Muted === true && row.alarm.MuteUntil;
    row.muteCell.textContent = muted ? displayTime(row.alarm.MuteUntil) : '';
  }

  selectedIds() {
    const ids = [];
    for (const [id, row] of this.rows) if (row.checkbox.checked) ids.push(id);
    return ids;
  }

  select(ids) {
    for (const id of ids) {
      const row = this.rows.get(id);
      if (row) row.checkbox.checked = true;
    }
    this.selectionChanged();
  }

  selectionChanged() {
    const count = this.selectedIds().length;
    this.selectAll.checked = count > 0 && count === this.rows.size;
    this.selectAll.indeterminate = count > 0 && count < this.rows.size;
    this.onSelection(count);
  }

  alarms() {
    return [...this.rows.values()].map((row) => row.alarm);
  }

  has(id) {
    return this.rows.has(id);
  }

  // A change that reached this console: the new state, and a mark that says when it came.
  markChanged(id, state) {
    const row = this.rows.get(id);
    if (!row) return;
    row.alarm.State = state;
    row.mark = document.createElement('mark');
    row.mark.className = 'change';
    row.mark.textContent = `changed ${new Date().toLocaleTimeString()}`;
    row.tr.classList.add('changed');
    this.showState(row);
  }

  setNote(id, note) {
    const row = this.rows.get(id);
    if (!row) return;
    row.alarm.Note = note;
    row.noteCell.textContent = note;
  }

  setMute(id, until) {
    const row = this.rows.get(id);
    if (!row) return;
    row.alarm.Muted = until !== null;
    row.alarm.MuteUntil = until;
    this.showMute(row);
  }
}
