#pragma once

namespace Kxg
{

class SqlConnection;

/// The version of the tables that this program works with.
int currentSchemaVersion();

/// Makes the tables or changes older ones step by step. Any number of processes may do so at once. Throws
/// DatabaseError, also when the tables are those of a newer program.
void bringSchemaUpToDate(SqlConnection& connection);

/// Throws DatabaseError unless the tables are those of this program.
void requireCurrentSchema(SqlConnection& connection);

/// Throws DatabaseError when there are no tables at all.
void requireSchema(SqlConnection& connection);

}  // namespace Kxg
