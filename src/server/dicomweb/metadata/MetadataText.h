#pragma once

#include "server/dicomweb/StudyShelf.h"
#include "server/dicomweb/metadata/MetadataRequest.h"

#include <QVector>

#include <kddlib/DicomJson.h>

namespace Kdd
{
class TagMap;
}

namespace Kdd::DicomWeb
{

/// The metadata of a study's images as text, block by block, so that no more of it than a block is in memory. Between the
/// blocks others can look at the study.
class MetadataText
{
public:
    MetadataText(std::shared_ptr<const ServedStudy> study, const MetadataRequest& request);

    /// How many images there are.
    int count() const { return mImages.size(); }

    /// Appends the next images to `block`, some 64 KiB. False, with nothing appended, when all was given.
    bool next(QByteArray& block);

private:
    void image(QByteArray& block, const TagMap& image);
    QByteArray addressOf(const TagMap& image) const;

    std::shared_ptr<const ServedStudy> mStudy;
    MetadataRequest mRequest;
    QByteArray mBoundary;  // of parts
    QVector<const TagMap*> mImages;
    int mNext = 0;
    bool mIsEnded = false;
    DicomImageWriter mWriter;
};

}  // namespace Kdd::DicomWeb
