#include "kddlib/tagfile/format/StudyBody.h"

#include "kddlib/Limits.h"
#include "kddlib/tagmodel/OwnAttributes.h"
#include "kddlib/tagmodel/TagElement.h"
#include "kddlib/tagmodel/TagMap.h"
#include "platform/base/KxMsg.h"

#include <QtEndian>

namespace Kdd
{

namespace
{

constexpr int kKeySize = 4;
constexpr int kShortLength = 2;
constexpr int kLongLength = 6;
constexpr int kLengthEscape = 65535;

using Value = EncodedElements::Value;

bool isMarker(VrCode vr)
{
    return vr == VrCode::Missing || vr == VrCode::Omitted;
}

/// Goes through bytes from one to the next, and takes nothing that is not there.
class Walk
{
public:
    Walk(const char* at, const char* end)
        : mAt(at)
        , mEnd(end)
    {
    }

    bool atEnd() const { return mAt == mEnd; }
    const char* at() const { return mAt; }
    int size() const { return static_cast<int>(left()); }

    bool takeKey(quint32& key, VrCode& vr)
    {
        if (left() < kKeySize + 1)
            return false;
        key = quint32(qFromLittleEndian<quint16>(mAt)) << 16 | qFromLittleEndian<quint16>(mAt + 2);
        vr = static_cast<VrCode>(static_cast<quint8>(mAt[kKeySize]));
        mAt += kKeySize + 1;
        return true;
    }

    /// In its shortest form, as the writer writes it.
    bool takeLength(int& length)
    {
        if (left() < kShortLength)
            return false;
        length = qFromLittleEndian<quint16>(mAt);
        if (length < kLengthEscape) {
            mAt += kShortLength;
            return true;
        }
        if (left() < kLongLength)
            return false;
        length = qFromLittleEndian<qint32>(mAt + kShortLength);
        mAt += kLongLength;
        return length >= kLengthEscape;
    }

    /// Bytes with their length before them.
    bool takeBytes(Value& value)
    {
        int length = 0;
        if (!takeLength(length) || length > left())
            return false;
        value.bytes = mAt;
        value.size = length;
        mAt += length;
        return true;
    }

private:
    qptrdiff left() const { return mEnd - mAt; }

    const char* mAt;
    const char* mEnd;
};

/// The elements behind a length that is there.
Walk elementsAt(const QByteArray& body, int place)
{
    Walk walk(body.constData() + place, body.constData() + body.size());
    Value elements{};
    return walk.takeBytes(elements) ? Walk(elements.bytes, elements.bytes + elements.size)
                                    : Walk(walk.at(), walk.at());
}

/// The next of elements that may stay; false at their end.
bool takeElement(Walk& walk, quint32& key, Value& value)
{
    value = {};
    if (walk.atEnd() || !walk.takeKey(key, value.vr))
        return false;
    if (isMarker(value.vr))
        return true;
    if (value.vr != VrCode::SQ)
        return walk.takeBytes(value);
    int items = 0;
    Value item{};
    bool isThere = walk.takeLength(items);
    for (; isThere && items > 0; --items)
        isThere = walk.takeBytes(item);
    return isThere;
}

/// Counts elements that may stay where they are.
class PlainCount
{
public:
    explicit PlainCount(int maxElements)
        : mMax(maxElements)
    {
    }

    int count() const { return mCount; }

    /// Of a node or an item, whose sequences of the first level `mayHold` is asked for.
    template <typename MayHold>
    bool add(Walk walk, int depth, const MayHold& mayHold)
    {
        qint64 last = -1;
        bool isPlain = countOne();
        while (isPlain && !walk.atEnd()) {
            quint32 key = 0;
            VrCode vr{};
            // A key that stands twice, or out of order, is put into order by the reader.
            isPlain = countOne() && walk.takeKey(key, vr) && key > last && !isPreview(key);
            last = key;
            Value value{};
            if (isPlain && vr == VrCode::SQ)
                isPlain = mayHold(key) && addItems(walk, depth + 1);
            else if (isPlain && !isMarker(vr))
                isPlain = walk.takeBytes(value);
        }
        return isPlain;
    }

private:
    bool countOne() { return ++mCount <= mMax; }

    /// Stands for a preview behind the body, whose number may be another one when it is written.
    static bool isPreview(quint32 key)
    {
        return key == packedKey(kPreview) || key == packedKey(kPreviewIndex);
    }

    bool addItems(Walk& walk, int depth)
    {
        int items = 0;
        if (depth > kMaxItemDepth || !walk.takeLength(items))
            return false;
        for (int i = 0; i < items; ++i) {
            Value item{};
            if (!walk.takeBytes(item) ||
                !add(Walk(item.bytes, item.bytes + item.size), depth, [](quint32) { return true; }))
                return false;
        }
        return true;
    }

    int mMax;
    int mCount = 0;
};

}  // namespace

int StudyBody::countPlain(int place, const TagMap& parent, int maxElements) const
{
    Walk walk(mBody.constData() + place, mBody.constData() + mBody.size());
    Value elements{};
    if (!walk.takeBytes(elements))
        return 0;
    const auto hangsNowhere = [&parent](quint32 key) {
        const TagElement* above = parent.findElement(unpackedKey(key));
        return above == nullptr || !above->isSequence();
    };
    PlainCount counted(maxElements);
    const Walk all(elements.bytes, elements.bytes + elements.size);
    return counted.add(all, 0, hangsNowhere) ? counted.count() : 0;
}

void StudyBody::decode(int place, TagMap& node) const
{
    static const QList<QByteArray> noPreviews;
    const Walk elements = elementsAt(mBody, place);
    KxMsg in(QByteArray::fromRawData(elements.at(), elements.size()));
    node.deserialize(in, nullptr, noPreviews);
}

bool StudyBody::find(int place, const DcmTagKey& key, Value& value) const
{
    const quint32 wanted = packedKey(key);
    Walk walk = elementsAt(mBody, place);
    quint32 found = 0;
    while (takeElement(walk, found, value) && found <= wanted) {
        if (found == wanted)
            return true;
    }
    return false;
}

void StudyBody::visit(int place, const Visit& visit) const
{
    Walk walk = elementsAt(mBody, place);
    quint32 key = 0;
    Value value{};
    while (takeElement(walk, key, value))
        visit(key, value);
}

QByteArray StudyBody::record(int place, int& count) const
{
    const Walk elements = elementsAt(mBody, place);
    PlainCount counted(kMaxElements);
    counted.add(elements, 0, [](quint32) { return true; });
    count = counted.count();
    const char* start = mBody.constData() + place;
    return QByteArray::fromRawData(start, static_cast<int>(elements.at() + elements.size() - start));
}

}  // namespace Kdd
