#pragma once

#include "platform/base/Export.h"

#include <QByteArray>
#include <QString>
#include <QVector>

#include <dcmtk/config/osconfig.h>

#include <dcmtk/dcmdata/dctagkey.h>

namespace Kdd
{

class TagMap;

/// One attribute that a correction changed. Of Pixel Data the old text is empty and the new one is a remark.
struct AuditChange
{
    DcmTagKey key;
    QString oldText;
    QString newText;

    bool operator==(const AuditChange& other) const
    {
        return key == other.key && oldText == other.oldText && newText == other.newText;
    }
};

/// What one correction did to one image.
struct AuditEntry
{
    QString time;  ///< and who did it, when that is known; of Latin-1
    QVector<AuditChange> changes;
};

/// The audit log of an image: all its corrections, the oldest first. The image keeps it as base64, VR UT, in (0071,xx21)
/// of our private creator. Before that it is text, ended lines all of them:
///
///     time                  in Latin-1
///     gggg-eeee             key, in lower-case hexadecimal digits
///     old text              in UTF-8
///     new text              in UTF-8
///     ...                   three lines more for every further change
///                           an empty line ends the entry
///
/// A line feed inside a text is written as ESC "n" and an ESC as ESC "e". Each thread uses a copy of its own.
class KDD_EXPORT AuditLog
{
public:
    /// False, with the log as it was, when what the image holds is no base64. An image without log has an empty one.
    bool read(const TagMap& image);

    void append(const AuditEntry& entry);

    /// Where the image keeps its log and the time of its last entry, as far as it has them.
    static QVector<DcmTagKey> keysIn(const TagMap& image);

    /// Replaces the log that the image holds. False when no private block is free.
    bool store(TagMap& image) const;

    const QByteArray& text() const { return mText; }

    /// The entries; false, with `entries` as they were, when the text is not of the form above.
    bool decode(QVector<AuditEntry>& entries) const;

private:
    QByteArray mText;
};

}  // namespace Kdd
