#pragma once

#include "server/dicomweb/MediaTypes.h"
#include "server/dicomweb/retrieve/ImageFinder.h"
#include "server/dicomweb/retrieve/ObjectShelf.h"

namespace Kdd::DicomWeb
{

/// Whether the image's file is there and can be given in a form that the client takes; 406 and the reason if not. A file
/// behind a URL is not asked for.
Verdict checkInstance(const ServedStudy& study, const ListedImage& image, const InstanceForm& form,
                      ObjectShelf& objects);

/// What a DICOM file that was made is.
struct MadeInstance
{
    QByteArray syntaxUID;
    qint64 metaLength = 0;  ///< of preamble and meta header, with which it begins [bytes]
};

/// Makes the image as a DICOM file that shows what the tag file shows, and appends it to a body. The stored file itself is
/// given where it shows just that.
Verdict makeInstance(const ServedStudy& study, const ListedImage& image, const InstanceForm& form,
                     ObjectShelf& objects, std::vector<Http::BodyPart>& body, MadeInstance& made);

}  // namespace Kdd::DicomWeb
