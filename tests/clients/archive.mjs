// What both walks over a server need: the command line and reports of what was found wrong.

const faults = [];

export const root = process.argv[2];

/// Notes a fault unless `holds`.
export function check(holds, what) {
  if (!holds) faults.push(what);
}

/// The first value of an attribute of the DICOM JSON model.
export function value(object, tag) {
  return object?.[tag]?.Value?.[0];
}

/// Ends the process; to be called last.
export function report(walked) {
  for (const fault of faults) console.error(fault);
  console.log(`${walked}, ${faults.length} faults`);
  process.exit(faults.length > 0 || walked.startsWith('0 ') ? 1 : 0);
}
