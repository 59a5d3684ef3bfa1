#include "kddlib/tagfile/qa/ImageIdentity.h"

#include "kddlib/tagmodel/TagMap.h"

#include <dcmtk/dcmdata/dcdeftag.h>

namespace Kdd
{

namespace
{

/// The text that the first change of the attribute replaced.
QByteArray firstText(const QVector<AuditEntry>& entries, const DcmTagKey& key, const QByteArray& otherwise)
{
    for (const AuditEntry& entry : entries) {
        for (const AuditChange& change : entry.changes) {
            if (change.key == key)
                return change.oldText.toUtf8();
        }
    }
    return otherwise;
}

}  // namespace

ImageIdentity identityOf(const TagMap& image, const QByteArray& path)
{
    const QByteArray sopUID = image.uid(TagMap::ImageLevel);
    return {image.uid(TagMap::StudyLevel), sopUID.isEmpty() ? path : sopUID};
}

ImageIdentity identityBefore(const AuditLog& log, const ImageIdentity& now, const QByteArray& path)
{
    QVector<AuditEntry> entries;
    if (!log.decode(entries))
        return now;
    const QByteArray image = firstText(entries, DCM_SOPInstanceUID, now.image);
    // An image that had no UID before the correction was known by its path.
    return {firstText(entries, DCM_StudyInstanceUID, now.studyUID), image.isEmpty() ? path : image};
}

bool isSameOrContinued(const AuditLog& earlier, const AuditLog& later)
{
    return later.text().startsWith(earlier.text());
}

bool isContinued(const AuditLog& before, const QVector<AuditChange>& changes, const AuditLog& log)
{
    QVector<AuditEntry> earlier;
    QVector<AuditEntry> entries;
    return log.text().startsWith(before.text()) && before.decode(earlier) && log.decode(entries) &&
           entries.size() > earlier.size() && entries.at(earlier.size()).changes == changes;
}

}  // namespace Kdd
