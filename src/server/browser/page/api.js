// What the page asks of the server. All addresses are relative to the page, so that it works behind any prefix.

import { leaveToSignIn } from './session.js';

/** Why there is no answer: "offline", "absent", "busy", "gone" (nobody waits for it any more) or "failed". */
export class Failure extends Error {
  constructor(kind, message) {
    super(message);
    this.kind = kind;
  }
}

const kinds = { 404: 'absent', 410: 'absent', 503: 'busy' };
const longestReason = 300;

/** What the body of an answer says of why there is no other. */
export function reasonIn(status, type, body) {
  return (type.startsWith('text/plain') && body.trim().slice(0, longestReason)) || `The server answered ${status}.`;
}

export async function reasonOf(response) {
  return reasonIn(response.status, response.headers.get('Content-Type') ?? '', await response.text());
}

async function ask(address, accept, signal) {
  let response;
  try {
    response = await fetch(address, { signal, headers: { Accept: accept }, credentials: 'same-origin' });
  } catch (fault) {
    if (signal?.aborted) throw new Failure('gone', 'No longer wanted');
    throw new Failure('offline', 'The server cannot be reached.');
  }
  if (response.status === 401 && leaveToSignIn(response.headers.get('X-Sign-In'))) throw new Failure('gone', 'Signing in');
  if (!response.ok) throw new Failure(kinds[response.status] ?? 'failed', await reasonOf(response));
  if (response.status === 204) return null;
  try {
    return await response.json();
  } catch (fault) {
    if (signal?.aborted) throw new Failure('gone', 'No longer wanted');
    throw new Failure('failed', 'The answer broke off or is damaged.');
  }
}

export const config = { dicomWeb: 'dicom-web', viewer: false, thumbnails: false, signIn: false, may: [], caller: '' };

export async function readConfig(signal) {
  Object.assign(config, await ask('browser/config', 'application/json', signal));
}

const part = encodeURIComponent;

/** DICOMweb knows objects by their UIDs only. */
const isUID = (name) => /^[0-9.]{1,64}$/.test(name);

export const addresses = {
  study: (study) => `browser/studies/${part(study)}`,
  studyPreview: (study) => `browser/studies/${part(study)}/preview`,
  seriesPreview: (study, series) => `browser/studies/${part(study)}/series/${part(series)}/preview`,
  volumePreview: (study, series, volume) =>
    `browser/studies/${part(study)}/series/${part(series)}/volumes/${volume}/preview`,
  /** The stored preview, or one that is rendered; null when the image has none of either kind. */
  imagePreview: (study, series, image) => {
    if (image.preview) return `browser/studies/${part(study)}/images/${part(image.key)}/preview`;
    if (!config.thumbnails || !image.pixels || ![study, series, image.key].every(isUID)) return null;
    return `${config.dicomWeb}/studies/${part(study)}/series/${part(series)}/instances/${part(image.key)}/thumbnail?viewport=128,128`;
  },
  zip: (study) => `${config.dicomWeb}/studies/${part(study)}?accept=application/zip`,
  metadata: (study) => `${config.dicomWeb}/studies/${part(study)}/metadata`,
  viewer: (study) => `viewer/viewer?StudyInstanceUIDs=${part(study)}`,
};

export const getStudy = (study, signal) => ask(addresses.study(study), 'application/json', signal);
export const getSizes = (study, signal) => ask(`${addresses.study(study)}/sizes`, 'application/json', signal);
export const getCorrections = (study, signal) => ask(`${addresses.study(study)}/corrections`, 'application/json', signal);
export const getImages = (study, series, offset, limit, signal) =>
  ask(`${addresses.study(study)}/series/${part(series)}/images?offset=${offset}&limit=${limit}`, 'application/json', signal);
export const getAttributes = (study, image, signal) =>
  ask(`${addresses.study(study)}/images/${part(image)}/attributes`, 'application/json', signal);
export const getDifference = (study, a, b, signal) =>
  ask(`${addresses.study(study)}/difference?a=${part(a)}&b=${part(b)}`, 'application/json', signal);

const listed = ['ModalitiesInStudy', 'StudyDescription', 'PatientBirthDate', 'PatientSex', 'NumberOfStudyRelatedSeries',
  'NumberOfStudyRelatedInstances'];

/** A text that stands anywhere in the value; words in their order, whatever is between them. */
function anywhere(text) {
  return /[*?]/.test(text) ? text : `*${text.trim().replace(/\s+/g, '*')}*`;
}

/** The studies that fit: a list of objects of the DICOM JSON model. */
export async function searchStudies(query, offset, limit, signal) {
  const terms = new URLSearchParams();
  if (query.name) terms.set('PatientName', anywhere(query.name));
  if (query.id) terms.set('PatientID', anywhere(query.id));
  if (query.accession) terms.set('AccessionNumber', anywhere(query.accession));
  if (query.from || query.to) {
    const day = (date) => (date ?? '').replaceAll('-', '');
    terms.set('StudyDate', query.from === query.to ? day(query.from) : `${day(query.from)}-${day(query.to)}`);
  }
  if (query.modality) terms.set('ModalitiesInStudy', query.modality);
  terms.set('includefield', listed.join(','));
  terms.set('offset', offset);
  terms.set('limit', limit);
  return (await ask(`${config.dicomWeb}/studies?${terms}`, 'application/dicom+json', signal)) ?? [];
}
