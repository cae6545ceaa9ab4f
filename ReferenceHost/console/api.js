// The console's client of /api/v1. The operator's token lives in this tab's sessionStorage and
// travels only in the Authorization header, never in a URL.

const TOKEN_KEY = 'alarmsearch.token';

// The most alarm ids one update or mute request may carry.
export const MAX_IDS_PER_REQUEST = 1000;

export class ApiError extends Error {
  constructor(status, message) {
    super(message);
    this.status = status;
  }
}

export function storedToken() {
  return sessionStorage.getItem(TOKEN_KEY) || '';
}

export function storeToken(token) {
  if (token) sessionStorage.setItem(TOKEN_KEY, token);
  else sessionStorage.removeItem(TOKEN_KEY);
}

// Words for an error answer: what went wrong and, where the server names it, which field.
function describe(status, body) {
  if (status === 401) return 'The server did not accept your access token: sign in again.';
  if (!body || typeof body !== 'object') return `The server answered with HTTP status ${status}.`;
  const parts = [String(body.error || `HTTP status ${status}`)];
  if (body.field) parts.push(`(${body.field})`);
  if (body.problem) parts.push(`: ${body.problem}`);
  if (body.resultCode) parts.push(`: result code ${body.resultCode} for ${body.method}`);
  return parts.join(' ').replace(' :', ':');
}

export async function request(method, path, body) {
  const headers = { Accept: 'application/json' };
  const token = storedToken();
  if (token) headers.Authorization = `Bearer ${token}`;
  if (body !== undefined) headers['Content-Type'] = 'application/json';
  let response;
  try {
    response = await fetch(path, {
      method,
      headers,
      body: body === undefined ? undefined : JSON.stringify(body),
      cache: 'no-store',
    });
  } catch {
    throw new ApiError(0, 'The server cannot be reached.');
  }
  let answer = null;
  try {
    answer = await response.json();
  } catch {
    answer = null;
  }
  if (!response.ok) throw new ApiError(response.status, describe(response.status, answer));
  if (answer === null) throw new ApiError(response.status, 'The server sent an unreadable answer.');
  return answer;
}

export const me = () => request('GET', '/api/v1/me');

export function search(body, unhandledOnly) {
  return request('POST', unhandledOnly ? '/api/v1/alarms/unhandled' : '/api/v1/alarms/search', body);
}

export const update = (ids, state, note) =>
  request('POST', '/api/v1/alarms/update', { ids, state, note });

export const history = (alarmId) =>
  request('GET', `/api/v1/alarms/${encodeURIComponent(alarmId)}/history`);

export const mute = (ids, seconds) => request('POST', '/api/v1/alarms/mute', { ids, seconds });

export const unmute = (ids) => request('POST', '/api/v1/alarms/unmute', { ids });

// Splits a list of ids into pieces one request may carry.
export function chunks(ids) {
  const pieces = [];
  for (let i = 0; i < ids.length; i += MAX_IDS_PER_REQUEST)
    pieces.push(ids.slice(i, i + MAX_IDS_PER_REQUEST));
  return pieces;
}
