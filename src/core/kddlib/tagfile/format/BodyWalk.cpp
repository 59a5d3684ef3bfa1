#include "kddlib/tagfile/format/BodyWalk.h"

#include "kddlib/Limits.h"
#include "kddlib/tagfile/format/TagFileFrame.h"
#include "kddlib/tagmodel/OwnAttributes.h"
#include "kddlib/tagmodel/TagMap.h"
#include "platform/base/KxMsg.h"

#include <algorithm>

namespace Kdd
{

namespace
{

constexpr int kShortLength = 2;

using Part = ByteMap::Part;

Part partOf(quint8 marker)
{
    switch (marker) {
    case kStudyRecord:
        return Part::Study;
    case kSeriesRecord:
        return Part::Series;
    case kImageRecord:
        return Part::Image;
    case kVolumesRecord:
        return Part::Volumes;
    default:
        return Part::Unread;
    }
}

class BodyWalk
{
public:
    BodyWalk(ByteRows& rows, BodyParts& parts)
        : mRows(rows)
        , mParts(parts)
    {
    }

    bool walk(KxMsg body)
    {
        while (body.remaining() > 0 && !body.failed()) {
            const int before = body.remaining();
            quint8 marker = 0;
            body >> marker;
            const int length = TagMap::readLength(body);
            KxMsg record = body.readMessage(length);
            if (body.failed())
                return false;
            const Part part = partOf(marker);
            const int row = ByteRows::of(part);
            ++mRows.at(row).entries;
            spend(row, before - body.remaining() - length);
            const bool hasElements = part == Part::Study || part == Part::Series || part == Part::Image;
            if (!hasElements)
                spend(row, length);
            else if (!elements(record, row, 0))
                return false;
        }
        return !body.failed();
    }

private:
    void spend(int row, int bytes)
    {
        mRows.at(row).before += bytes;
        mParts.spans.append({row, bytes});
    }

    bool elements(KxMsg& in, int parent, int depth)
    {
        while (in.remaining() > 0) {
            const int before = in.remaining();
            quint16 group = 0;
            quint16 number = 0;
            quint8 code = 0;
            in >> group >> number >> code;
            const DcmTagKey key(group, number);
            // As many as a reader takes: a row or a span for every few bytes is more than the file itself.
            if (in.failed() || --mElementsLeft < 0)
                return false;
            const int row = mRows.below(parent, key);
            ++mRows.at(row).entries;
            const auto vr = static_cast<VrCode>(code);
            if (vr == VrCode::SQ) {
                if (!sequence(in, row, before, depth))
                    return false;
                continue;
            }
            if (vr != VrCode::Missing && vr != VrCode::Omitted)
                value(in, parent, key);
            if (in.failed())
                return false;
            spend(row, before - in.remaining());
        }
        return true;
    }

    void value(KxMsg& in, int parent, const DcmTagKey& key)
    {
        const int length = TagMap::readLength(in);
        if (parent != ByteRows::of(Part::Image) || key != kPreviewIndex) {
            in.readMessage(length);
            return;
        }
        bool ok = false;
        const int blob = in.read(length).toInt(&ok, 10);
        if (ok && blob >= 0 && blob < mParts.namedByImage.size())
            mParts.namedByImage[blob] = true;
    }

    /// `before`: what remained where the element begins.
    bool sequence(KxMsg& in, int row, int before, int depth)
    {
        const int count = TagMap::readLength(in);
        // Every item takes at least its own length code.
        if (in.failed() || depth >= kMaxItemDepth || count < 0 || count > in.remaining() / kShortLength)
            return false;
        spend(row, before - in.remaining());
        for (int i = 0; i < count; ++i) {
            const int begin = in.remaining();
            const int length = TagMap::readLength(in);
            KxMsg item = in.readMessage(length);
            if (in.failed() || --mElementsLeft < 0)
                return false;
            spend(row, begin - in.remaining() - length);
            if (!elements(item, row, depth + 1))
                return false;
        }
        return true;
    }

    ByteRows& mRows;
    BodyParts& mParts;
    int mElementsLeft = kMaxElements;
};

}  // namespace

ByteRows::ByteRows()
{
    for (int part = of(Part::Study); part <= of(Part::LeftOver); ++part)
        mRows.append({static_cast<Part>(part), -1, DcmTagKey()});
}

int ByteRows::below(int parent, const DcmTagKey& key)
{
    const quint64 name = (static_cast<quint64>(parent) << 32U) |
                         (static_cast<quint64>(key.getGroup()) << 16U) | key.getElement();
    const auto known = mBelow.constFind(name);
    if (known != mBelow.cend())
        return *known;
    mRows.append({mRows.at(parent).part, parent, key});
    mBelow.insert(name, mRows.size() - 1);
    return mRows.size() - 1;
}

QVector<DcmTagKey> ByteRows::pathOf(int row) const
{
    QVector<DcmTagKey> path;
    for (; mRows.at(row).parent >= 0; row = mRows.at(row).parent)
        path.append(mRows.at(row).key);
    std::reverse(path.begin(), path.end());
    return path;
}

bool walkBody(const QByteArray& body, ByteRows& rows, BodyParts& parts)
{
    return BodyWalk(rows, parts).walk(KxMsg(body));
}

}  // namespace Kdd
