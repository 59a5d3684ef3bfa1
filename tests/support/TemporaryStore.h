#pragma once

#include <QString>
#include <QTemporaryDir>

namespace Kdd
{

/// A folder of its own for tag files, in force as the meta folder while the object lives. No database that lay in it is asked
/// afterwards.
class TemporaryStore
{
public:
    TemporaryStore();
    ~TemporaryStore();
    TemporaryStore(const TemporaryStore&) = delete;
    TemporaryStore& operator=(const TemporaryStore&) = delete;

    QString folder() const { return mFolder.path(); }
    QString filePath(const char* name) const { return mFolder.filePath(QString::fromLatin1(name)); }

private:
    QTemporaryDir mFolder;
};

}  // namespace Kdd
