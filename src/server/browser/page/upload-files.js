// What a user gives: files and folders, and what their first bytes say they are.

const prefixAt = 128;
const headBytes = 2048; // in which the meta information names the object
const mediaDirectory = '1.2.840.10008.1.3.10';

function readAll(reader) {
  const found = [];
  return new Promise((done, fail) => {
    // A folder is told in portions, and an empty one is the end.
    const next = () => reader.readEntries((entries) => {
      if (entries.length === 0) return done(found);
      found.push(...entries);
      return next();
    }, fail);
    next();
  });
}

async function* filesBelow(entry) {
  if (entry.isFile) {
    const file = await new Promise((done, fail) => { entry.file(done, fail); });
    yield { file, path: entry.fullPath.replace(/^\//, '') };
  } else if (entry.isDirectory) {
    for (const one of await readAll(entry.createReader())) yield* filesBelow(one);
  }
}

/** The files and folders of a drop, which has to be asked at once: afterwards the browser has forgotten it. */
export function filesOfDrop(transfer) {
  const entries = [...transfer.items].filter((item) => item.kind === 'file').map((item) => item.webkitGetAsEntry()).filter(Boolean);
  return (async function* all() {
    for (const entry of entries) yield* filesBelow(entry);
  }());
}

export async function* filesOfInput(input) {
  for (const file of [...input.files]) yield { file, path: file.webkitRelativePath || file.name };
}

function uidAt(view, at, length) {
  let text = '';
  for (let i = 0; i < length && at + i < view.byteLength; ++i) text += String.fromCharCode(view.getUint8(at + i));
  return text.replace(/[\0 ]+$/, '');
}

/** The UID that the meta information gives the object; null for what is no DICOM object, "" when it does not say. */
export async function objectUID(file) {
  const view = new DataView(await file.slice(0, headBytes).arrayBuffer());
  if (view.byteLength < prefixAt + 4 || uidAt(view, prefixAt, 4) !== 'DICM') return null;
  let uid = '';
  for (let at = prefixAt + 4; at + 8 <= view.byteLength && view.getUint16(at, true) === 2;) {
    const tag = view.getUint16(at + 2, true);
    const isLong = ['OB', 'OW', 'UN', 'UT', 'SQ'].includes(uidAt(view, at + 4, 2));
    if (isLong && at + 12 > view.byteLength) break;
    const length = isLong ? view.getUint32(at + 8, true) : view.getUint16(at + 6, true);
    const value = at + (isLong ? 12 : 8);
    if (tag === 2 && uidAt(view, value, length) === mediaDirectory) return null;
    if (tag === 3) uid = uidAt(view, value, length);
    at = value + length;
  }
  return uid;
}
