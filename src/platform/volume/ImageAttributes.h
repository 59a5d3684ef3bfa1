#pragma once

#include "platform/volume/ValueRange.h"

#include <QByteArray>
#include <QVector>

#include <dcmtk/config/osconfig.h>

#include <dcmtk/dcmdata/dctagkey.h>

class DcmItem;

namespace Kdd
{

/// A text, or numbers as text, without padding; all values of it. Empty when absent. Texts whose representation was
/// lost on the way (UN) are read as well.
QByteArray textOf(DcmItem& item, const DcmTagKey& key);

/// The attributes that apply to one frame: in enhanced images they stand in functional groups, either of the frame or
/// shared by all, in other images beside the pixel data. The dataset must outlive it.
class ImageAttributes
{
public:
    ImageAttributes(DcmItem& dataset, int frame)
        : mDataset(dataset)
        , mFrame(frame)
    {
    }

    /// Where `key` stands: in the group of the frame, else the shared one, else the dataset; null when nowhere.
    DcmItem* find(const DcmTagKey& group, const DcmTagKey& key) const;

    /// All numbers of a text or numeric attribute; none when it is absent or one of them is no finite number.
    QVector<double> numbers(const DcmTagKey& group, const DcmTagKey& key) const;

    DcmItem& dataset() const { return mDataset; }

private:
    DcmItem* findInGroup(const DcmTagKey& groups, int item, const DcmTagKey& group,
                         const DcmTagKey& key) const;

    DcmItem& mDataset;
    int mFrame;
};

/// Width over height of a pixel, 1 when the image does not say or says nonsense.
double pixelAspect(const ImageAttributes& attributes);

/// The first window whose width is one, in values after the rescale; empty when there is none.
ValueRange windowOf(const ImageAttributes& attributes);

/// The range that a window of `center` and `width` shows.
inline ValueRange windowRange(double center, double width)
{
    return {center - width * 0.5, center + width * 0.5};
}

/// Width over height when that is believable, else 1.
double believableAspect(double width, double height);

}  // namespace Kdd
