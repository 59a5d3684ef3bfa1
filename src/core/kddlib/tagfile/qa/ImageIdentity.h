#pragma once

#include "kddlib/tagfile/qa/QAAudit.h"

#include <QByteArray>

namespace Kdd
{

class TagMap;

/// By what one image is told from all others.
struct ImageIdentity
{
    QByteArray studyUID;
    QByteArray image;  ///< SOP Instance UID, or where there is none the path of the file

    bool operator==(const ImageIdentity& other) const
    {
        return studyUID == other.studyUID && image == other.image;
    }
    bool operator!=(const ImageIdentity& other) const { return !(*this == other); }
};

/// Of an image as it comes from the file at the path.
ImageIdentity identityOf(const TagMap& image, const QByteArray& path);

/// What the image whose file lies at the path was before the first of the corrections that the log tells of; `now` when
/// none changed that.
ImageIdentity identityBefore(const AuditLog& log, const ImageIdentity& now, const QByteArray& path);

/// Whether a log tells all that the other one tells, and then more or nothing.
bool isSameOrContinued(const AuditLog& earlier, const AuditLog& later);

/// Whether `log` goes on where `before` ends, and with these changes: then its image is the one that they corrected.
bool isContinued(const AuditLog& before, const QVector<AuditChange>& changes, const AuditLog& log);

}  // namespace Kdd
