#pragma once

#include <QByteArray>

namespace Kdd
{

// A database server of the test binary's own, with its data and its socket in a temporary folder. It starts when it is
// first asked for and ends after the last test and, however that came about, with the process. What fails throws
// std::runtime_error with the server's words.

/// Makes an empty database: its address.
QByteArray newPostgresDatabase();

/// The address of a database on the server, which need not be there.
QByteArray postgresAddress(const QByteArray& database);

// It can be away for a time, with its data kept. Its connections are gone then.
void stopPostgres();
void startPostgres();

/// While it lives no process of the server does anything, and its machine takes what is sent to it all the same.
class FrozenPostgres
{
public:
    FrozenPostgres();
    ~FrozenPostgres();
    FrozenPostgres(const FrozenPostgres&) = delete;
    FrozenPostgres& operator=(const FrozenPostgres&) = delete;
};

/// Runs a statement over a connection of its own.
void runOnPostgres(const QByteArray& sql, const QByteArray& address = postgresAddress("postgres"));

}  // namespace Kdd
