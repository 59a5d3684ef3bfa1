#pragma once

#include "server/dicomweb/change/ObjectName.h"

#include <QByteArray>
#include <QString>

#include <dcmtk/config/osconfig.h>

#include <dcmtk/dcmdata/dctagkey.h>

namespace Kdd
{

class TagElement;
class TagMap;

}  // namespace Kdd

namespace Kdd::Browser
{

/// Longer values are cut in what the page gets [characters]: a letter of a report still fits, and nobody reads more in a
/// table. The whole value is in the study's metadata.
constexpr int kMaxValueLength = 4000;

/// A value as the page shows it.
struct ShownValue
{
    QString text;
    int length = 0;  ///< of the whole text [characters]
    bool isCut() const { return length > text.size(); }
};

using DicomWeb::keyDigits;
using DicomWeb::publicKey;

/// The dictionary's keyword of a key that the node shows, private ones through their creator; empty when it has none.
QString keywordOf(const TagMap& node, const DcmTagKey& key);

/// The two letters of the VR that the attribute had in its dataset.
QString vrOf(const TagMap& node, const DcmTagKey& key, const TagElement& element);

/// What the node shows of Specific Character Set; for an item that says nothing of it what is around it counts.
QByteArray characterSetOf(const TagMap& node, const QByteArray& around = QByteArray());

/// The value that the node shows under the key, by that character set.
ShownValue shownValue(const TagMap& node, const DcmTagKey& key, const QByteArray& characterSet,
                      int maxLength = kMaxValueLength);

/// The same for a single short value by the node's own character set; empty when there is none.
QString shortValue(const TagMap& node, const DcmTagKey& key);

}  // namespace Kdd::Browser
