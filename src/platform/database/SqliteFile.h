#pragma once

#include "platform/base/IfAbsent.h"
#include "platform/database/DatabaseAddress.h"

#include <QString>

#include <sys/stat.h>

namespace Kxg
{

/// The file of an SQLite database as one connection has it open. For a server it stands for nothing and never changes.
/// What fails throws DatabaseError.
class SqliteFile
{
public:
    /// The file is there afterwards, or at least its folder when it may be made.
    SqliteFile(const DatabaseAddress& address, Kdd::IfAbsent ifAbsent);

    /// Whether nobody changes the file, because its folder can be read only and no process has left changes in its log:
    /// the engine would want to make files beside it otherwise.
    bool isFixed() const { return mIsFixed; }

    /// By which the engine opens it; that of a fixed file has it make no files beside it and lock nothing.
    QString name() const;

    /// To be called once the engine has it open.
    void note();

    /// Whether the address leads to another file by now, or to none, or somebody changed a fixed one after all.
    bool isAnother() const;

private:
    const QString mPath;
    const bool mIsServer;
    bool mIsFixed = false;
    struct stat mState = {};
};

}  // namespace Kxg
