#pragma once

#include <QJsonObject>

namespace Kdd
{

class TagFile;

}  // namespace Kdd

namespace Kdd::Browser
{

/// Corrections of one answer.
constexpr int kMaxCorrections = 500;

/// What the audit logs of a study's images tell. Images of which a correction says the same share one entry:
///
///     {"corrections": [{"time": "31/1/2024 12:00:00 PM anna", "count": 20, "images": ["1.2.3", ...],
///                       "changes": [{"tag": "00100010", "name": "PatientName", "old": "A", "new": "B"}]}],
///      "complete": true, "unreadable": 0}
///
/// "images" names the first few of "count". "unreadable" counts images whose log is damaged.
QJsonObject correctionsOf(const TagFile& file);

}  // namespace Kdd::Browser
