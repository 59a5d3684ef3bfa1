#include "kddlib/tagfile/TagFileSettings.h"

#include "platform/base/LogFile.h"
#include "platform/database/StorageManager.h"
#include "platform/os/PathName.h"
#include "platform/resources/ExResource.h"

#include <QCryptographicHash>

#include <mutex>

namespace Kdd
{

TagFileSettings::CompressionMode TagFileSettings::sCompressionMode = CompressionMode::Zlib;
Vec2i TagFileSettings::sPreviewSize = {256, 256};
unsigned int TagFileSettings::sDebugOptions = 0;
QByteArray TagFileSettings::sMetaFolder;
TagFileSettings::Durability TagFileSettings::sDurability = Durability::Process;

const char* TagFileSettings::metaFolder()
{
    // A program that only has the C functions cannot set the folder at its start: threads may come here together.
    static std::mutex mutex;
    const std::lock_guard<std::mutex> lock(mutex);
    if (!sMetaFolder.isEmpty())
        return sMetaFolder.constData();
    QByteArray configured = ExResource::metaFolder();
    if (configured.isEmpty())
        configured = Kxg::StorageManager::getMetaFolder();
    // Not kept: a database that cannot be asked now may answer the next time.
    if (configured.isEmpty())
        return "./";
    setMetaFolder(configured.constData());
    return sMetaFolder.constData();
}

void TagFileSettings::setMetaFolder(const char* path)
{
    sMetaFolder = QByteArray(path);
    sMetaFolder.replace('\\', '/');
    if (sMetaFolder.isEmpty())
        sMetaFolder = ".";
    if (!sMetaFolder.endsWith('/'))
        sMetaFolder.append('/');
    // A host that logs everything through a callback of its own would get the line before it is ready for lines.
    if (LogFile::level() != LogFile::Level::Everything || !LogFile::hasCallback())
        LogFile::printf("Meta folder set to %s", sMetaFolder.constData());
}

QString TagFileSettings::cacheFilePathForStudy(const char* studyUID)
{
    // Two levels of folders keep each of them small, and a hash fills them evenly: UIDs begin alike.
    const QByteArray hash =
        QCryptographicHash::hash(QByteArray(studyUID) + '\n', QCryptographicHash::Md5).toHex();
    return pathText(metaFolder()) +
           QString::fromLatin1(hash.left(2) + '/' + hash.mid(2, 2) + '/' + hash.mid(4) + kSuffix);
}

}  // namespace Kdd
