// Export of a search as a CSV or JSON file, built in the page and handed to the browser as a
// download.

export const COLUMNS = [
  'AlarmID', 'ServerTime', 'State', 'EventClass', 'SubEventType', 'SubEvent',
  'AlarmName', 'DeviceName', 'Note', 'Muted', 'MuteUntil',
];

// A cell that a spreadsheet would read as a formula starts with a quote instead.
function csvCell(value) {
  let text = value === null || value === undefined ? '' : String(value);
  if (/^[=+\-@\t\r]/.test(text)) text = `'${text}`;
  return /[",\r\n]/.test(text) ? `"${text.replace(/"/g, '""')}"` : text;
}

export function toCsv(alarms) {
  const lines = [COLUMNS.join(',')];
  for (const alarm of alarms) lines.push(COLUMNS.map((c) => csvCell(alarm[c])).join(','));
  return `${lines.join('\r\n')}\r\n`;
}

export function toJson(alarms) {
  return `${JSON.stringify({ alarms }, null, 2)}\n`;
}

export function download(alarms, format) {
  const csv = format === 'csv';
  const blob = new Blob([csv ? toCsv(alarms) : toJson(alarms)], {
    type: csv ? 'text/csv;charset=utf-8' : 'application/json',
  });
  const stamp = new Date().toISOString().replace(/[-:]/g, '').replace(/\..*/, 'Z');
  const link = document.createElement('a');
  link.href = URL.createObjectURL(blob);
  link.download = `alarms-${stamp}.${csv ? 'csv' : 'json'}`;
  document.body.append(link);
  link.click();
  link.remove();
  setTimeout(() => URL.revokeObjectURL(link.href), 10000);
}
