#pragma once

#include "platform/database/Catalogue.h"

#include <QByteArray>
#include <QMap>

namespace Kdd
{

class TagMap;

/// What the image database keeps of a study, read from its series by UID, and the stamp of its file.
Kxg::BuiltStudy builtStudy(const QMap<QByteArray, TagMap*>& series, const Kxg::TagFileStamp& stamp);

}  // namespace Kdd
