// What a user gives: files and folders, and what their first bytes say they are.

const headBytes = 1024;
const mediaDirectory = '1.2.840.10008.1.3.10';

function entriesOf(folder) {
  const reader = folder.createReader();
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

/** Yields {path, file}; the file of what cannot be read is null. */
async function* filesBelow(entry) {
  const path = entry.fullPath.replace(/^\//, '');
  try {
    if (entry.isFile) yield { path, file: await new Promise((done, fail) => { entry.file(done, fail); }) };
    else for (const one of await entriesOf(entry)) yield* filesBelow(one);
  } catch (fault) {
    yield { path, file: null };
  }
}

/** The files and folders of a drop, which has to be asked at once: afterwards the browser has forgotten it. */
export function filesOfDrop(transfer) {
  const entries = [...transfer.items].filter((item) => item.kind === 'file').map((item) => item.webkitGetAsEntry()).filter(Boolean);
  return (async function* all() {
    for (const entry of entries) yield* filesBelow(entry);
  }());
}

export function filesOfInput(input) {
  return [...input.files].map((file) => ({ path: file.webkitRelativePath || file.name, file }));
}

/** Whether it is a DICOM file, and not the directory of a disc, which holds no object. Fails when it cannot be read. */
export async function isObject(file) {
  const head = new TextDecoder('latin1').decode(await file.slice(0, headBytes).arrayBuffer());
  return head.startsWith('DICM', 128) && !head.includes(`UI\x14\0${mediaDirectory}`);
}
