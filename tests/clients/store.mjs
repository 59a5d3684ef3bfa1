// Sends the DICOM files below a folder to a server through dicomweb-client, several requests at a time, and looks whether the
// server has each of them.
//
// usage: node store.mjs http://HOST:PORT/dicom-web FOLDER

import { createRequire } from 'node:module';
import { readdirSync, readFileSync } from 'node:fs';
import { join } from 'node:path';
import { check, report, root, value } from './archive.mjs';

const require = createRequire(process.env.KDD_NODE_MODULES + '/');
globalThis.XMLHttpRequest = require('xhr2');
const { api } = require('dicomweb-client');

const client = new api.DICOMwebClient({ url: root, verbose: false });
const kAtOnce = 4;
const kPerRequest = 7;

/// Whether the bytes are a DICOM file.
const isPart10 = bytes => String.fromCharCode(...bytes.slice(128, 132)) === 'DICM';

const files = readdirSync(process.argv[3], { recursive: true, withFileTypes: true })
  .filter(entry => entry.isFile())
  .map(entry => new Uint8Array(readFileSync(join(entry.parentPath ?? entry.path, entry.name))))
  .filter(isPart10);

/// What the answer says of the objects, by UID.
async function send(some) {
  const datasets = some.map(bytes => bytes.buffer.slice(bytes.byteOffset, bytes.byteOffset + bytes.length));
  const text = await client.storeInstances({ datasets });
  const answer = typeof text === 'string' ? JSON.parse(text) : JSON.parse(text.response ?? JSON.stringify(text));
  check(!answer['00081198'] && !answer['0008119A'], `not stored: ${JSON.stringify(answer['00081198'] ?? answer['0008119A'])}`);
  return (answer['00081199']?.Value ?? []).map(item => value(item, '00081190'));
}

async function sendAll() {
  const groups = [];
  for (let i = 0; i < files.length; i += kPerRequest) groups.push(files.slice(i, i + kPerRequest));
  const addresses = [];
  const sender = async () => {
    for (let group = groups.pop(); group; group = groups.pop()) addresses.push(...(await send(group)));
  };
  await Promise.all(Array.from({ length: kAtOnce }, sender));
  return addresses;
}

async function count() {
  let images = 0;
  for (const study of await client.searchForStudies()) {
    const studyInstanceUID = value(study, '0020000D');
    images += (await client.searchForInstances({ studyInstanceUID })).length;
  }
  return images;
}

const addresses = await sendAll().catch(error => {
  check(false, `${error.request?.status} ${error.request?.response ?? error.stack}`);
  return [];
});
check(new Set(addresses).size === files.length, `${files.length} objects have ${new Set(addresses).size} addresses`);
for (const address of addresses) {
  const got = await fetch(address, { headers: { Accept: 'application/dicom; transfer-syntax=*' } });
  check(got.status === 200 && isPart10(new Uint8Array(await got.arrayBuffer())), `${address}: ${got.status}`);
}
check((await count()) === files.length, `${await count()} of ${files.length} objects are found`);
await sendAll().catch(error => check(false, `again: ${error.request?.status}`));
check((await count()) === files.length, `${await count()} of ${files.length} objects are found after they came again`);
report(`${files.length} objects`);
