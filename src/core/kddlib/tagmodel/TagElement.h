#pragma once

#include "kddlib/tagmodel/VrCode.h"
#include "platform/base/Export.h"

#include <QByteArray>
#include <QVariant>

#include <memory>
#include <string>
#include <utility>

class DcmElement;
class DcmTag;
class DcmTagKey;

namespace Kdd
{

/// The value of one DICOM attribute: its bytes and its value representation. The key is the one under which a
/// `TagMap` stores the element; the element does not know it.
///
/// Bytes by VR:
///
///     AE AS CS DA DS DT IS LO LT PN SH ST TM UI UT   the DICOM text, values separated by a backslash, no padding
///     AT                                             pairs of 16-bit words (group, element)
///     FL OF, FD                                      IEEE floats, IEEE doubles
///     SL UL up, SS US xs OW                          32-bit integers, 16-bit integers
///     OB ox lt UN                                    bytes as they are
///     missing, omitted                               none
///
/// Numbers are little-endian, the order of the machine. Values share their bytes when copied.
///
/// Owned by the map that stores it. No operation throws or logs. Used by the thread that uses the tree.
class KDD_EXPORT TagElement
{
public:
    /// An empty value of VR UN.
    TagElement() = default;
    TagElement(VrCode vr, QByteArray value)
        : mValue(std::move(value))
        , mVr(vr)
    {
    }
    TagElement(const TagElement&) = default;
    TagElement& operator=(const TagElement&) = default;
    virtual ~TagElement();

    /// Whether both values have the same bytes and, if `checkVR`, the same VR. When they differ and `diffs` is not
    /// null, one line "VR [text] <> [text]" is appended to it.
    virtual bool compare(const TagElement& other, bool checkVR, std::string* diffs) const;

    /// A new DCMTK element of this value under `tagFor(key)`, or null when the VR has none (a sequence that is no
    /// `TagSequence`, the markers). The caller owns it.
    virtual DcmElement* createDcmElement(const DcmTagKey& key) const;

    /// A new element with the same value and VR and counters at 0; the caller owns it.
    virtual TagElement* clone() const;

    /// Whether this is a `TagSequence`.
    virtual bool isSequence() const { return false; }

    /// The tag of the attribute with the VR that it had in its dataset: the dictionary's where that agrees with what is
    /// stored (which tells the younger VRs apart), else the stored one. DCMTK goes by the tag when it writes: under
    /// the dictionary's VR alone a signed number would come out unsigned and a private value without its VR.
    DcmTag tagFor(const DcmTagKey& key) const;

    /// As `createDcmElement`, with the VR that the tag carries.
    std::unique_ptr<DcmElement> newDcmElement(const DcmTag& tag) const;

    QByteArray& value() { return mValue; }
    const QByteArray& value() const { return mValue; }
    VrCode vr() const { return mVr; }
    void setVr(VrCode vr) { mVr = vr; }

    /// Replaces the bytes and leaves the VR.
    void putValue(const QByteArray& value) { mValue = value; }

    /// Stores a number as OB (one byte) below 256, as US below 65536, else (negative ones too) as SL.
    void putValue(int value);

    /// Converts a text to the encoding of the present VR; words that are no number become 0. False, and nothing
    /// changed, for AT, OB, OW, SQ and the codes above UT.
    bool putValueAsString(const QByteArray& text);

    /// The value as text, values separated by a backslash; `out` is replaced. Floats have six significant digits.
    /// At most 13 words of OW and 22 bytes of the other binary VRs are written, with "..." from that length on.
    void getValueAsString(QByteArray& out) const { getValueAsString(out, mVr); }

    /// As if the bytes had the VR `vr`.
    void getValueAsString(QByteArray& out, VrCode vr) const;

    /// Writes a value of VR UN by the VR that the dictionary has for (key, privateCreator); the creator may be null.
    /// False when the VR is still UN then.
    bool getValueAsString(QByteArray& out, const DcmTagKey& key, const char* privateCreator) const;

    /// Appends the bytes, read as an array of numbers, to `out`: `type` 0 unsigned 16 bit, 1 signed 16 bit, 2 float,
    /// 3 double, 4 signed 32 bit. Another type appends nothing; an incomplete last number is left out.
    void getValueAsStringFromOBOW(QByteArray& out, int type) const;

    /// Number of values of AS, DA, DS, IS and the binary number VRs; 0 for every other VR.
    int numFields() const;

    /// The value at `index` (0-based) as a number; 0 and `ok` false when there is none. `ok` may be null. Index 0 of
    /// a text VR stands for the whole text, so a multi-valued text is no number.
    int valueAsInt(bool* ok, int index) const;

    /// The value typed by VR (QDate, QTime, QDateTime in local time, double, int, else a Latin-1 QString); several
    /// values give a QVariantList, a malformed date or time an invalid variant.
    QVariant valueAsVariant() const;

    bool markedAsMissing() const { return mVr == VrCode::Missing; }
    bool markedAsOmitted() const { return mVr == VrCode::Omitted; }

    /// How many children that were attached to the holder of this element had another value, or none.
    quint32 numDiffering() const { return mNumDiffering; }
    quint32 numMissing() const { return mNumMissing; }
    void countDiffering() { ++mNumDiffering; }
    void countMissing() { ++mNumMissing; }

private:
    QByteArray mValue;
    VrCode mVr = VrCode::UN;
    quint32 mNumDiffering = 0;
    quint32 mNumMissing = 0;
};

}  // namespace Kdd
