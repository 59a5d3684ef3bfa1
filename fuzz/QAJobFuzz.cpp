// A job that is accepted has a value, and a place of its own, for every attribute; it can be told in audit logs; and
// the log that it leaves in an image can be read back. A text that is no log is never taken for one of other bytes.

#include "fuzz/Property.h"
#include "kddlib/tagfile/qa/QAAudit.h"
#include "kddlib/tagfile/qa/QAEditor.h"
#include "kddlib/tagmodel/TagElement.h"
#include "kddlib/tagmodel/TagMap.h"

#include <dcmtk/dcmdata/dcdeftag.h>

#include <set>

using namespace Kdd;

namespace
{

void checkJob(const QAData& job)
{
    std::set<DcmTagKey> keys;
    for (const QASubstitution& each : job.substitutions) {
        require(keys.insert(each.key).second, "an attribute is replaced once");
        require(!each.value.isNull() || each.key == DCM_PixelData, "an attribute has a value");
    }
    QString time;
    require(auditTime(job.timestamp, time), "the timestamp is a time");
}

/// What is put into an image is what it shows then, and doing it again changes nothing.
void checkEdit(const QAData& job)
{
    TagMap image;
    QAEditor editor(image, job.substitutions);
    for (const QASubstitution& each : job.substitutions) {
        if (editor.substitute(each).bad())
            return;
    }
    QAEditor again(image, job.substitutions);
    for (const QASubstitution& each : job.substitutions)
        require(each.key == DCM_PixelData || again.substitute(each).good(), "what was done can be done");
    require(again.changes().isEmpty(), "what was done changes nothing");

    AuditLog log;
    QVector<AuditEntry> entries;
    log.append({QString(), editor.changes()});
    require(log.decode(entries) && entries.size() == 1 && entries.first().changes == editor.changes(),
            "a log is read back");
}

/// The bytes as the log of an image.
void checkLog(const QByteArray& bytes)
{
    TagMap image;
    image.putAndInsertValue(DcmTagKey(0x0071, 0x0021), "Korvex", VrCode::UT, bytes.toBase64());
    AuditLog log;
    QVector<AuditEntry> entries;
    require(log.read(image) && log.text() == bytes, "a log is what the image holds");
    if (!log.decode(entries))
        return;
    AuditLog same;
    for (const AuditEntry& entry : entries)
        same.append(entry);
    QVector<AuditEntry> entriesAgain;
    require(same.decode(entriesAgain) && entriesAgain.size() == entries.size(), "a log is read back");
    for (int i = 0; i < entries.size(); ++i)
        require(entriesAgain.at(i).changes == entries.at(i).changes, "a log is read back as it was");
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, std::size_t size)
{
    const QByteArray bytes = bytesOf(data, size);
    checkLog(bytes);
    QAData job;
    job.studyUID = "1.2";
    QString message;
    if (!job.parse(bytes, message)) {
        require(!message.isEmpty(), "a fault is told");
        return 0;
    }
    checkJob(job);
    if (check(job).good())
        checkEdit(job);
    return 0;
}
