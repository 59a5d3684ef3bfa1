#pragma once

#include "support/PostgresServer.h"

#include <QString>

#include <gtest/gtest.h>

namespace Kdd
{

/// What a database is kept by. A server's tests run with each.
enum class Engine { Sqlite, Postgres };

const auto kBothEngines = testing::Values(Engine::Sqlite, Engine::Postgres);

inline std::string engineName(const testing::TestParamInfo<Engine>& engine)
{
    return engine.param == Engine::Sqlite ? "Sqlite" : "Postgres";
}

/// The address of a database of a test's own, which is that file where files keep it.
inline QByteArray newDatabase(Engine engine, const QString& file)
{
    return engine == Engine::Postgres ? newPostgresDatabase() : "sqlite:" + file.toUtf8();
}

}  // namespace Kdd
