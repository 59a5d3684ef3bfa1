#pragma once

#include "server/dicomweb/retrieve/BulkValue.h"
#include "server/http/AcceptHeader.h"

#include <optional>

namespace Kdd::DicomWeb
{

/// Whether it is a tree of items that says something in words.
bool isReport(const TagMap& image);

/// The answer for an instance that is shown by what it holds: a document as it is stored, a report in words, and a video
/// as it is stored for those who name a media type of videos. None for all others, which are drawn.
std::optional<Http::Response> showWhole(const Http::Request& request, const Http::AcceptHeader& accept,
                                        const ServedStudy& study, const ListedImage& image,
                                        ObjectShelf& objects);

}  // namespace Kdd::DicomWeb
