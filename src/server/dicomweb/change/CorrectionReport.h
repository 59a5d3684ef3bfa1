#pragma once

#include <QByteArray>
#include <QJsonArray>

#include <kddlib/QAData.h>

namespace Kdd::DicomWeb
{

/// What a correction changed, or would change, as "changes" below has it. False: there is more than that.
bool tellChanges(const QAData::Outcome& outcome, QJsonArray& changes);

/// What a correction did, or would do, as JSON. Images of which the same is told share one entry:
///
///     {"study": "1.2.3", "oldStudy": "1.2.1", "url": "https://.../studies/1.2.3", "preview": false,
///      "images": 20, "changed": 20, "moved": 0, "notFound": ["1.2.3.9"],
///      "changes": [{"count": 20, "images": ["1.2.3.1", ...],
///                   "attributes": [{"tag": "00100010", "keyword": "PatientName", "old": "A", "new": "B"}]}],
///      "complete": true}
///
/// "study" is where the images are now; "oldStudy" stands there of a move only. "complete" is false when there are more
/// changes than "changes" tells.
QByteArray correctionReport(const QAData& job, const QByteArray& root, bool isPreview);

}  // namespace Kdd::DicomWeb
