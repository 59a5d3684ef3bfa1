#include "platform/volume/ImageAttributes.h"

#include "platform/base/Decimal.h"

#include <dcmtk/dcmdata/dcdeftag.h>
#include <dcmtk/dcmdata/dcelem.h>
#include <dcmtk/dcmdata/dcitem.h>

namespace Kdd
{

namespace
{

// Read at most of a value whose representation was lost; the texts that are asked for are short.
constexpr int kMaxTextBytes = 1024;

}  // namespace

QByteArray textOf(DcmItem& item, const DcmTagKey& key)
{
    DcmElement* element = nullptr;
    if (item.findAndGetElement(key, element).bad() || !element->isLeaf())
        return {};
    OFString text;
    if (element->getVR() == EVR_UN) {
        text.resize(qMin<Uint32>(element->getLengthField(), kMaxTextBytes));
        if (text.empty() || element->getPartialValue(text.data(), 0, static_cast<Uint32>(text.size())).bad())
            return {};
    } else if (element->getOFStringArray(text).bad()) {
        return {};
    }
    return QByteArray(text.c_str()).trimmed();
}

DcmItem* ImageAttributes::findInGroup(const DcmTagKey& groups, int item, const DcmTagKey& group,
                                      const DcmTagKey& key) const
{
    DcmItem* frame = nullptr;
    DcmItem* found = nullptr;
    const bool isThere = mDataset.findAndGetSequenceItem(groups, frame, item).good() && frame &&
                         frame->findAndGetSequenceItem(group, found, 0).good() && found;
    // An empty attribute does not hide one that stands further out.
    return isThere && found->tagExistsWithValue(key) ? found : nullptr;
}

DcmItem* ImageAttributes::find(const DcmTagKey& group, const DcmTagKey& key) const
{
    if (DcmItem* own = findInGroup(DCM_PerFrameFunctionalGroupsSequence, mFrame, group, key))
        return own;
    if (DcmItem* shared = findInGroup(DCM_SharedFunctionalGroupsSequence, 0, group, key))
        return shared;
    return mDataset.tagExists(key) ? &mDataset : nullptr;
}

QVector<double> ImageAttributes::numbers(const DcmTagKey& group, const DcmTagKey& key) const
{
    DcmItem* item = find(group, key);
    return item ? numbersOf(textOf(*item, key)) : QVector<double>();
}

double believableAspect(double width, double height)
{
    // Pixels that are longer than that are a mistake of the writer's, and the preview would be a line.
    constexpr double kMost = 20;
    const double aspect = width / height;
    return aspect >= 1 / kMost && aspect <= kMost ? aspect : 1;
}

double pixelAspect(const ImageAttributes& attributes)
{
    // The distance of rows comes first, and the vertical part of the ratio.
    for (const DcmTagKey& key :
         {DCM_PixelSpacing, DCM_ImagerPixelSpacing, DCM_NominalScannedPixelSpacing, DCM_PixelAspectRatio}) {
        const QVector<double> spacing = attributes.numbers(DCM_PixelMeasuresSequence, key);
        if (spacing.size() == 2 && spacing.at(0) > 0 && spacing.at(1) > 0)
            return believableAspect(spacing.at(1), spacing.at(0));
    }
    return 1;
}

ValueRange windowOf(const ImageAttributes& attributes)
{
    const auto centers = attributes.numbers(DCM_FrameVOILUTSequence, DCM_WindowCenter);
    const auto widths = attributes.numbers(DCM_FrameVOILUTSequence, DCM_WindowWidth);
    DcmItem* shaped = attributes.find(DCM_FrameVOILUTSequence, DCM_VOILUTFunction);
    const QByteArray function = shaped ? textOf(*shaped, DCM_VOILUTFunction) : QByteArray();
    // The linear function spreads a width less 1; the other functions take any width above 0.
    const bool isLinear = function.isEmpty() || function == "LINEAR";
    // Of centres and widths there should be as many; what has no partner is passed over.
    for (int i = 0; i < qMin(centers.size(), widths.size()); ++i) {
        if (isLinear ? widths.at(i) >= 1 : widths.at(i) > 0)
            return windowRange(centers.at(i), widths.at(i));
    }
    return {};
}

}  // namespace Kdd
