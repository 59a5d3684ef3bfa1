// Values as people read them.

/** The values under a tag of an object of the DICOM JSON model. */
export function values(object, tag) {
  const found = object?.[tag]?.Value;
  return Array.isArray(found) ? found.filter((one) => one !== null) : [];
}

export function first(object, tag) {
  const [value] = values(object, tag);
  if (value === undefined) return '';
  return typeof value === 'object' ? '' : String(value);
}

/** "Doe^Jane^^Dr" as "Doe, Jane, Dr"; of several spellings all, the Latin one first. */
export function personName(name) {
  const groups = typeof name === 'object' && name !== null ? [name.Alphabetic, name.Ideographic, name.Phonetic]
    : String(name ?? '').split('=');
  const [latin, ...others] = groups.map((group, i) =>
    String(group ?? '').split('^').map((one) => one.trim()).filter(Boolean).join(i === 0 ? ', ' : ' '));
  const known = others.filter(Boolean);
  if (!latin) return known.join(' · ');
  return known.length > 0 ? `${latin} (${known.join(' · ')})` : latin;
}

/** "20240131" as "2024-01-31"; what is no date stays as it is. */
export function date(text) {
  const found = /^(\d{4})\.?(\d{2})\.?(\d{2})$/.exec(text ?? '');
  return found ? `${found[1]}-${found[2]}-${found[3]}` : (text ?? '');
}

/** "142530.123" as "14:25". */
export function time(text) {
  const found = /^(\d{2}):?(\d{2})/.exec(text ?? '');
  return found ? `${found[1]}:${found[2]}` : (text ?? '');
}

/** "1/6/2026 9:30:00 PM anna", as audit logs have it with the day first, as ["2026-06-01 21:30:00", "anna"]. */
export function logTime(text) {
  const found = /^(\d{1,2})\/(\d{1,2})\/(\d{4}) (\d{1,2}):(\d{2}:\d{2}) ([AP])M(.*)$/s.exec(text);
  if (!found) return [text, ''];
  const two = (number) => String(number).padStart(2, '0');
  const [, day, month, year, hour, rest, half, who] = found;
  return [`${year}-${two(month)}-${two(day)} ${two((hour % 12) + (half === 'P' ? 12 : 0))}:${rest}`, who.trim()];
}

/** At the study's day: from the birth date where that is known, else as the study says: "42 y", "7 m". */
export function age(birth, day, told) {
  const from = /^(\d{4})(\d{2})(\d{2})$/.exec(birth ?? '');
  const to = /^(\d{4})(\d{2})(\d{2})$/.exec(day ?? '');
  if (from && to) {
    const months = (to[1] - from[1]) * 12 + (to[2] - from[2]) - (to[3] < from[3] ? 1 : 0);
    if (months >= 24) return `${Math.floor(months / 12)} y`;
    if (months >= 0) return `${months} m`;
  }
  const said = /^0*(\d+)([YMWD])$/.exec(told ?? '');
  return said ? `${said[1]} ${said[2].toLowerCase()}` : '';
}

export const sexes = { F: 'female', M: 'male', O: 'other' };

export function bytes(count) {
  const units = ['B', 'KB', 'MB', 'GB', 'TB'];
  let value = count;
  let unit = 0;
  for (; value >= 1000 && unit < units.length - 1; ++unit) value /= 1000;
  return `${unit === 0 || value >= 100 ? Math.round(value) : value.toFixed(value >= 10 ? 1 : 2)} ${units[unit]}`;
}

export function amount(count, one, many = `${one}s`) {
  return `${Number(count).toLocaleString('en')} ${count === 1 ? one : many}`;
}

/** Three significant digits and no more. */
export function number(value, digits = 4) {
  if (typeof value !== 'number') return 'unknown';
  return String(Number(value.toPrecision(digits)));
}

/** "StudyInstanceUID" as "Study Instance UID". */
export function spaced(keyword) {
  return keyword.replace(/([a-z0-9])([A-Z])/g, '$1 $2').replace(/([A-Z]+)([A-Z][a-z])/g, '$1 $2')
    .replace('X Ray', 'X-Ray').replace('CTD Ivol', 'CTDIvol');
}

/** "00100010" as "(0010,0010)". */
export function tagText(digits) {
  return `(${digits.slice(0, 4)},${digits.slice(4)})`;
}
