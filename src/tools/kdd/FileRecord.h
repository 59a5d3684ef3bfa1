#pragma once

#include "platform/database/Catalogue.h"

namespace Kdd
{

class TagMap;

/// What the database keeps of an image, from its attributes.
Kxg::DicomFileRecord fileRecord(const TagMap& image, const QByteArray& path, const Kxg::FileStamp& stamp);

}  // namespace Kdd
