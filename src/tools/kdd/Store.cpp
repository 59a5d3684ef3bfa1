#include "tools/kdd/Store.h"

#include "platform/base/LogFile.h"
#include "tools/kdd/Database.h"

#include <QByteArrayList>
#include <QDirIterator>
#include <QFileInfo>

namespace Kdd
{

namespace
{

/// Of the studies that a beginning fits so many are named.
constexpr int kNamesToTell = 3;

}  // namespace

QStringList storedTagFiles()
{
    QStringList paths;
    QDirIterator files(QString::fromLocal8Bit(TagFile::metaFolder()), {QStringLiteral("*.tc")}, QDir::Files,
                       QDirIterator::Subdirectories);
    while (files.hasNext()) {
        files.next();
        // One without content is just being made.
        if (files.fileInfo().size() > 0)
            paths.append(files.filePath());
    }
    paths.sort();
    return paths;
}

bool resolveStudy(const QByteArray& text, QByteArray& studyUID)
{
    if (QFileInfo::exists(TagFile::cacheFilePathForStudy(text.constData()))) {
        studyUID = text;
        return true;
    }
    const std::unique_ptr<Kxg::Catalogue> database = openDatabase();
    return database != nullptr && resolveStudy(*database, text, studyUID);
}

bool resolveStudy(Kxg::Catalogue& database, const QByteArray& text, QByteArray& studyUID)
{
    QVector<QByteArray> found;
    // Every UID begins with nothing, but whoever names nothing has not chosen a study.
    if (!text.isEmpty() && !succeeded(database.findStudies(text, kNamesToTell, found)))
        return false;
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
    return resolveStudy(text, studyUID) &&
           readStudyFile(TagFile::cacheFilePathForStudy(studyUID.constData()), file);
}

bool readStudyFile(const QString& path, TagFile& file)
{
    if (file.readWhenFree(path, nullptr, false))
        return true;
    if (!QFileInfo::exists(path) || file.wasLockedOut())
        LogFile::errorf("Could not open %s: %s", qUtf8Printable(path), qUtf8Printable(file.failure()));
    return false;
}

}  // namespace Kdd
