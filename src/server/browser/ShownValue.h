#pragma once

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

/// "00100010", as addresses and JSON have it.
QString keyDigits(const DcmTagKey& key);

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

/// The name of a series or an image in addresses: its UID. Of those that have none, or something else in its place, a digest: images
/// without UID are known by the path of their file, which concerns nobody outside.
QByteArray publicKey(const QByteArray& key);

}  // namespace Kdd::Browser
