#pragma once

#include "platform/base/Export.h"
#include "platform/base/Result.h"

#include <QByteArray>
#include <QVector>

namespace Kxg
{

/// Where things are stored, as the database's configuration says: section "Storage", keys "MetaFolder" and
/// "Volume1", "Volume2", ... (the folders below which DICOM files lie). May be used on any thread.
class KDD_EXPORT StorageManager
{
public:
    /// The folder of the tag files; empty when none is configured.
    static QByteArray getMetaFolder();

    /// Asks the database again.
    static Kdd::Result retrieveStorageVolumes();

    /// As they were last retrieved.
    static QVector<QByteArray> storageVolumes();
};

}  // namespace Kxg
