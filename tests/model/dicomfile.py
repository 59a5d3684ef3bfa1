"""Writes small DICOM files: slices that can be stacked."""
import struct

LONG = (b"OB", b"OW", b"SQ", b"UN", b"UT")
MR = b"1.2.840.10008.5.1.4.1.1.4"


def element(tag, vr, value):
    value = value if isinstance(value, bytes) else value.encode()
    value += (b"\0" if vr in (b"UI", b"OB", b"OW") else b" ") * (len(value) % 2)
    head = struct.pack("<HH", tag >> 16, tag & 0xFFFF) + vr
    return head + (b"\0\0" + struct.pack("<I", len(value)) if vr in LONG else struct.pack("<H", len(value))) + value


def word(number):
    return struct.pack("<H", number)


def bytes_of(file):
    """Of what the model calls a file: of one length for UIDs and names of one length."""
    position = "0\\0\\%d" % int(file.number)
    dataset = [element(0x00080016, b"UI", MR)]
    if file.sop:
        dataset.append(element(0x00080018, b"UI", file.sop))
    dataset += [
        element(0x00080020, b"DA", "20240131"), element(0x00080060, b"CS", "MR"), element(0x0008103E, b"LO", "model"),
        element(0x00100010, b"PN", file.patient), element(0x00100020, b"LO", "P1"),
        element(0x00180050, b"DS", "1"), element(0x0020000D, b"UI", file.study), element(0x0020000E, b"UI", file.series),
        element(0x00200013, b"IS", file.number), element(0x00200032, b"DS", position),
        element(0x00200037, b"DS", "1\\0\\0\\0\\1\\0"), element(0x00200052, b"UI", "1.9"),
        element(0x00280002, b"US", word(1)), element(0x00280004, b"CS", "MONOCHROME2"), element(0x00280010, b"US", word(3)),
        element(0x00280011, b"US", word(4)), element(0x00280030, b"DS", "1\\1"), element(0x00280100, b"US", word(16)),
        element(0x00280101, b"US", word(16)), element(0x00280102, b"US", word(15)), element(0x00280103, b"US", word(0)),
        element(0x7FE00010, b"OW", b"".join(word(100 * int(file.number) + i) for i in range(12)))]
    meta = b"".join([element(0x00020001, b"OB", b"\0\1"), element(0x00020002, b"UI", MR),
                     element(0x00020003, b"UI", file.sop or "1.9.9"), element(0x00020010, b"UI", "1.2.840.10008.1.2.1"),
                     element(0x00020012, b"UI", "1.9.1")])
    return b"\0" * 128 + b"DICM" + element(0x00020000, b"UL", struct.pack("<I", len(meta))) + meta + b"".join(dataset)
