#include "tools/kdd/Store.h"

#include "platform/base/LogFile.h"
#include "platform/os/FileStatus.h"
#include "platform/os/PathName.h"
#include "tools/kdd/Database.h"

#include <QByteArrayList>

#include <filesystem>
#include <system_error>

namespace Kdd
{

namespace
{

bool isThere(const QString& path)
{
    FileStatus status;
    return statusOf(pathBytes(path).constData(), status);
}

/// Of the studies that a beginning fits so many are named.
constexpr int kNamesToTell = 3;

}  // namespace

QStringList storedTagFiles()
{
    QStringList paths;
    // Not by way of Qt, which does not know every name that a folder may have.
    std::error_code error;
    std::filesystem::recursive_directory_iterator files(TagFile::metaFolder(), error);
    for (; !error && files != std::filesystem::recursive_directory_iterator(); files.increment(error)) {
        std::error_code unknown;
        // One without content is just being made.
        if (files->path().extension() == ".tc" && files->is_regular_file(unknown) &&
            files->file_size(unknown) > 0)
            paths.append(pathText(QByteArray::fromStdString(files->path().native())));
    }
    paths.sort();
    return paths;
}

bool resolveStudy(const QByteArray& text, QByteArray& studyUID)
{
    if (isThere(TagFile::cacheFilePathForStudy(text.constData()))) {
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
    if (!isThere(path) || file.wasLockedOut())
        LogFile::errorf("Could not open %s: %s", qUtf8Printable(path), qUtf8Printable(file.failure()));
    return false;
}

}  // namespace Kdd
