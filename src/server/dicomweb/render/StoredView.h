#pragma once

#include "server/dicomweb/retrieve/ImageFinder.h"
#include "server/dicomweb/retrieve/ObjectShelf.h"
#include "server/http/Request.h"
#include "server/http/Response.h"

#include <optional>

namespace Kdd::DicomWeb
{

/// What browsers show as it is stored, without a picture being drawn: a document or a video, whole or a range of it.
/// Nothing when the image is neither, or when the client would rather have a picture of the video.
std::optional<Http::Response> answerAsStored(const Http::Request& request, const ServedStudy& study,
                                             const ListedImage& image, ObjectShelf& objects);

}  // namespace Kdd::DicomWeb
