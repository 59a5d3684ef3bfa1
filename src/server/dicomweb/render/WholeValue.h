#pragma once

#include "server/dicomweb/retrieve/BulkValue.h"
#include "server/http/AcceptHeader.h"

#include <optional>

namespace Kdd::DicomWeb
{

/// The answer for an instance that is shown by what it holds, as it is stored: a document, and a video for those who name
/// a media type of videos. None for all others, which are drawn.
std::optional<Http::Response> showWhole(const Http::Request& request, const Http::AcceptHeader& accept,
                                        const ServedStudy& study, const ListedImage& image,
                                        ObjectShelf& objects);

}  // namespace Kdd::DicomWeb
