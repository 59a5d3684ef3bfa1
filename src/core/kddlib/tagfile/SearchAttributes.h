#pragma once

#include "platform/database/SearchRecord.h"

#include <QByteArray>
#include <QMultiMap>

#include <dcmtk/config/osconfig.h>

#include <dcmtk/dcmdata/dctagkey.h>

namespace Kdd
{

class TagMap;

/// The first image of each series of a study, by the image's path.
using FirstImages = QMultiMap<QByteArray, const TagMap*>;

/// What searches know of a study: of each series what its first image says, of the study what the first of all says.
Kxg::StudySearchRecord searchRecord(const FirstImages& images);

/// Whether the attribute is among those that are kept of a study, or of a series, where an image has it.
bool isKeptOfStudy(const DcmTagKey& key);
bool isKeptOfSeries(const DcmTagKey& key);

}  // namespace Kdd
