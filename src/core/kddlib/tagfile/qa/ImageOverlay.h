#pragma once

#include "kddlib/tagfile/qa/QAAudit.h"
#include "kddlib/tagmodel/TagMap.h"
#include "platform/base/Export.h"

#include <QByteArray>

#include <memory>

namespace Kdd
{

/// What corrections show of one image in place of what its DICOM file says: values by attribute, and attributes that
/// are not there any more. The audit log, which tells of all corrections so far, is part of it, and so are the UIDs of an
/// image that was moved.
///
/// The image database keeps it as bytes, so that every build of the image's study comes to the same image. Each
/// thread uses one of its own.
class KDD_EXPORT ImageOverlay
{
public:
    ImageOverlay();
    ~ImageOverlay();
    ImageOverlay(ImageOverlay&&) noexcept;
    ImageOverlay& operator=(ImageOverlay&&) noexcept;
    ImageOverlay(const ImageOverlay&) = delete;
    ImageOverlay& operator=(const ImageOverlay&) = delete;

    /// Takes over what the image shows under the key now; of a private attribute also whose it is.
    void note(const TagMap& image, const DcmTagKey& key);

    /// The same for every attribute that the image's audit log tells of, and the log itself. Pixel Data is passed over:
    /// the log has remarks on it, but a correction never replaces it. Nothing of an image without log, or whose log
    /// is damaged.
    void noteLogged(const TagMap& image);

    /// Makes an image without parent, as it was loaded from its file, show the same. A private attribute goes to the
    /// block that its creator has in this image.
    void applyTo(TagMap& image) const;

    /// Empty when no image was noted, or the log cannot be read.
    AuditLog log() const;

    bool isEmpty() const;

    /// The series that a corrected image was given; empty when no correction replaced it, so that the image stands where
    /// its file says, also a file that comes later.
    QByteArray seriesOf(const TagMap& image) const;

    /// A number of the form (1), then the record of a tag map: bytes that are compared only by `decode`.
    QByteArray encode() const;

    /// False, with the overlay as it was, when the bytes are damaged or of a form that is not known.
    bool decode(const QByteArray& bytes);

private:
    bool fits(const TagMap& image, const DcmTagKey& key) const;

    std::unique_ptr<TagMap> mElements;  // never null but after being moved from
};

}  // namespace Kdd
