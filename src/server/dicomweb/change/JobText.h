#pragma once

#include <QByteArray>
#include <QString>

namespace Kdd
{

struct QAData;

}  // namespace Kdd

namespace Kdd::DicomWeb
{

enum class JobForm { Xml, Json };

/// Takes a correction from its text, in either form at most `kMaxJobXml` bytes. The XML is that of `QAData`; the JSON says the
/// same, and which images are meant:
///
///     {"timestamp": "20240131120000", "login": "anna", "oldStudy": "1.2.3",
///      "tags": [{"tag": "00100010", "value": "Doe^Jane"}],
///      "images": ["1.2.4.1"], "series": ["1.2.4"], "wholeStudy": false}
///
/// Each member may be left out, of an object in "tags" none but the value of Pixel Data. Nothing else may stand there, and
/// nothing twice. False, with the job as it was and the reason, for a text that is no job.
bool readJob(const QByteArray& text, JobForm form, QAData& job, QString& reason);

}  // namespace Kdd::DicomWeb
