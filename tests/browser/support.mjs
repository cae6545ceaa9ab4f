// What the console's browser tests share: a real `alarmsearch serve` on a loopback port and
// Debian's Chromium driven by playwright-core.

import { spawn } from 'node:child_process';
import { mkdtempSync, mkdirSync, rmSync } from 'node:fs';
import { tmpdir } from 'node:os';
import { join } from 'node:path';

export const alarmsearch = process.env.ALARMSEARCH_BIN;
if (!alarmsearch) throw new Error('set ALARMSEARCH_BIN to the alarmsearch executable (CTest does)');
export const screenshots = process.env.ALARMSEARCH_SCREENSHOTS || join(tmpdir(), 'console-shots');
mkdirSync(screenshots, { recursive: true });

const { chromium } = await import('playwright-core').catch(() => {
  throw new Error('playwright-core is missing: run scripts/setup.sh (npm ci) first');
});

export const scratch = () => mkdtempSync(join(tmpdir(), 'console-test-'));

// Starts serve with an in-memory simulator; resolves once it prints the URL it listens on.
export function startServe({ port = 0, users = null } = {}) {
  const args = ['serve', '--memory', '--seed-count', '200', '--listen', `127.0.0.1:${port}`];
  if (users) args.push('--users', users);
  const child = spawn(alarmsearch, args, { stdio: ['ignore', 'pipe', 'inherit'] });
  const stopped = new Promise((done) => child.on('exit', done));
  return new Promise((resolve, reject) => {
    const timer = setTimeout(() => reject(new Error('serve printed no URL within 20 s')), 20000);
    stopped.then((code) => reject(new Error(`serve did not start: exit code ${code}`)));
    let out = '';
    child.stdout.on('data', (chunk) => {
      const found = /listening on (http:\/\/\S+)/.exec(out += chunk);
      if (!found) return;
      clearTimeout(timer);
      const url = new URL(found[1]);
      resolve({ url: url.origin, port: Number(url.port),
                stop: () => { child.kill('SIGTERM'); return stopped; } });
    });
  });
}

// A fresh profile for each browser, removed when it closes.
export async function launchBrowser() {
  const profile = scratch();
  const context = await chromium.launchPersistentContext(profile, {
    executablePath: '/usr/bin/chromium',
    headless: true,
    acceptDownloads: true,
    viewport: { width: 1280, height: 720 },
    args: ['--headless', '--no-sandbox', '--disable-gpu', '--disable-quic', '--no-first-run',
           '--disable-background-networking', '--disable-component-update', '--disable-sync'],
  });
  // Chromium may still be writing it; a profile left in the temporary folder does no harm.
  context.on('close', () => { try { rmSync(profile, { recursive: true, force: true }); } catch {} });
  return context;
}

// Collects the page's console errors and uncaught exceptions; `allow` says which are expected.
export function watchErrors(page, allow = () => false) {
  const errors = [];
  page.on('console', (message) => {
    if (message.type() === 'error' && !allow(message.text())) errors.push(message.text());
  });
  page.on('pageerror', (error) => errors.push(String(error)));
  return errors;
}

export async function signIn(page, url, token) {
  await page.goto(`${url}/`);
  await page.getByLabel('Access token').fill(token);
  await page.getByLabel('Access token').press('Enter');
  await page.locator('#live-status.on').waitFor();
}

export async function rowIds(page) {
  return page.locator('#alarms tbody tr').evaluateAll((rows) => rows.map((r) => r.dataset.id));
}
