#pragma once

#include "platform/base/Result.h"

#include <QByteArray>
#include <QString>

namespace Kxg
{

/// Where an image database is, taken apart. A value.
struct DatabaseAddress
{
    enum class Engine { Sqlite, Postgres };

    Engine engine = Engine::Sqlite;
    QString database;  ///< its name on the server, or the absolute path of its file
    QString
        host;  ///< a name, or the folder of the server's local socket; empty: what the client library takes
    int port = -1;  ///< -1: likewise
    QString user;   ///< empty: likewise
    QString password;

    /// The address as log lines and errors may show it: without the password.
    QString shown;

    /// On failure, which tells what is wrong and shows no password, `address` stays as it was.
    static Kdd::Result parse(const QByteArray& text, DatabaseAddress& address);
};

}  // namespace Kxg
