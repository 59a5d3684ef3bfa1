#pragma once

#include <QString>
#include <QTemporaryDir>

namespace Kdd
{

/// A folder of its own for tag files, in force as the meta folder while the object lives.
class TemporaryStore
{
public:
    TemporaryStore();

    QString folder() const { return mFolder.path(); }
    QString filePath(const char* name) const { return mFolder.filePath(QString::fromLatin1(name)); }

private:
    QTemporaryDir mFolder;
};

}  // namespace Kdd
