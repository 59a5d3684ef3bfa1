#include "server/dicomweb/metadata/MetadataText.h"

#include <kddlib/TagMap.h>

namespace Kdd::DicomWeb
{
namespace
{

constexpr int kBlock = 64 * 1024;  // [bytes]

/// In the order of the tree. An image is named by its series too: under another one it is not there.
QVector<const TagMap*> imagesOf(const TagFile& file, const ResourcePath& path)
{
    QVector<const TagMap*> images;
    const std::shared_ptr<TagMap> study = file.study();
    if (study == nullptr)
        return images;
    const QList<TagMap*>& allSeries = study->children();
    for (const TagMap* series : allSeries) {
        if (!path.series.isEmpty() && series->uid(TagMap::SeriesLevel) != path.series)
            continue;
        for (const TagMap* image : series->children()) {
            if (path.instance.isEmpty() || image->uid(TagMap::ImageLevel) == path.instance)
                images.append(image);
        }
    }
    return images;
}

}  // namespace

MetadataText::MetadataText(std::shared_ptr<const ServedStudy> study, const MetadataRequest& request)
    : mStudy(std::move(study))
    , mRequest(request)
    , mBoundary(request.boundary())
    , mImages(mStudy->look([&](const TagFile& file) { return imagesOf(file, request.path); }))
    , mWriter(request.form, request.wanted)
{
}

bool MetadataText::next(QByteArray& block)
{
    if (mIsEnded)
        return false;
    const int end = block.size() + kBlock;
    mStudy->look([&](const TagFile& /*file*/) {
        while (mNext < mImages.size() && block.size() < end)
            image(block, *mImages.at(mNext++));
    });
    mIsEnded = mNext == mImages.size();
    if (mIsEnded)
        block.append(mRequest.form == MetadataForm::Json ? QByteArray("]") : "--" + mBoundary + "--\r\n");
    return true;
}

void MetadataText::image(QByteArray& block, const TagMap& image)
{
    if (mRequest.form == MetadataForm::Json)
        block.append(mNext == 1 ? '[' : ',');
    else
        block.append("--")
            .append(mBoundary)
            .append("\r\nContent-Type: ")
            .append(mRequest.mediaType)
            .append("\r\n\r\n");
    mWriter.append(block, image, addressOf(image));
    if (mRequest.form == MetadataForm::Xml)
        block.append("\r\n");
}

/// Relative to the address of the answer, so that it holds behind any proxy. Clients that take it to be relative to the
/// study or the series come to the same place.
QByteArray MetadataText::addressOf(const TagMap& image) const
{
    const QByteArray below = "instances/" + image.uid(TagMap::ImageLevel) + "/bulkdata";
    if (!mRequest.path.instance.isEmpty())
        return "../../" + below;
    if (!mRequest.path.series.isEmpty())
        return below;
    return "series/" + image.uid(TagMap::SeriesLevel) + '/' + below;
}

}  // namespace Kdd::DicomWeb
