#include "tools/kdd/Store.h"

#include "tools/kdd/Database.h"

#include <QByteArrayList>

#include <kddlib/ExResource.h>
#include <kddlib/FileStatus.h>
#include <kddlib/FileWalk.h>
#include <kddlib/Kxg.h>
#include <kddlib/LogFile.h>
#include <kddlib/PathName.h>

namespace Kdd
{

namespace
{

/// Of the studies that a beginning fits so many are named.
constexpr int kNamesToTell = 3;

}  // namespace

bool resolveStudy(const QByteArray& text, QByteArray& studyUID)
{
    // A whole UID needs no database, so that tag files can be looked at without one.
    if (presenceOf(TagFile::cacheFilePathForStudy(text.constData())) != FilePresence::Absent) {
        studyUID = text;
        return true;
    }
    const std::unique_ptr<Kxg::Catalogue> database = openExistingDatabase();
    return database != nullptr && resolveStudy(*database, text, studyUID);
}

bool resolveStudy(Kxg::Catalogue& database, const QByteArray& text, QByteArray& studyUID)
{
    QVector<QByteArray> found;
    // Every UID begins with nothing, but whoever names nothing has not chosen a study.
    if (!text.isEmpty() && !succeeded(database.findStudies(text, kNamesToTell, found)))
        return false;
    // A whole UID means its study, also when longer ones begin with it.
    if (found.size() == 1 || found.contains(text)) {
        studyUID = found.contains(text) ? text : found.first();
        return true;
    }
    if (found.isEmpty())
        LogFile::errorf("No study is named \"%s\"", text.constData());
    else
        LogFile::errorf("Several studies begin with %s: %s, ...", text.constData(),
                        QByteArrayList(found.toList()).join(", ").constData());
    return false;
}

bool readStudy(const QByteArray& text, TagFile& file)
{
    QByteArray studyUID;
    return resolveStudy(text, studyUID) && readStudyFile(studyUID, file);
}

bool readStudyFile(const QByteArray& studyUID, TagFile& file)
{
    if (file.readWhenFreeForStudy(studyUID.constData(), false))
        return true;
    const QString path = TagFile::cacheFilePathForStudy(studyUID.constData());
    const bool isEmpty = presenceOf(path) == FilePresence::Empty;
    // Such a file may have been left by a writer that died before it wrote anything.
    const QString reason = isEmpty ? QStringLiteral("it is empty") : file.failure();
    LogFile::errorf("Study %s cannot be read from %s: %s", studyUID.constData(), qUtf8Printable(path),
                    qUtf8Printable(reason));
    return false;
}

bool readTagFile(const QString& path, TagFile& file)
{
    if (file.readWhenFree(path, nullptr, false))
        return true;
    // Of these two the reader says nothing itself, because callers know what they mean.
    if (presenceOf(path) == FilePresence::Absent || file.wasLockedOut())
        LogFile::errorf("Could not open %s: %s", qUtf8Printable(path), qUtf8Printable(file.failure()));
    return false;
}

qint64 sizeOf(const QString& path)
{
    FileStatus status;
    return statusOf(pathBytes(path).constData(), status) ? status.size : 0;
}

QByteArray objectFolder(const GlobalOptions& options)
{
    const QByteArray configured = ExResource::objectsFolder();
    return configured.isEmpty() ? pathBytes(options.objectFolder()) : configured;
}

QList<QByteArray> ownPlaces(const GlobalOptions& options)
{
    // Folders end in a slash, files do not.
    QList<QByteArray> places = {absolutePath(TagFile::metaFolder()) + '/',
                                absolutePath(pathBytes(options.volumeFolder())) + '/',
                                // Those that are whole may be taken in anew, but not what is just arriving.
                                absolutePath(objectFolder(options)) + "/.incoming/"};
    const QByteArray address = Kxg::DatabaseServer();
    // A server keeps its files elsewhere.
    if (address.startsWith("sqlite:")) {
        const QByteArray database = absolutePath(address.mid(7));
        for (const char* suffix : {"", "-wal", "-shm", "-journal", ".claims"})
            places.append(database + suffix);
    }
    return places;
}

}  // namespace Kdd
