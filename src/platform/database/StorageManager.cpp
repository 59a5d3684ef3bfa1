#include "platform/database/StorageManager.h"

#include "platform/database/Kxg.h"
#include "platform/database/QuestionConnection.h"
#include "platform/database/SqlConnection.h"

#include <QMap>

#include <mutex>

namespace Kxg
{
namespace
{

const char kSection[] = "Storage";
const char kVolumeKey[] = "Volume";

std::mutex sMutex;
QVector<QByteArray> sVolumes;  // guarded by sMutex

/// 0 for the key of something else.
int volumeNumber(const QByteArray& key)
{
    return key.startsWith(kVolumeKey) ? key.mid(static_cast<int>(sizeof kVolumeKey) - 1).toInt() : 0;
}

}  // namespace

QByteArray StorageManager::getMetaFolder()
{
    return GetGlobalConfig(kSection, "MetaFolder", QByteArray());
}

Kdd::Result StorageManager::retrieveStorageVolumes()
{
    // By number, since the bytes of the names would put the tenth before the second.
    QMap<int, QByteArray> volumes;
    Kdd::Result result = askDatabase([&](SqlConnection& connection) {
        SqlRows rows =
            connection.ask("SELECT name, value FROM config WHERE section = ?", {textValue(kSection)});
        while (rows.next())
            if (const int number = volumeNumber(rows.text(0)); number > 0)
                volumes.insert(number, rows.bytes(1));
    });
    // The folders known so far stay when the database cannot be asked.
    if (result.good()) {
        const std::lock_guard<std::mutex> locker(sMutex);
        sVolumes = volumes.values().toVector();
    }
    return result;
}

QVector<QByteArray> StorageManager::storageVolumes()
{
    const std::lock_guard<std::mutex> locker(sMutex);
    return sVolumes;
}

}  // namespace Kxg
