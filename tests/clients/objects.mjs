// Writes DICOM files of the kinds that a synthetic day does not have, for a viewer to show.
//
// usage: node objects.mjs FOLDER [IMAGES OF THE CT]

import { mkdirSync, writeFileSync } from 'node:fs';
import { join } from 'node:path';

const [, , folder, slices = '24'] = process.argv;
const kExplicitLittleEndian = '1.2.840.10008.1.2.1';
const kRoot = '2.25.4711';
const kClasses = { CT: '2', PT: '128', US: '3.1', XA: '12.1', SEG: '66.4', ECG: '9.1.1', DOC: '104.1' };
const classOf = (kind) => `1.2.840.10008.5.1.4.1.1.${kClasses[kind]}`;
const kLong = ['OB', 'OW', 'SQ', 'UN', 'UT'];

function valueBytes(vr, value) {
  if (Buffer.isBuffer(value)) return value;
  if (vr === 'SQ') return Buffer.concat(value.map((item) => {
    const body = dataset(item);
    const head = Buffer.from([0xfe, 0xff, 0x00, 0xe0, 0, 0, 0, 0]);
    head.writeUInt32LE(body.length, 4);
    return Buffer.concat([head, body]);
  }));
  const values = [value].flat();
  if (vr === 'US' || vr === 'AT') return Buffer.from(Uint16Array.from(values).buffer);
  return Buffer.from(values.join('\\'));
}

function element(tag, [vr, value]) {
  const bytes = valueBytes(vr, value);
  const padded = bytes.length % 2 ? Buffer.concat([bytes, Buffer.from(vr === 'UI' || vr === 'OB' ? '\0' : ' ')]) : bytes;
  const head = Buffer.alloc(kLong.includes(vr) ? 12 : 8);
  head.writeUInt16LE(parseInt(tag.slice(0, 4), 16), 0);
  head.writeUInt16LE(parseInt(tag.slice(4), 16), 2);
  head.write(vr, 4, 'latin1');
  if (head.length === 12) head.writeUInt32LE(padded.length, 8);
  else head.writeUInt16LE(padded.length, 6);
  return Buffer.concat([head, padded]);
}

function dataset(attributes) {
  return Buffer.concat(Object.keys(attributes).sort().map((tag) => element(tag, attributes[tag])));
}

function write(name, attributes) {
  const meta = dataset({
    '00020001': ['OB', Buffer.from([0, 1])], '00020002': attributes['00080016'], '00020003': attributes['00080018'],
    '00020010': ['UI', kExplicitLittleEndian], '00020012': ['UI', kRoot],
  });
  const length = Buffer.alloc(4);
  length.writeUInt32LE(meta.length);
  const head = Buffer.concat([Buffer.alloc(128), Buffer.from('DICM'), Buffer.from([2, 0, 0, 0, 0x55, 0x4c, 4, 0]), length, meta]);
  writeFileSync(join(folder, `${name}.dcm`), Buffer.concat([head, dataset(attributes)]));
}

/// What every object says: the study is named after its number, series and instances after theirs.
const object = (kind, modality, study, series, instance) => ({
  '00080005': ['CS', 'ISO_IR 192'], '00080016': ['UI', classOf(kind)], '00080018': ['UI', `${kRoot}.${study}.${series}.${instance}`],
  '00080020': ['DA', '20260301'], '00080021': ['DA', '20260301'], '00080030': ['TM', '101500'], '00080050': ['SH', `ACC-${study}`],
  '00080060': ['CS', modality], '00081030': ['LO', `Trial of ${modality}`], '0008103E': ['LO', `${modality} ${series}`],
  '00100010': ['PN', `Viewer^${kind}=山田^太郎`], '00100020': ['LO', `VIEWER-${kind}`], '0020000D': ['UI', `${kRoot}.${study}`],
  '0020000E': ['UI', `${kRoot}.${study}.${series}`], '00200011': ['IS', series], '00200013': ['IS', instance],
});

const pixels = (rows, columns, bits, samples = 1) => ({
  '00280002': ['US', samples], '00280004': ['CS', samples === 3 ? 'RGB' : 'MONOCHROME2'], '00280010': ['US', rows],
  '00280011': ['US', columns], '00280100': ['US', bits], '00280101': ['US', bits], '00280102': ['US', bits - 1],
  '00280103': ['US', 0], ...(samples === 3 ? { '00280006': ['US', 0] } : {}),
});

const place = (side, z, spacing, thickness) => ({
  '00180050': ['DS', thickness], '00200032': ['DS', [-side * spacing / 2, -side * spacing / 2, z * thickness]],
  '00200037': ['DS', [1, 0, 0, 0, 1, 0]], '00200052': ['UI', `${kRoot}.9`], '00280030': ['DS', [spacing, spacing]],
});

/// A body with a bright spot that moves from image to image.
function picture(side, moment, air, body, spot) {
  const image = new Uint16Array(side * side).fill(air);
  for (let y = 0; y < side; ++y) {
    for (let x = 0; x < side; ++x) {
      const [dx, dy] = [x / side - 0.5, y / side - 0.5];
      if (dx * dx + dy * dy < 0.16) image[y * side + x] = body + ((x + y) & 15);
      if ((dx - moment / 4) ** 2 + dy * dy < 0.01) image[y * side + x] = spot;
    }
  }
  return image;
}

function writeCt(count) {
  for (let i = 0; i < count; ++i) {
    write(`ct-${i}`, {
      ...object('CT', 'CT', 1, 1, i + 1), ...pixels(512, 512, 16), ...place(512, i, 0.8, 1.5), '00281050': ['DS', 40],
      '00281051': ['DS', 400], '00281052': ['DS', -1024], '00281053': ['DS', 1],
      '7FE00010': ['OW', Buffer.from(picture(512, i / count, 24, 1040, 1300).buffer)],
    });
  }
}

/// One segment over the first images of the CT.
function writeSegmentation(frames) {
  const mask = Buffer.alloc(512 * 512 / 8);
  for (let y = 200; y < 312; ++y) mask.fill(0xff, y * 64 + 20, y * 64 + 40);
  const code = (value, meaning) => [{ '00080100': ['SH', value], '00080102': ['SH', 'SCT'], '00080104': ['LO', meaning] }];
  const images = [...Array(frames).keys()].map((i) => ({ '00081150': ['UI', classOf('CT')], '00081155': ['UI', `${kRoot}.1.1.${i + 1}`] }));
  write('seg', {
    ...object('SEG', 'SEG', 1, 2, 1), '00100010': ['PN', 'Viewer^CT=山田^太郎'], '00100020': ['LO', 'VIEWER-CT'],
    ...pixels(512, 512, 1), '00200052': ['UI', `${kRoot}.9`], '00280008': ['IS', frames], '00620001': ['CS', 'BINARY'],
    '00081115': ['SQ', [{ '0020000E': ['UI', `${kRoot}.1.1`], '0008114A': ['SQ', images] }]],
    '00620002': ['SQ', [{ '00620004': ['US', 1], '00620005': ['LO', 'Spot'], '00620008': ['CS', 'MANUAL'],
      '00620003': ['SQ', code('85756007', 'Tissue')], '0062000F': ['SQ', code('85756007', 'Tissue')] }]],
    '00209221': ['SQ', [{ '00209164': ['UI', `${kRoot}.8`] }]],
    '00209222': ['SQ', [{ '00209164': ['UI', `${kRoot}.8`], '00209165': ['AT', [0x0062, 0x000b]], '00209167': ['AT', [0x0062, 0x000a]] }]],
    '52009229': ['SQ', [{ '00209116': ['SQ', [{ '00200037': ['DS', [1, 0, 0, 0, 1, 0]] }]],
      '00289110': ['SQ', [{ '00180050': ['DS', 1.5], '00180088': ['DS', 1.5], '00280030': ['DS', [0.8, 0.8]] }]] }]],
    '52009230': ['SQ', images.map((image, i) => ({ '0062000A': ['SQ', [{ '0062000B': ['US', 1] }]],
      '00209113': ['SQ', [{ '00200032': ['DS', [-204.8, -204.8, i * 1.5]] }]],
      '00089124': ['SQ', [{ '00082112': ['SQ', [{ ...image, '0040A170': ['SQ', [{ '00080100': ['SH', '121322'], '00080102': ['SH', 'DCM'],
        '00080104': ['LO', 'Source image'] }]] }]] }]] }))],
    '7FE00010': ['OB', Buffer.concat(Array(frames).fill(mask))],
  });
}

function writePet(count) {
  for (let i = 0; i < count; ++i) {
    write(`pet-${i}`, {
      ...object('PT', 'PT', 2, 1, i + 1), ...pixels(128, 128, 16), ...place(128, i, 4, 4), '00080022': ['DA', '20260301'],
      '00080031': ['TM', '101500'], '00080032': ['TM', '101500'], '00101030': ['DS', 70], '00280051': ['CS', ['ATTN', 'DECY']],
      '00281050': ['DS', 5000], '00281051': ['DS', 10000], '00281052': ['DS', 0], '00281053': ['DS', 1 + i / 100], '00541001': ['CS', 'BQML'],
      '00541102': ['CS', 'START'], '00540016': ['SQ', [{ '00181072': ['TM', '091500'], '00181074': ['DS', 350000000], '00181075': ['DS', 6588] }]],
      '7FE00010': ['OW', Buffer.from(picture(128, i / count, 0, 3000, 9000).buffer)],
    });
  }
}

function writeLoops() {
  const frames = [0, 1, 2, 3, 4, 5];
  const loop = { '00280008': ['IS', frames.length], '00280009': ['AT', [0x0018, 0x1063]], '00181063': ['DS', 50] };
  const colours = frames.map((i) => {
    const grey = picture(256, i / 8, 0, 100, 255);
    return Buffer.from(Uint8Array.from({ length: 3 * grey.length }, (none, at) => (at % 3 === 2 ? grey[(at - 2) / 3] / 3 : grey[(at - at % 3) / 3])));
  });
  write('us', { ...object('US', 'US', 3, 1, 1), ...pixels(256, 256, 8, 3), ...loop, '7FE00010': ['OB', Buffer.concat(colours)] });
  const greys = frames.map((i) => Buffer.from(Uint8Array.from(picture(512, i / 8, 200, 120, 10))));
  write('xa', { ...object('XA', 'XA', 4, 1, 1), ...pixels(512, 512, 8), ...loop, '00281050': ['DS', 128], '00281051': ['DS', 256],
    '7FE00010': ['OB', Buffer.concat(greys)] });
}

function writeEcg() {
  const samples = 5000;
  const wave = Buffer.alloc(samples * 2 * 2);
  for (let i = 0; i < samples; ++i) {
    wave.writeInt16LE(i % 400 < 12 ? 900 - 150 * Math.abs(i % 400 - 6) : Math.round(40 * Math.sin(i / 30)), i * 4);
    wave.writeInt16LE(i % 400 < 12 ? -400 : 20, i * 4 + 2);
  }
  const lead = (code, name) => ({ '003A0208': ['SQ', [{ '00080100': ['SH', code], '00080102': ['SH', 'MDC'], '00080104': ['LO', name] }]],
    '003A0210': ['DS', 1], '003A0211': ['SQ', [{ '00080100': ['SH', 'uV'], '00080102': ['SH', 'UCUM'], '00080104': ['LO', 'microvolt'] }]],
    '003A0212': ['DS', 1], '003A0213': ['DS', 0], '003A0214': ['DS', 0], '003A021A': ['US', 16] });
  write('ecg', { ...object('ECG', 'ECG', 5, 1, 1), '54000100': ['SQ', [{ '003A0004': ['CS', 'ORIGINAL'], '003A0005': ['US', 2],
    '003A0010': ['UL', Buffer.from(Uint32Array.of(samples).buffer)], '003A001A': ['DS', 500],
    '003A0200': ['SQ', [lead('2:1', 'Lead I'), lead('2:2', 'Lead II')]], '54001004': ['US', 16], '54001006': ['CS', 'SS'],
    '54001010': ['OW', wave] }]] });
}

function writeDocument() {
  const page = 'BT /F1 48 Tf 60 700 Td (A report as PDF) Tj ET';
  const parts = ['<</Type/Catalog/Pages 2 0 R>>', '<</Type/Pages/Kids[3 0 R]/Count 1>>',
    '<</Type/Page/Parent 2 0 R/MediaBox[0 0 595 842]/Contents 4 0 R/Resources<</Font<</F1 5 0 R>>>>>>',
    `<</Length ${page.length}>>stream\n${page}\nendstream`, '<</Type/Font/Subtype/Type1/BaseFont/Helvetica>>'];
  const text = `%PDF-1.4\n${parts.map((part, i) => `${i + 1} 0 obj${part}endobj\n`).join('')}trailer<</Root 1 0 R/Size 6>>\n%%EOF\n`;
  // Longer than what a tag file keeps.
  write('pdf', { ...object('DOC', 'DOC', 6, 1, 1), '00420010': ['ST', 'A report'], '00420012': ['LO', 'application/pdf'],
    '00420011': ['OB', Buffer.from(text + `%${' '.repeat(80000)}\n`)] });
}

mkdirSync(folder, { recursive: true });
writeCt(Number(slices));
writeSegmentation(Math.min(8, Number(slices)));
writePet(20);
writeLoops();
writeEcg();
writeDocument();
