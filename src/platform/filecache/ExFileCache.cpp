#include "platform/filecache/ExFileCache.h"

#include "platform/os/PathName.h"
#include "platform/resources/ExResource.h"

#include <QCryptographicHash>
#include <QDir>
#include <QFile>
#include <QFileInfo>
#include <QSaveFile>

namespace Kdd
{

Result ExFileCache::init(const char* folder)
{
    const QByteArray name = folder == nullptr ? ExResource::fileCacheFolder() : QByteArray(folder);
    const QString path = QFile::decodeName(name);
    // Qt would find another folder than the bytes name, or none.
    if (!isPlainText(name))
        return Result::failure(QStringLiteral("The name of the file cache's folder %1 is no text").arg(path));
    if (path.isEmpty())
        return Result::failure(QStringLiteral("No folder is set for the file cache"));
    if (!QDir().mkpath(path) || !QFileInfo(path).isWritable())
        return Result::failure(QStringLiteral("The file cache cannot write to %1").arg(path));
    mFolder = QDir(path).absolutePath();
    return {};
}

QString ExFileCache::pathOf(const QByteArray& name) const
{
    // The hash makes a file name of any bytes, and none that leads out of the folder.
    const QByteArray hash = QCryptographicHash::hash(name, QCryptographicHash::Sha256).toHex();
    return mFolder + QLatin1Char('/') + QString::fromLatin1(hash);
}

Result ExFileCache::storeBuffer(const QByteArray& name, const QByteArray& bytes) const
{
    if (mFolder.isEmpty())
        return Result::failure(QStringLiteral("The file cache is not open"));
    // Writes beside the entry and takes its place at the end.
    QSaveFile file(pathOf(name));
    if (file.open(QIODevice::WriteOnly) && file.write(bytes) == bytes.size() && file.commit())
        return {};
    return Result::failure(file.errorString())
        .within(QStringLiteral("The file cache cannot store %1").arg(QString::fromUtf8(name)));
}

bool ExFileCache::readBuffer(const QByteArray& name, QByteArray& bytes) const
{
    QFile file(pathOf(name));
    if (mFolder.isEmpty() || !file.open(QIODevice::ReadOnly))
        return false;
    const QByteArray found = file.readAll();
    // A shorter answer than the file is a read that failed underway, not an entry.
    if (file.error() != QFileDevice::NoError || found.size() != file.size())
        return false;
    bytes = found;
    return true;
}

bool ExFileCache::removeBuffer(const QByteArray& name) const
{
    if (mFolder.isEmpty())
        return true;
    // Another process may be faster; what counts is that it is gone.
    const QString path = pathOf(name);
    return QFile::remove(path) || !QFile::exists(path);
}

}  // namespace Kdd
