#pragma once

#include <QFile>
#include <QString>

#include <kddlib/ObjectVersion.h>

namespace Kdd
{

/// A file that is being fetched: it bears its name only once it is complete, and "NAME.part" until then.
///
/// Beside the part stands "NAME.part.json", which tells of what it is the beginning, so that a later run can go on
/// there. The part is locked as long as the object lives; what it holds stays when it goes.
class PartialFile
{
public:
    /// Of what a part is the beginning.
    struct Origin
    {
        QByteArray url;
        ObjectVersion version;
        qint64 length = 0;  // [bytes]; 0: not known

        /// Whether a later run can tell that it is the same object.
        bool isRecognisable() const { return length > 0 && version.isKnown(); }
    };

    explicit PartialFile(QString target);

    QString path() const { return mTarget + QStringLiteral(".part"); }

    /// Opens or creates the part. False, with the reason logged, when another process fetches the same file or the
    /// system refuses.
    bool open();

    qint64 size() const { return mFile.size(); }

    /// What the part is the beginning of; not recognisable when that is not known, or when bytes may have been lost
    /// because the machine was restarted before they were on disk.
    Origin origin() const;

    /// Drops what is there and notes what follows. False, with the reason logged, when that is not possible.
    bool startOver(const Origin& origin);

    /// To go on with what is there. False, with the reason logged, when that is not possible.
    bool goToEnd();

    /// False, with the reason logged, when not all was written.
    bool append(const char* bytes, qint64 count);

    /// Gives the file its name, in place of one that bore it. False, with the reason logged, when that is not
    /// possible; then the part stays.
    bool publish(bool flush);

    /// Removes a part without content.
    void removeIfEmpty();

private:
    QString recordPath() const { return path() + QStringLiteral(".json"); }
    bool refuse(const char* action, const QString& reason) const;

    QString mTarget;
    QFile mFile;
};

}  // namespace Kdd
