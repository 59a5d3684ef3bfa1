#pragma once

#include <QJsonObject>

namespace Kdd
{

class TagMap;

}  // namespace Kdd

namespace Kdd::Browser
{

/// Entries of one answer, items' attributes included. A multi-frame image may have a million.
constexpr int kMaxTreeEntries = 20000;

/// Items of one sequence that are written out.
constexpr int kMaxShownItems = 1000;

/// Every attribute that an image shows, and for each the node of the tree that holds it:
///
///     {"attributes": [
///        {"tag": "00100010", "name": "PatientName", "vr": "PN", "value": "Doe^Jane", "origin": "study"},
///        {"tag": "00081140", "name": ..., "vr": "SQ", "origin": "series", "count": 2, "items": [[...], [...]]},
///        {"tag": "7FE00010", "name": "PixelData", "vr": "OW", "origin": "image", "omitted": true},
///        {"tag": "00081030", "name": ..., "origin": "image", "hidden": true}],
///      "complete": true}
///
/// "origin" is "study", "series" or "image"; in items it is the node whose sequence has the item that holds the value,
/// which may stand above the one that holds the sequence. "hidden" is a mark by which a node says that it does not have
/// what a node above holds. "length" stands beside a value that was cut. "complete" is false when there was more than
/// an answer takes; then items are missing before attributes of the image itself are. The system's own group 0006 is left out.
QJsonObject attributeTree(const TagMap& image);

}  // namespace Kdd::Browser
