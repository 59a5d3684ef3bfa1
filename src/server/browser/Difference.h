#pragma once

#include <QJsonObject>

namespace Kdd
{

class TagMap;

}  // namespace Kdd

namespace Kdd::Browser
{

/// Attributes of one answer in which two images differ.
constexpr int kMaxDifferences = 5000;

/// In what the merged views of two images differ, down to the items of their sequences:
///
///     {"differences": [{"path": "(0008,1140)[0].", "tag": "00081155", "name": "ReferencedSOPInstanceUID",
///                       "a": {"vr": "UI", "value": "1.2.3"}, "b": null}],
///      "complete": true}
///
/// A side is null where the attribute is absent; in place of "value" it has "omitted", or "count" for a sequence whose
/// number of items is another one on the other side.
QJsonObject differenceOf(const TagMap& a, const TagMap& b);

}  // namespace Kdd::Browser
