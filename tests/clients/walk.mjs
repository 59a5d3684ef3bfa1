// Asks a server for everything it has through dicomweb-client, as a viewer's program does.
//
// usage: node walk.mjs http://HOST:PORT/dicom-web

import { createRequire } from 'node:module';
import { check, report, root, value } from './archive.mjs';

const require = createRequire(process.env.KDD_NODE_MODULES + '/');
globalThis.XMLHttpRequest = require('xhr2');
const { api } = require('dicomweb-client');

const client = new api.DICOMwebClient({ url: root, verbose: false });

const kStudy = '0020000D';
const kSeries = '0020000E';
const kInstance = '00080018';
const kOctetStream = [{ mediaType: 'application/octet-stream', transferSyntaxUID: '*' }];
const kNative = [{ mediaType: 'application/octet-stream', transferSyntaxUID: '1.2.840.10008.1.2.1' }];

/// Of one body, or of the first one of several.
const bytesOf = data => new Uint8Array(Array.isArray(data) ? data[0] : data);

/// Whether the bytes are a DICOM file.
function isPart10(data) {
  return String.fromCharCode(...bytesOf(data).slice(128, 132)) === 'DICM';
}

function isJpeg(data) {
  const bytes = bytesOf(data);
  return bytes.length > 100 && bytes[0] === 0xff && bytes[1] === 0xd8;
}

/// The length of a frame without compression [bytes].
function frameLength(image) {
  const pixels = value(image, '00280010') * value(image, '00280011') * (value(image, '00280002') ?? 1);
  return Math.ceil((pixels * value(image, '00280100')) / 8);
}

/// What a request that has to fail is answered with.
async function statusOf(promise) {
  try {
    await promise;
    return 200;
  } catch (error) {
    return error.request?.status ?? error.status ?? String(error);
  }
}

/// Why a request failed: the path behind the instance, the status and the server's words.
function describe(error) {
  if (!error.request) return error.stack;
  const { status, response } = error.request;
  const path = String(error.request._url?.pathname).split('/studies/')[1];
  return `${path}: ${status} ${typeof response === 'string' ? response : Buffer.from(response ?? '').toString()}`.trim();
}

async function walkFrames(ids, image) {
  const frames = Number(value(image, '00280008') ?? 1);
  const stored = await client.retrieveInstanceFrames({ ...ids, frameNumbers: [frames], mediaTypes: kOctetStream });
  check(stored.length === 1 && stored[0].byteLength > 0, `no last frame of ${ids.sopInstanceUID}`);
  if (frames > 1) {
    const several = await client.retrieveInstanceFrames({ ...ids, frameNumbers: [frames, 1], mediaTypes: kOctetStream });
    check(several.length === 2 && several[0].byteLength === stored[0].byteLength, `frames ${frames},1 of ${ids.sopInstanceUID}`);
  }
  const native = await client.retrieveInstanceFrames({ ...ids, frameNumbers: [1], mediaTypes: kNative });
  // A frame of bits that does not end with a byte shares that with the next one.
  check(Math.abs(native[0].byteLength - frameLength(image)) <= 1,
    `frame 1 of ${ids.sopInstanceUID} has ${native[0].byteLength} bytes, not ${frameLength(image)}`);
  const beyond = await statusOf(client.retrieveInstanceFrames({ ...ids, frameNumbers: [frames + 1], mediaTypes: kOctetStream }));
  check(beyond === 404, `a frame beyond the last is answered by ${beyond}`);

  const rendered = await client.retrieveInstanceRendered({ ...ids, mediaTypes: [{ mediaType: 'image/jpeg' }] });
  check(isJpeg(rendered), `${ids.sopInstanceUID} rendered is no JPEG`);
  const shaped = await client.retrieveInstanceFramesRendered({
    ...ids, frameNumbers: [1], mediaTypes: [{ mediaType: 'image/png' }],
    queryParams: { viewport: '64,64', window: '40,400,linear' },
  });
  check(bytesOf(shaped)[1] === 0x50, `${ids.sopInstanceUID} rendered is no PNG`);
}

async function walkBulkData(ids, image) {
  for (const [tag, element] of Object.entries(image)) {
    if (!element.BulkDataURI) continue;
    const address = new URL(element.BulkDataURI, `${root}/studies/${ids.studyInstanceUID}/series/${ids.seriesInstanceUID}/`);
    const answer = await fetch(address, { headers: { Accept: 'application/octet-stream' } });
    const bytes = await answer.arrayBuffer();
    check(answer.status === 200 && bytes.byteLength > 0, `${tag} of ${ids.sopInstanceUID}: ${answer.status}`);
  }
}

async function walkInstance(ids, image) {
  const alone = await client.retrieveInstanceMetadata(ids);
  const one = Array.isArray(alone) ? alone[0] : alone;
  check(value(one, kInstance) === ids.sopInstanceUID, `metadata of ${ids.sopInstanceUID} is another's`);
  check(isPart10(await client.retrieveInstance(ids)), `${ids.sopInstanceUID} is no DICOM file`);
  // Objects without pixels may have the size of others.
  if (value(image, '00280010') && image['7FE00010']) await walkFrames(ids, image);
  await walkBulkData(ids, image);
}

let images = 0;

/// A study, its series, and of each series the first and the last image, which stand for those between.
async function walkStudy(study) {
  const studyInstanceUID = value(study, kStudy);
  const asked = await client.searchForStudies({ queryParams: { StudyInstanceUID: studyInstanceUID, includefield: 'all' } });
  check(asked.length === 1, `${studyInstanceUID} is found ${asked.length} times`);
  const whole = await client.retrieveStudyMetadata({ studyInstanceUID });
  check(whole.length === Number(value(study, '00201208')), `${studyInstanceUID} has ${whole.length} images`);
  for (const series of await client.searchForSeries({ studyInstanceUID })) {
    const seriesInstanceUID = value(series, kSeries);
    const metadata = await client.retrieveSeriesMetadata({ studyInstanceUID, seriesInstanceUID });
    const listed = await client.searchForInstances({ studyInstanceUID, seriesInstanceUID });
    check(metadata.length === listed.length && listed.length === Number(value(series, '00201209')),
      `${seriesInstanceUID} lists ${listed.length} and describes ${metadata.length} images`);
    for (const image of new Set([metadata[0], metadata[metadata.length - 1]])) {
      const ids = { studyInstanceUID, seriesInstanceUID, sopInstanceUID: value(image, kInstance) };
      await walkInstance(ids, image).catch(error => check(false, `${ids.sopInstanceUID}: ${describe(error)}`));
      images += 1;
    }
  }
}

const studies = await client.searchForStudies({ queryParams: { limit: 1000 } });
for (const study of studies) {
  await walkStudy(study).catch(error => check(false, `${value(study, kStudy)}: ${describe(error)}`));
}
const unknown = await statusOf(client.retrieveStudyMetadata({ studyInstanceUID: '1.2.3.4' }));
check(unknown === 404, `an unknown study is answered by ${unknown}`);
report(`${images} images of ${studies.length} studies`);
