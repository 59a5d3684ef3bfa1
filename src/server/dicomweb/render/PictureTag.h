#pragma once

#include "server/dicomweb/StudyShelf.h"
#include "server/dicomweb/retrieve/ObjectShelf.h"

namespace Kdd::DicomWeb
{

/// Which picture it is that a client keeps.
struct PictureTag
{
    QByteArray image;  ///< key of the image that is shown
    QByteArray what;   ///< frame, wishes and media type

    /// The ETag of a picture that the tag file holds.
    QByteArray ofStored(const ServedStudy& study) const;

    /// The ETag of a picture that is drawn from the image's file: of another file, or one that was changed, it is another
    /// one. Empty where that cannot be told. Refuses, 410, when the file is gone or holds another image by now.
    Verdict ofDrawn(const ServedStudy& study, ObjectShelf& objects, QByteArray& tag) const;
};

}  // namespace Kdd::DicomWeb
