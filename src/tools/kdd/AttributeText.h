#pragma once

#include <QByteArray>
#include <QString>

class DcmTagKey;

namespace Kdd
{

class TagMap;

/// "(0010,0020)"
QByteArray keyText(const DcmTagKey& key);

/// The dictionary's keyword of a key that a node holds, private ones through their creator; empty when it has none.
QByteArray keywordOf(const TagMap& node, const DcmTagKey& key);

/// Bytes of a text for display, by the character set that the node shows; without control characters.
QString displayText(const TagMap& node, const QByteArray& bytes);

/// The value under a key for display; empty when there is none.
QString displayValue(const TagMap& node, const DcmTagKey& key);

}  // namespace Kdd
