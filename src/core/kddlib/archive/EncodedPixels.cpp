#include "kddlib/archive/CorrectedDataset.h"

#include <QtEndian>

#include <dcmtk/dcmdata/dcdeftag.h>

namespace Kdd
{

namespace
{

/// The head of an item, or a delimiter.
QByteArray itemHead(const DcmTagKey& key, int length)
{
    QByteArray head(8, 0);
    qToLittleEndian<quint16>(key.getGroup(), head.data());
    qToLittleEndian<quint16>(key.getElement(), head.data() + 2);
    qToLittleEndian<quint32>(static_cast<quint32>(length), head.data() + 4);
    return head;
}

}  // namespace

/// Where frames lie would be known after the last one only; as each of them is one fragment, their number tells it too.
Result EncodedPixels::next(QByteArray& block)
{
    block.clear();
    if (mFrame < mIndex.frames()) {
        QByteArray frame;
        Result result = mIndex.readEncoded(mFile, mFrame, mSyntaxUID, frame);
        if (result.bad())
            return result.within(QStringLiteral("Frame %1").arg(mFrame + 1));
        if (mFrame == 0)
            block = itemHead(DCM_Item, 0);
        ++mFrame;
        block += itemHead(DCM_Item, frame.size()) + frame;
    } else if (!mIsEnded) {
        mIsEnded = true;
        block = itemHead(DCM_SequenceDelimitationItem, 0);
    }
    return {};
}

}  // namespace Kdd
