// What the console's browser tests share: a real `alarmsearch serve` on a loopback port and
// Debian's Chromium driven by playwright-core.

import { spawn } from 'node:child_process';
import { mkdtempSync, mkdirSync, rmSync, writeFileSync } from 'node:fs';
import { tmpdir } from 'node:os';
import { join } from 'node:path';
import { chromium } from 'playwright-core';

const alarmsearch = process.env.ALARMSEARCH_BIN;
if (!alarmsearch) throw new Error('set ALARMSEARCH_BIN to the alarmsearch executable (CTest does)');
export const screenshots = process.env.ALARMSEARCH_SCREENSHOTS || join(tmpdir(), 'console-shots');
mkdirSync(screenshots, { recursive: true });

const scratch = () => mkdtempSync(join(tmpdir(), 'console-test-'));

// Starts serve (in-memory simulator; `users`: [{name, token}]); resolves once it prints its URL.
export function startServe({ port = 0, users = null } = {}) {
  const args = ['serve', '--memory', '--seed-count', '200', '--listen', `127.0.0.1:${port}`];
  if (users) args.push('--users', join(scratch(), 'users.json'));
  if (users) writeFileSync(args.at(-1), JSON.stringify({ users }));
  const child = spawn(alarmsearch, args, { stdio: ['ignore', 'pipe', 'inherit'] });
  const stopped = new Promise((done) => child.on('exit', done));
  return new Promise((resolve, reject) => {
    stopped.then((code) => reject(new Error(`serve did not start: exit code ${code}`)));
    let out = '';
    child.stdout.on('data', (chunk) => {
      const url = /listening on (http:\/\/[^/\s]+)/.exec(out += chunk)?.[1];
      if (url) resolve({ url, port: url.split(':')[2], stop: () => (child.kill('SIGTERM'), stopped) });
    });
  });
}

// A fresh profile for each browser, removed when it closes (if Chromium lets it go).
export async function launchBrowser() {
  const profile = scratch();
  const context = await chromium.launchPersistentContext(profile, {
    executablePath: '/usr/bin/chromium', headless: true, acceptDownloads: true,
    viewport: { width: 1280, height: 720 },
    args: ['--headless', '--no-sandbox', '--disable-gpu', '--disable-quic', '--no-first-run',
           '--disable-background-networking', '--disable-component-update', '--disable-sync'],
  });
  context.on('close', () => { try { rmSync(profile, { recursive: true, force: true }); } catch {} });
  return context;
}

// Collects the console errors and uncaught exceptions of every page of a browser, and the
// requests whose URL holds one of `secrets`; `allow` says which console errors are expected.
export function watchErrors(browser, allow, secrets = []) {
  const errors = [];
  browser.on('console', (m) => m.type() === 'error' && !allow(m.text()) && errors.push(m.text()));
  browser.on('weberror', (error) => errors.push(String(error.error())));
  browser.on('request', (r) => secrets.some((s) => r.url().includes(s)) && errors.push(r.url()));
  return errors;
}

export async function signIn(page, url, token) {
  const response = await page.goto(`${url}/`);
  await page.getByLabel('Access token').fill(token);
  await page.keyboard.press('Enter');
  await page.locator('#live-status.on').waitFor();
  return response;
}

export const rowIds = (page) => page.$$eval('#alarms tbody tr', (rs) => rs.map((r) => r.dataset.id));
