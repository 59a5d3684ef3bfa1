#include "support/TemporaryStore.h"

#include "kddlib/tagfile/TagFile.h"

namespace Kdd
{

TemporaryStore::TemporaryStore()
{
    TagFile::setMetaFolder((mFolder.path() + QStringLiteral("/meta")).toLocal8Bit().constData());
}

}  // namespace Kdd
