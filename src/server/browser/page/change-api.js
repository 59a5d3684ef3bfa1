// What the page asks the server to change. As with all else, addresses are relative to the page.

import { config, Failure, reasonOf } from './api.js';

const part = encodeURIComponent;

export const may = (right) => config.may.includes(right);

/** DICOMweb names objects by their UIDs; what has none cannot be named there. */
export const isNamed = (key) => /^[0-9A-Za-z._-]{1,64}$/.test(key) && !key.startsWith('object-');

export const correctionsAddress = (study) => `${config.dicomWeb}/studies/${part(study)}/corrections`;

async function send(method, address, body, signal) {
  const headers = { Accept: 'application/json' };
  if (body) headers['Content-Type'] = 'application/json';
  let response;
  try {
    response = await fetch(address, { method, headers, body: body && JSON.stringify(body), signal, credentials: 'same-origin' });
  } catch (fault) {
    if (signal?.aborted) throw new Failure('gone', 'No longer wanted');
    throw new Failure('offline', 'The server cannot be reached. What it was asked for may be done or not.');
  }
  const isReport = (response.headers.get('Content-Type') ?? '').startsWith('application/json');
  if (!response.ok && !isReport) throw new Failure('failed', await reasonOf(response));
  return response.json();
}

/** What a correction would do; the study stays as it is. */
export const previewCorrection = (study, job, signal) => send('POST', `${correctionsAddress(study)}?preview=true`, job, signal);

// Not given up with the view: what was begun is done, and nobody should have to guess.
export const applyCorrection = (study, job) => send('POST', correctionsAddress(study), job);

export function deleteObjects(study, series, image) {
  const below = series ? `/series/${part(series)}${image ? `/instances/${part(image)}` : ''}` : '';
  return send('DELETE', `${config.dicomWeb}/studies/${part(study)}${below}`);
}
