#pragma once

#include "server/dicomweb/metadata/KeptAnswers.h"
#include "server/dicomweb/metadata/MetadataText.h"
#include "server/http/Response.h"

namespace Kdd::DicomWeb
{

/// Appends the text to the answer as its body. `takesGzip`: compressed, and when it is large also kept under `name`.
/// `kept` must outlive the answer.
void addBody(Http::Response& response, std::unique_ptr<MetadataText> text, bool takesGzip, KeptAnswers& kept,
             const QByteArray& name);

}  // namespace Kdd::DicomWeb
