// Live alarm changes over the WebSocket /api/v1/events. The token goes in the first message,
// never in the URL. A lost connection is retried by itself, waiting a little longer each time.

import { storedToken } from './api.js';

const RETRY_DELAYS_MS = [250, 500, 1000, 2000, 3000];

// Close codes after which trying again cannot help.
const FINAL_CLOSES = {
  4400: 'the server did not understand the console',
  4401: 'the server did not accept your access token',
  4403: `the server refuses event connections from ${location.origin} ` +
        '(serve admits further addresses with --allow-origin)',
  4404: 'the server has no event stream at this address',
};

export class LiveEvents {
  // handlers: onLive(wasAway), onAway(text), onStopped(text, code), onUpdated(results)
  constructor(handlers) {
    this.handlers = handlers;
    this.socket = null;
    this.attempt = 0;
    this.timer = null;
    this.awaySince = null;
    this.stopped = true;
  }

  start() {
    this.stopped = false;
    this.connect();
  }

  stop() {
    this.stopped = true;
    clearTimeout(this.timer);
    if (this.socket) this.socket.close(1000);
    this.socket = null;
  }

  connect() {
    const scheme = location.protocol === 'https:' ? 'wss' : 'ws';
    const socket = new WebSocket(`${scheme}://${location.host}/api/v1/events`);
    this.socket = socket;
    socket.addEventListener('open', () => {
      const hello = { type: 'hello' };
      const token = storedToken();
      if (token) hello.token = token;
      socket.send(JSON.stringify(hello));
    });
    socket.addEventListener('message', (message) => this.receive(message.data));
    socket.addEventListener('close', (close) => {
      if (socket !== this.socket || this.stopped) return;
      this.socket = null;
      const final = FINAL_CLOSES[close.code];
      if (final) {
        this.stopped = true;
        this.handlers.onStopped(`Live updates stopped: ${final}.`, close.code);
        return;
      }
      this.retry();
    });
  }

  receive(text) {
    let message;
    try {
      message = JSON.parse(text);
    } catch {
      return;
    }
    if (message.type === 'subscribed') {
      const wasAway = this.awaySince !== null;
      this.awaySince = null;
      this.attempt = 0;
      this.handlers.onLive(wasAway);
    } else if (message.type === 'event' && message.event === 'AlarmUpdated') {
      const results = message.data && message.data.alarmUpdatedResults;
      if (Array.isArray(results)) this.handlers.onUpdated(results);
    }
  }

  retry() {
    if (this.awaySince === null) this.awaySince = new Date();
    const delay = RETRY_DELAYS_MS[Math.min(this.attempt, RETRY_DELAYS_MS.length - 1)];
    this.attempt += 1;
    const since = this.awaySince.toLocaleTimeString();
    this.handlers.onAway(
      `Live updates lost since ${since}: reconnecting (attempt ${this.attempt})\u2026 ` +
        'Changes made meanwhile appear once the connection is back.');
    this.timer = setTimeout(() => {
      if (!this.stopped) this.connect();
    }, delay);
  }
}
