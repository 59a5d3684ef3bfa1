#include "support/TemporaryStore.h"

#include "kddlib/tagfile/TagFile.h"
#include "platform/database/Kxg.h"

namespace Kdd
{

TemporaryStore::TemporaryStore()
{
    TagFile::setMetaFolder((mFolder.path() + QStringLiteral("/meta")).toLocal8Bit().constData());
}

TemporaryStore::~TemporaryStore()
{
    Kxg::SetDatabaseServer(QByteArray());
}

}  // namespace Kdd
