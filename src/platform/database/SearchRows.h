#pragma once

#include "platform/database/Catalogue.h"

namespace Kxg
{

class SqlConnection;

// The rows of studies that searches ask. Call within a transaction; failures throw DatabaseError.

/// What a row was taken from.
struct SearchRowState
{
    bool isThere = false;
    bool isBuilt = false;  ///< from a tag file; else from what registration knows
    TagFileStamp tagFile;
    int instances = 0;
};

SearchRowState searchRowOf(SqlConnection& connection, qint64 studyId);

/// Puts a study's rows in place of earlier ones. `tagFile` is what they were taken from.
void putSearchRows(SqlConnection& connection, qint64 studyId, const StudySearchRecord& study,
                   const TagFileStamp& tagFile);

/// Gives a study that has no tag file yet rows of what registration knows; one that has keeps its rows.
void putRegisteredRows(SqlConnection& connection, qint64 studyId);

/// Gives the rows of a study the marks of its attributes.
void putMarks(SqlConnection& connection, qint64 studyId);

void removeSearchRows(SqlConnection& connection, qint64 studyId);

}  // namespace Kxg
