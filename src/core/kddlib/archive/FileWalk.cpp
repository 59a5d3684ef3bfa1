#include "kddlib/archive/FileWalk.h"

#include "kddlib/net/http/ObjectAddress.h"
#include "kddlib/tagfile/TagFileSettings.h"
#include "platform/base/LogFile.h"
#include "platform/os/FileStatus.h"
#include "platform/os/PathName.h"

#include <algorithm>
#include <filesystem>
#include <system_error>
#include <vector>

namespace Kdd
{

namespace
{

QByteArray bytes(const std::filesystem::path& path)
{
    return QByteArray::fromStdString(path.native());
}

QString fault(const std::filesystem::path& path, const std::error_code& error)
{
    return QStringLiteral("%1: %2").arg(QString::fromLocal8Bit(bytes(path)),
                                        QString::fromStdString(error.message()));
}

void collect(const std::filesystem::directory_entry& place, const QByteArray& absolute,
             QList<QByteArray>& files, QStringList& faults);

void collectBelow(const std::filesystem::path& folder, const QByteArray& absolute, QList<QByteArray>& files,
                  QStringList& faults)
{
    std::error_code error;
    // Listed before anything below is entered, so that no more than one folder is open at a time, and
    // sorted, because file systems list in any order.
    std::vector<std::filesystem::directory_entry> entries;
    for (std::filesystem::directory_iterator it(folder, error), end; !error && it != end; it.increment(error))
        entries.push_back(*it);
    if (error)
        faults.append(fault(folder, error));
    std::sort(entries.begin(), entries.end(),
              [](const auto& a, const auto& b) { return a.path().native() < b.path().native(); });
    const QByteArray above = absolute.endsWith('/') ? absolute : absolute + '/';
    const std::size_t head = folder.native().size() + (folder.native().back() == '/' ? 0 : 1);
    for (const std::filesystem::directory_entry& entry : entries) {
        // A linked folder may lead back up; linked files are welcome.
        if (!entry.is_symlink(error) || !entry.is_directory(error))
            collect(entry, above + QByteArray::fromStdString(entry.path().native().substr(head)), files,
                    faults);
    }
}

/// Pipes, sockets and devices are no files; a link that leads nowhere is taken for one, so that its reading tells. The
/// listing of a folder mostly tells what an entry is, and nobody else is asked then.
void collect(const std::filesystem::directory_entry& place, const QByteArray& absolute,
             QList<QByteArray>& files, QStringList& faults)
{
    std::error_code error;
    if (place.is_directory(error))
        collectBelow(place.path(), absolute, files, faults);
    else if (place.is_regular_file(error) || !std::filesystem::is_other(place.status(error)))
        files.append(absolute);
}

}  // namespace

QByteArray absolutePath(const QByteArray& path)
{
    if (isObjectAddress(path))
        return path;
    QByteArray absolute = bytes(std::filesystem::absolute(path.toStdString()).lexically_normal());
    // A folder is one path, however it was written: what is known of it is asked for by that.
    if (absolute.size() > 1 && absolute.endsWith('/'))
        absolute.chop(1);
    return absolute;
}

QList<QByteArray> filesBelow(const QList<QByteArray>& paths, QStringList& faults)
{
    QList<QByteArray> files;
    for (const QByteArray& path : paths) {
        const std::filesystem::path place(path.toStdString());
        std::error_code error;
        // Of the link itself: one that leads nowhere is there, and reading it tells what is wrong.
        if (std::filesystem::exists(std::filesystem::symlink_status(place, error)))
            collect(std::filesystem::directory_entry(place, error), absolutePath(path), files, faults);
        else
            faults.append(
                fault(place, error ? error : std::make_error_code(std::errc::no_such_file_or_directory)));
    }
    return files;
}

QStringList tagFilesOfArchive()
{
    const QString meta = pathText(TagFileSettings::metaFolder());
    const QByteArray folder = absolutePath(TagFileSettings::metaFolder());
    QStringList found;
    if (presenceOf(meta) == FilePresence::Absent)
        return found;
    QStringList faults;
    for (const QByteArray& file : filesBelow({folder}, faults)) {
        if (file.endsWith(TagFileSettings::kSuffix))
            found.append(meta + pathText(file.mid(folder.size() + 1)));
    }
    for (const QString& fault : qAsConst(faults))
        LogFile::errorf("Could not look into %s", qUtf8Printable(fault));
    found.sort();
    return found;
}

}  // namespace Kdd
