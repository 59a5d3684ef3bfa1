#pragma once

#include "server/dimse/QueryIdentifier.h"

class DcmDataset;

namespace Kdd::Dimse
{

/// Fills a dataset with what a question wants to see of an object that was found, in UTF-8. `json` is the object in the
/// DICOM JSON model; `title` is that of whoever has the object and sends it.
void fillAnswer(const QueryIdentifier& question, const QByteArray& json, const QByteArray& title,
                DcmDataset& answer);

}  // namespace Kdd::Dimse
