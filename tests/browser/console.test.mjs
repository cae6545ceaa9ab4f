// The operator console in Debian's Chromium against a real `alarmsearch serve`.

import assert from 'node:assert/strict';
import { readFileSync, rmSync, writeFileSync } from 'node:fs';
import { join } from 'node:path';
import { test } from 'node:test';

import { launchBrowser, rowIds, scratch, screenshots, signIn, startServe, watchErrors }
  from './support.mjs';

const ALICE = 'alice-token-0123456789';
const BOB = 'bob-token-0123456789abc';
// Until a token is given, the API answers the page's first question with 401.
const signInRefusal = (text) => /status of 401/.test(text);

// Every visible control has a name, and Tab reaches each of them (of a radio group, the checked
// button: the arrow keys move within the group).
async function checkKeyboardAndLabels(page) {
  const controls = await page.evaluate(() => {
    const visible = (el) => el.getClientRects().length > 0 && !el.closest('[hidden]');
    const named = (el) => {
      const labelled = el.labels && [...el.labels].some((l) => l.textContent.trim());
      return Boolean(labelled || el.getAttribute('aria-label') ||
                     (el.tagName === 'BUTTON' && el.textContent.trim()));
    };
    let n = 0;
    return [...document.querySelectorAll('button, input, select, textarea, a[href]')]
      .filter((el) => visible(el) && !el.disabled && !(el.type === 'radio' && !el.checked))
      .map((el) => {
        el.dataset.probe = String(n++);
        return { probe: el.dataset.probe, id: el.id || el.getAttribute('aria-label') || el.textContent,
                 named: named(el) };
      });
  });
  assert.deepEqual(controls.filter((c) => !c.named), [], 'controls without a label');

  await page.evaluate(() => document.activeElement && document.activeElement.blur());
  const reached = new Set();
  for (let i = 0; i < controls.length + 5; ++i) {
    await page.keyboard.press('Tab');
    reached.add(await page.evaluate(() => document.activeElement.dataset.probe));
  }
  assert.deepEqual(controls.filter((c) => !reached.has(c.probe)).map((c) => c.id), [],
                   'controls Tab does not reach');
}

test('two operators handle alarms in their consoles', async () => {
  const dir = scratch();
  const users = join(dir, 'users.json');
  writeFileSync(users, JSON.stringify({ users: [{ name: 'alice', token: ALICE },
                                                { name: 'bob', token: BOB }] }));
  const serve = await startServe({ users });
  const browser = await launchBrowser();
  try {
    const first = await browser.newPage();
    const second = await browser.newPage();
    const firstErrors = watchErrors(first, signInRefusal);
    const secondErrors = watchErrors(second, signInRefusal);
    const urls = [];
    browser.on('request', (request) => urls.push(request.url()));
    await signIn(first, serve.url, ALICE);
    await signIn(second, serve.url, BOB);
    assert.equal(await first.locator('#operator').textContent(), 'Operator: alice');

    // Filter: all unhandled motion alarms (the handled ones then drop out of the export below).
    await first.getByLabel('All', { exact: true }).check();
    await first.locator('#f-states').getByLabel('Unhandled').check();
    await first.getByLabel('Name contains').fill('Motion');
    await first.getByLabel('Name contains').press('Enter');
    await first.waitForFunction(() => /^\d+ alarms/.test(document.querySelector('caption').textContent));
    const listed = (await rowIds(first)).length;
    const names = await first.locator('#alarms tbody td.name').allTextContents();
    const states = await first.locator('#alarms tbody td.state').allTextContents();
    assert.ok(names.every((n) => n.includes('Motion')) && states.every((s) => s === 'Unhandled'));
    await checkKeyboardAndLabels(first);

    // Two alarms changed in the first console change in the second.
    const inSecond = new Set(await rowIds(second));
    const [a, b, c] = (await rowIds(first)).filter((id) => inSecond.has(id));
    assert.ok(c, 'three alarms in both lists');
    for (const id of [a, b]) await first.getByLabel(`Select alarm ${id}`).check();
    await first.getByLabel('New state').selectOption('Handled');
    await first.getByLabel('Note', { exact: true }).fill('Checked on site <b>ok</b>');
    await first.getByRole('button', { name: 'Set state and note' }).click();
    await first.locator('#outcome li').nth(1).waitFor();
    assert.deepEqual(await first.locator('#outcome li').allTextContents(),
                     [`${a}: now Handled`, `${b}: now Handled`]);
    await second.waitForFunction((ids) => ids.every((id) => {
      const tr = document.querySelector(`tr[data-id="${id}"]`);
      return tr.classList.contains('changed') && tr.querySelector('.state .badge').textContent === 'Handled';
    }), [a, b], { timeout: 1000 });
    await second.waitForFunction((id) => document.querySelector(`tr[data-id="${id}"] td.note`)
      .textContent === 'Checked on site <b>ok</b>', a);

    // The history, opened with the keyboard, names the operator who made the change.
    await second.getByLabel(`History of alarm ${a}`).focus();
    await second.keyboard.press('Enter');
    const last = second.locator('#history-entries tbody tr').last();
    await last.waitFor();
    const entry = await last.locator('td').allTextContents();
    assert.deepEqual(entry.slice(1), ['Handled', 'Checked on site <b>ok</b>', 'alice']);
    await second.locator(`tr[data-id="${a}"]`).scrollIntoViewIfNeeded();
    await second.screenshot({ path: join(screenshots, 'console.png') });
    await second.keyboard.press('Escape');
    assert.ok(await second.locator('#history').isHidden());
    assert.equal(await second.evaluate(() => document.activeElement.getAttribute('aria-label')),
                 `History of alarm ${a}`);

    // Muted from the first console; the second reads it back from the server.
    for (const id of [a, b]) await first.getByLabel(`Select alarm ${id}`).uncheck();
    await first.getByLabel(`Select alarm ${c}`).check();
    await first.getByRole('button', { name: 'Mute', exact: true }).click();
    await first.locator('#outcome li', { hasText: 'Mute for 1 hour sent for 1 alarm' }).waitFor();
    await second.waitForFunction(async (id) => {
      document.getElementById('search').click();
      await new Promise((resolve) => setTimeout(resolve, 200));
      return document.querySelector(`tr[data-id="${id}"] td.muted`)?.textContent !== '';
    }, c, { polling: 300, timeout: 5000 });

    // The current search as a CSV download: a header and one line per listed alarm.
    const [download] = await Promise.all([
      first.waitForEvent('download'),
      first.getByRole('button', { name: 'Export search' }).click(),
    ]);
    assert.match(download.suggestedFilename(), /^alarms-\d{8}T\d{6}Z\.csv$/);
    await download.saveAs(join(screenshots, 'export.csv'));
    const lines = readFileSync(join(screenshots, 'export.csv'), 'utf8').trimEnd().split('\r\n');
    assert.equal(lines[0], 'AlarmID,ServerTime,State,EventClass,SubEventType,SubEvent,AlarmName,' +
                           'DeviceName,Note,Muted,MuteUntil');
    // The two handled alarms no longer match the search.
    const exported = lines.slice(1).map((line) => line.split(',')[0]);
    assert.equal(exported.length, listed - 2);
    assert.ok(!exported.includes(a) && !exported.includes(b) && exported.includes(c));

    assert.deepEqual(firstErrors, []);
    assert.deepEqual(secondErrors, []);
    assert.deepEqual(urls.filter((url) => url.includes(ALICE) || url.includes(BOB)), []);
  } finally {
    await browser.close();
    await serve.stop();
    rmSync(dir, { recursive: true, force: true });
  }
});

test('a console reconnects by itself when serve comes back', async () => {
  let serve = await startServe();
  const browser = await launchBrowser();
  try {
    const page = await browser.newPage();
    let away = false;
    // Expected: the refused search below, and the failed connections while serve is away.
    const errors = watchErrors(page, (text) => /status of 400/.test(text) ||
                               (away && /ERR_CONNECTION_REFUSED|WebSocket connection/.test(text)));
    const response = await page.goto(`${serve.url}/`);
    assert.match(response.headers()['content-security-policy'], /script-src 'self';/);
    await page.locator('#live-status.on').waitFor();
    assert.equal(await page.locator('#operator').textContent(), 'Operator: local');

    // A search the server refuses is explained on the page.
    await page.getByLabel('From').fill('yesterday');
    await page.getByLabel('From').press('Enter');
    await page.locator('#message').waitFor();
    assert.match(await page.locator('#message').textContent(), /^bad request \(from\): \S/);
    await page.getByLabel('From').fill('');

    away = true;
    const { port } = serve;
    assert.equal(await serve.stop(), 0, 'serve stops cleanly with a console connected');
    await page.locator('#away-notice').waitFor();
    assert.match(await page.locator('#away-notice').textContent(),
                 /^Live updates lost since .*: reconnecting \(attempt \d+\)/);

    const reread = page.waitForResponse((r) => r.url().endsWith('/api/v1/alarms/unhandled'));
    serve = await startServe({ port });
    await page.locator('#away-notice').waitFor({ state: 'hidden', timeout: 10000 });
    await reread;
    away = false;
    assert.equal(await page.locator('#live-status').textContent(), 'Live');

    assert.deepEqual(errors, []);
  } finally {
    await browser.close();
    await serve.stop();
  }
});
