#include "kddlib/net/dicom/ElementScan.h"

#include "kddlib/Limits.h"

#include <QtEndian>

#include <dcmtk/dcmdata/dcdeftag.h>
#include <dcmtk/dcmdata/dcvr.h>

namespace Kdd
{

namespace
{

constexpr quint32 kUndefined = 0xffffffff;
constexpr qint64 kNowhere = -1;
constexpr Uint16 kDelimiters = 0xfffe;

}  // namespace

struct ElementScan::Head
{
    DcmTagKey key;
    bool isUnknown = false;  // VR UN: what it holds without length is implicit
    quint32 length = 0;
    qint64 value = 0;
};

bool ElementScan::find(qint64 at, Element& element) const
{
    Head head;
    if (!readHead(at, mSyntax.isExplicitVR(), head))
        return false;
    element = {head.key, head.length == kUndefined, head.value, endOf(head, mSyntax.isExplicitVR(), 0)};
    return true;
}

qint64 ElementScan::endOfWholeItems(qint64 at, int& items) const
{
    items = 0;
    Head head;
    while (readHead(at, true, head) && head.key == DCM_Item && head.length != kUndefined &&
           head.value + head.length <= mBytes.size()) {
        at = head.value + head.length;
        ++items;
    }
    return at;
}

bool ElementScan::readHead(qint64 at, bool isExplicit, Head& head) const
{
    const qint64 left = mBytes.size() - at;
    // No head is shorter: key and length, or key, VR and a short length.
    if (left < 8)
        return false;
    head.key = DcmTagKey(word(at), word(at + 2));
    head.isUnknown = false;
    // Items and delimiters have no VR in any syntax.
    if (!isExplicit || head.key.getGroup() == kDelimiters) {
        head.length = doubleWord(at + 4);
        head.value = at + 8;
        return true;
    }
    const char name[] = {mBytes.at(static_cast<int>(at) + 4), mBytes.at(static_cast<int>(at) + 5), '\0'};
    const DcmVR vr(name);
    head.isUnknown = vr.getEVR() == EVR_UN;
    const bool isLong = vr.usesExtendedLengthEncoding();
    if (isLong && left < 12)
        return false;
    head.length = isLong ? doubleWord(at + 8) : word(at + 6);
    head.value = at + (isLong ? 12 : 8);
    return true;
}

qint64 ElementScan::endOf(const Head& head, bool isExplicit, int depth) const
{
    if (head.length == kUndefined)
        return endOfSequence(head.value, isExplicit && !head.isUnknown, depth);
    // In 64 bits, where no length that a file can claim wraps.
    const qint64 end = head.value + head.length;
    return end <= mBytes.size() ? end : kNowhere;
}

qint64 ElementScan::endOfSequence(qint64 at, bool isExplicit, int depth) const
{
    Head head;
    // As deep as the parser goes: what lies deeper it would refuse anyway.
    while (at != kNowhere && depth < kMaxItemDepth && readHead(at, isExplicit, head)) {
        if (head.key == DCM_SequenceDelimitationItem || head.key == DCM_ItemDelimitationItem)
            return head.value;
        // What follows the last item goes on where the end of the sequence is missing.
        if (head.key != DCM_Item)
            return at;
        at = head.length == kUndefined ? endOfOpenItem(head.value, isExplicit, depth)
                                       : endOf(head, isExplicit, depth);
    }
    return kNowhere;
}

/// What begins the next item or ends the sequence also ends an item that lacks its own end.
qint64 ElementScan::endOfOpenItem(qint64 at, bool isExplicit, int depth) const
{
    Head head;
    while (at != kNowhere && readHead(at, isExplicit, head)) {
        if (head.key == DCM_ItemDelimitationItem)
            return head.value;
        if (head.key.getGroup() == kDelimiters)
            return at;
        at = endOf(head, isExplicit, depth + 1);
    }
    return kNowhere;
}

quint16 ElementScan::word(qint64 at) const
{
    const char* from = mBytes.constData() + at;
    return mSyntax.isBigEndian() ? qFromBigEndian<quint16>(from) : qFromLittleEndian<quint16>(from);
}

quint32 ElementScan::doubleWord(qint64 at) const
{
    const char* from = mBytes.constData() + at;
    return mSyntax.isBigEndian() ? qFromBigEndian<quint32>(from) : qFromLittleEndian<quint32>(from);
}

}  // namespace Kdd
