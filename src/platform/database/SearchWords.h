#pragma once

namespace Kxg
{

class SqlConnection;

/// Makes the table of the texts that are searched for parts, with the engine's index for that. Call within a
/// transaction; failures throw DatabaseError. A server that has no such index, or does not let us use it, is told of in the
/// log; searches then read the table through.
void makeWordsTable(SqlConnection& connection);

/// Cuts what is longer than any name has to be and than a server takes into an index.
void boundNames(SqlConnection& connection);

/// Makes a server that weighs indexes against each other know the names of a table better than it does by default.
void refineStatistics(SqlConnection& connection, const char* table);

/// Makes the index of parts of the names that stand with modalities where the others are.
void indexModalityNames(SqlConnection& connection);

/// Makes the index when it is not there and can be had now. Whether it is there.
bool obtainWordsIndex(SqlConnection& connection);

}  // namespace Kxg
