#include "tools/kdd/Store.h"

#include "platform/base/LogFile.h"

#include <QDirIterator>
#include <QFileInfo>

namespace Kdd
{

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
    QList<QByteArray> found;
    // Every UID begins with nothing, but whoever names nothing has not chosen a study.
    for (const QString& path : text.isEmpty() ? QStringList() : storedTagFiles()) {
        TagFile file;
        if (file.readCacheFile(path, nullptr, false) && file.studyInstanceUID().startsWith(text))
            found.append(file.studyInstanceUID());
    }
    if (found.size() == 1)
        studyUID = found.first();
    else if (found.isEmpty())
        LogFile::errorf("No study is named \"%s\"", text.constData());
    else
        LogFile::errorf("%d studies begin with %s", found.size(), text.constData());
    return found.size() == 1;
}

bool readStudy(const QByteArray& text, TagFile& file)
{
    QByteArray studyUID;
    return resolveStudy(text, studyUID) &&
           readStudyFile(TagFile::cacheFilePathForStudy(studyUID.constData()), file);
}

bool readStudyFile(const QString& path, TagFile& file)
{
    if (file.readCacheFile(path, nullptr, false))
        return true;
    if (!QFileInfo::exists(path))
        LogFile::errorf("Could not open %s: %s", qUtf8Printable(path), qUtf8Printable(file.failure()));
    return false;
}

}  // namespace Kdd
