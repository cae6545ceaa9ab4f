// The operator console in Debian's Chromium against a real `alarmsearch serve`.

import assert from 'node:assert/strict';
import { readFileSync } from 'node:fs';
import { join } from 'node:path';
import { test } from 'node:test';

import { launchBrowser, rowIds, screenshots, signIn, startServe, watchErrors }
  from './support.mjs';

const [ALICE, BOB] = ['alice-token-0123456789', 'bob-token-0123456789abc'];
const USERS = [{ name: 'alice', token: ALICE }, { name: 'bob', token: BOB }];
const NOTE = 'Checked on site <b>ok</b>';

// Every visible control has a name, and Tab reaches each of them (of a radio group, the checked
// button: the arrow keys move within the group).
async function checkKeyboardAndLabels(page) {
  const controls = await page.evaluate(() =>
    [...document.querySelectorAll('button, input, select, textarea, a[href]')]
      .filter((el) => el.getClientRects().length > 0 && !el.closest('[hidden]') && !el.disabled &&
                      !(el.type === 'radio' && !el.checked))
      .map((el, n) => {
        el.dataset.probe = n;
        return el.getAttribute('aria-label') || [...(el.labels || [])].map((l) => l.textContent)
          .join('').trim() || (el.tagName === 'BUTTON' && el.textContent.trim()) ||
          `unnamed: ${el.outerHTML}`;
      }));
  assert.deepEqual(controls.filter((name) => name.startsWith('unnamed: ')), [], 'no label');
  await page.evaluate(() => document.activeElement?.blur());
  const reached = new Set();
  for (let i = 0; i < controls.length + 5; ++i) {
    await page.keyboard.press('Tab');
    reached.add(Number(await page.evaluate(() => document.activeElement.dataset.probe)));
  }
  assert.deepEqual(controls.filter((name, n) => !reached.has(n)), [], 'Tab does not reach');
}

test('two operators handle alarms; their consoles reconnect after serve restarts', async () => {
  let serve = await startServe({ users: USERS });
  const browser = await launchBrowser();
  let away = false;
  // Expected: 401 until a token is given, the refused search, refusals while serve is away.
  const errors = watchErrors(browser, (text) => /status of (401|400)/.test(text) ||
    (away && /ERR_CONNECTION_REFUSED|WebSocket connection/.test(text)), [ALICE, BOB]);
  try {
    const [first, second] = [await browser.newPage(), await browser.newPage()];
    const page = await signIn(first, serve.url, ALICE);
    assert.match(page.headers()['content-security-policy'], /script-src 'self';/);
    await signIn(second, serve.url, BOB);
    assert.equal(await first.locator('#operator').textContent(), 'Operator: alice');

    // Filter: all unhandled motion alarms (the export below checks what it matched).
    await first.getByLabel('All', { exact: true }).check();
    await first.locator('#f-states').getByLabel('Unhandled').check();
    await first.getByLabel('Name contains').fill('Motion');
    await first.keyboard.press('Enter');
    await first.locator('caption', { hasText: /^\d+ alarms/ }).waitFor();
    const listed = await rowIds(first);
    assert.ok((await first.locator('td.name').allTextContents()).every((n) => n.includes('Motion')));
    await checkKeyboardAndLabels(first);

    // Two alarms changed in the first console show in the second, marked, within 1 s.
    const inSecond = new Set(await rowIds(second));
    const [a, b, c] = listed.filter((id) => inSecond.has(id));
    for (const id of [a, b]) await first.getByLabel(`Select alarm ${id}`).check();
    await first.getByLabel('New state').selectOption('Handled');
    await first.getByLabel('Note', { exact: true }).fill(NOTE);
    await first.getByRole('button', { name: 'Set state and note' }).click();
    await first.locator('#outcome', { hasText: new RegExp(`^${a}: now Handled${b}: now Handled$`) })
      .waitFor();
    await second.waitForFunction((ids) => ids.every((id) => document.querySelector(
      `tr.changed[data-id="${id}"] .state:has(mark.change)`)?.textContent.startsWith('Handled changed')),
    [a, b], { timeout: 1000 });
    await second.waitForFunction(([id, note]) => document.querySelector(
      `tr[data-id="${id}"] td.note`).textContent === note, [a, NOTE]);

    // The history, opened with the keyboard, names the operator; Escape gives the focus back.
    await second.getByLabel(`History of alarm ${a}`).press('Enter');
    const last = second.locator('#history-entries tbody tr').last();
    await last.waitFor();
    assert.deepEqual((await last.locator('td').allTextContents()).slice(1), ['Handled', NOTE, 'alice']);
    await second.screenshot({ path: join(screenshots, 'console.png') });
    await second.keyboard.press('Escape');
    assert.ok(await second.locator('#history').isHidden());
    assert.equal(await second.locator(':focus').getAttribute('aria-label'), `History of alarm ${a}`);

    // Muted from the first console; the export below reads it back from the server.
    for (const id of [a, b, c]) await first.getByLabel(`Select alarm ${id}`).setChecked(id === c);
    await first.getByRole('button', { name: 'Mute', exact: true }).click();
    await first.locator('#outcome li', { hasText: 'Mute for 1 hour sent for 1 alarm' }).waitFor();
    assert.notEqual(await first.locator(`tr[data-id="${c}"] td.muted`).textContent(), '');

    // The current search as a CSV download: the handled two no longer match it.
    const [download] = await Promise.all([first.waitForEvent('download'),
      first.getByRole('button', { name: 'Export search' }).click()]);
    assert.match(download.suggestedFilename(), /^alarms-\d{8}T\d{6}Z\.csv$/);
    await download.saveAs(join(screenshots, 'export.csv'));
    const [header, ...lines] = readFileSync(await download.path(), 'utf8').trimEnd().split('\r\n');
    assert.equal(header, 'AlarmID,ServerTime,State,EventClass,SubEventType,SubEvent,AlarmName,' +
                         'DeviceName,Note,Muted,MuteUntil');
    assert.deepEqual(lines.map((line) => line.split(',')[0]),
                     listed.filter((id) => id !== a && id !== b));
    assert.ok(lines.every((line) => /^A\d+,[^,]+,Unhandled,.*Motion/.test(line)));
    assert.match(lines.find((line) => line.startsWith(`${c},`)), /,true,\d{4}-\d\d-\d\dT/);

    // A search the server refuses is explained on the page.
    await second.getByLabel('From').fill('yesterday');
    await second.keyboard.press('Enter');
    await second.locator('#message', { hasText: /^bad request \(from\): \S/ }).waitFor();

    // Serve goes away and comes back: the console says so, reads its list again, and stays
    // signed in across a reload.
    away = true;
    assert.equal(await serve.stop(), 0, 'serve stops cleanly with consoles connected');
    const notice = /^Live updates lost since .*: reconnecting \(attempt \d+\)/;
    await second.locator('#away-notice', { hasText: notice }).waitFor();
    const reread = second.waitForResponse((r) => r.url().endsWith('/api/v1/alarms/unhandled'));
    serve = await startServe({ port: serve.port, users: USERS });
    await second.locator('#away-notice').waitFor({ state: 'hidden', timeout: 10000 });
    await reread;
    away = false;
    assert.equal(await second.locator('#live-status').textContent(), 'Live');
    await second.reload();
    await second.locator('#live-status.on').waitFor();
    assert.deepEqual(errors, []);
  } finally {
    await browser.close();
    await serve.stop();
  }
});
