#include "platform/database/SqliteFile.h"

#include "platform/database/SqlConnection.h"
#include "platform/os/StagedFile.h"

#include <unistd.h>

#include <filesystem>
#include <system_error>

namespace Kxg
{
namespace
{

/// By the name that the engine takes, which is UTF-8 whatever the locale says.
void provide(const QString& path, Kdd::IfAbsent ifAbsent)
{
    const std::filesystem::path file(path.toStdString());
    std::error_code error;
    // The engine flushes the names of its files, and nobody else those of the folders that it finds.
    if (ifAbsent == Kdd::IfAbsent::Create) {
        const Kdd::SystemResult made =
            Kdd::makeLastingFolder(QByteArray::fromStdString(file.parent_path().string()));
        error = std::error_code(made.error(), std::system_category());
    } else if (!std::filesystem::exists(file, error) && !error)
        error = std::make_error_code(std::errc::no_such_file_or_directory);
    if (error)
        throw DatabaseError(QString::fromStdString(error.message()));
}

bool hasLog(const QString& path)
{
    std::error_code error;
    // The size of an absent log is -1 here, that of an empty one 0.
    return std::filesystem::file_size((path + QLatin1String("-wal")).toStdString(), error) + 1 > 1;
}

bool isReadOnly(const QString& path)
{
    const QByteArray file = path.toUtf8();
    const QByteArray folder = file.left(qMax(1, file.lastIndexOf('/')));
    return ::access(file.constData(), R_OK) == 0 && ::access(folder.constData(), W_OK) != 0;
}

bool isSame(const timespec& one, const timespec& other)
{
    return one.tv_sec == other.tv_sec && one.tv_nsec == other.tv_nsec;
}

}  // namespace

SqliteFile::SqliteFile(const DatabaseAddress& address, Kdd::IfAbsent ifAbsent)
    : mPath(address.database)
    , mIsServer(address.engine != DatabaseAddress::Engine::Sqlite)
{
    if (mIsServer)
        return;
    provide(mPath, ifAbsent);
    mIsFixed = isReadOnly(mPath) && !hasLog(mPath);
    // Before the engine has it, so that no change of a fixed file comes in between.
    note();
}

QString SqliteFile::name() const
{
    if (!mIsFixed)
        return mPath;
    return QLatin1String("file:") + QString::fromLatin1(mPath.toUtf8().toPercentEncoding("/")) +
           QLatin1String("?immutable=1");
}

void SqliteFile::note()
{
    if (mIsServer || (mIsFixed && mState.st_ino != 0))
        return;
    if (::stat(mPath.toUtf8().constData(), &mState) != 0)
        mState = {};
}

bool SqliteFile::isAnother() const
{
    if (mIsServer)
        return false;
    struct stat now = {};
    if (::stat(mPath.toUtf8().constData(), &now) != 0 || now.st_ino != mState.st_ino ||
        now.st_dev != mState.st_dev)
        return true;
    return mIsFixed && (now.st_size != mState.st_size || !isSame(now.st_mtim, mState.st_mtim) ||
                        !isSame(now.st_ctim, mState.st_ctim) || hasLog(mPath));
}

}  // namespace Kxg
