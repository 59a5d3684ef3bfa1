#include "kddlib/items/ElementWalk.h"

#include "kddlib/Limits.h"

#include <QtEndian>

#include <dcmtk/dcmdata/dcdeftag.h>

#include <cstring>

namespace Kdd
{

namespace
{

constexpr int kShortHead = 8;
constexpr int kLongHead = 12;
constexpr quint32 kUndefined = 0xffffffff;
constexpr Uint16 kDelimiters = 0xfffe;

constexpr char kShortVrs[] = "AEASATCSDADSDTFDFLISLOLTPNSHSLSSSTTMUIULUS";
constexpr char kLongVrs[] = "OBODOFOLOVOWSQSVUCUNURUTUV";

bool isOneOf(const char* vrs, const char* vr)
{
    for (; *vrs != '\0'; vrs += 2) {
        if (std::memcmp(vrs, vr, 2) == 0)
            return true;
    }
    return false;
}

DcmTagKey keyAt(const char* bytes)
{
    return {qFromLittleEndian<quint16>(bytes), qFromLittleEndian<quint16>(bytes + 2)};
}

bool isVr(const ElementWalk::Element& element, const char* vr)
{
    return std::memcmp(element.vr, vr, 2) == 0;
}

}  // namespace

const char* ByteWindow::at(qint64 offset, int count)
{
    if (offset < 0 || count > size() - offset)
        return nullptr;
    if (offset < mStart || offset + count > mStart + mBytes.size()) {
        mBytes.resize(static_cast<int>(qMin<qint64>(qMax(mSpan, count), size() - offset)));
        mStart = offset;
        qint64 done = 0;
        while (done < mBytes.size()) {
            const qint64 got = mSource.read(offset + done, mBytes.data() + done, mBytes.size() - done);
            if (got <= 0)
                break;
            done += got;
        }
        mBytes.truncate(static_cast<int>(done));
        if (done < count)
            return nullptr;
    }
    return mBytes.constData() + (offset - mStart);
}

bool ElementWalk::read(qint64 at, qint64 end, Element& element)
{
    return read(at, end, mIsExplicit, element);
}

bool ElementWalk::read(qint64 at, qint64 end, bool isExplicit, Element& element)
{
    const char* head = end - at >= kShortHead ? mBytes.at(at, kShortHead) : nullptr;
    if (head == nullptr)
        return false;
    element = Element();
    element.key = keyAt(head);
    element.offset = at;
    element.value = at + kShortHead;
    element.isExplicit = isExplicit;
    quint32 length = qFromLittleEndian<quint32>(head + 4);
    // Delimiters are written without VR everywhere.
    if (isExplicit && element.key.getGroup() != kDelimiters) {
        std::memcpy(element.vr, head + 4, 2);
        const bool isLong = isOneOf(kLongVrs, element.vr);
        if (!isLong && !isOneOf(kShortVrs, element.vr))
            return false;
        if (isLong) {
            head = end - at >= kLongHead ? mBytes.at(at, kLongHead) : nullptr;
            if (head == nullptr)
                return false;
            element.value = at + kLongHead;
        }
        length =
            isLong ? qFromLittleEndian<quint32>(head + kShortHead) : qFromLittleEndian<quint16>(head + 6);
        // What a writer did not understand it copied as it was: without VRs.
        element.isExplicit = !isVr(element, "UN");
    }
    element.isOpen = length == kUndefined;
    element.length = element.isOpen ? 0 : length;
    return element.length <= end - element.value;
}

qint64 ElementWalk::endOf(const Element& element, qint64 end)
{
    return endOf(element, end, 0);
}

qint64 ElementWalk::endOf(const Element& element, qint64 end, int depth)
{
    return element.isOpen ? endOfItems(element, end, depth) : element.value + element.length;
}

qint64 ElementWalk::endOfItems(const Element& sequence, qint64 end, int depth)
{
    Element item;
    for (qint64 at = sequence.value; depth < kMaxItemDepth && read(at, end, sequence.isExplicit, item);) {
        if (item.key == DCM_SequenceDelimitationItem)
            return item.value;
        if (item.key != DCM_Item)
            return -1;
        at = endOfItem(item, end, sequence.isExplicit, depth);
        if (at < 0)
            return -1;
    }
    return -1;
}

qint64 ElementWalk::endOfItem(const Element& item, qint64 end, bool isExplicit, int depth)
{
    if (!item.isOpen)
        return item.value + item.length;
    Element element;
    for (qint64 at = item.value; at >= 0 && read(at, end, isExplicit, element);
         at = endOf(element, end, depth + 1)) {
        if (element.key == DCM_ItemDelimitationItem)
            return element.value;
        if (element.key.getGroup() == kDelimiters)
            return -1;
    }
    return -1;
}

bool ElementWalk::find(const QVector<ElementStep>& steps, qint64 at, qint64 end, Element& element)
{
    bool isExplicit = mIsExplicit;
    for (int i = 0; i < steps.size(); ++i) {
        if (!findHere(steps.at(i).key, at, end, isExplicit, element))
            return false;
        if (i + 1 == steps.size())
            return true;
        Element item;
        if (!findItem(element, steps.at(i).item, item))
            return false;
        isExplicit = element.isExplicit;
        at = item.value;
        end = item.value + item.length;
    }
    return false;
}

bool ElementWalk::findHere(const DcmTagKey& key, qint64 at, qint64 end, bool isExplicit, Element& element)
{
    while (at >= 0 && at < end && read(at, end, isExplicit, element)) {
        at = endOf(element, end, 0);
        if (element.key == key && at >= 0) {
            element.length = at - element.value;
            return true;
        }
    }
    return false;
}

/// `sequence` as `findHere` gives it; the item's length is without a delimiter.
bool ElementWalk::findItem(const Element& sequence, int index, Element& item)
{
    const qint64 end = sequence.value + sequence.length;
    qint64 at = sequence.value;
    for (int i = 0; at >= 0 && at < end && read(at, end, sequence.isExplicit, item); ++i) {
        if (item.key != DCM_Item)
            return false;
        at = endOfItem(item, end, sequence.isExplicit, 0);
        if (i == index && at >= 0) {
            item.length = at - item.value - (item.isOpen ? kShortHead : 0);
            return true;
        }
    }
    return false;
}

}  // namespace Kdd
