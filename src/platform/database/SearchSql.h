#pragma once

#include "platform/database/SqlDialect.h"
#include "platform/database/StudySearch.h"

#include <QVariant>

namespace Kxg
{

/// A question of a search, as the engine takes it.
struct SearchSql
{
    QByteArray text;
    QVariantList values;
};

// Studies: id, uid, is_built, file_size, file_modified, digest, modalities, series, instances, attributes.
SearchSql studiesSql(const SqlDialect& dialect, const SearchQuery& query);

// Series: the same of the study, then uid, instances, attributes.
SearchSql seriesSql(const SqlDialect& dialect, const SearchQuery& query);

// Patients: number of studies, attributes.
SearchSql patientsSql(const SqlDialect& dialect, const SearchQuery& query);

// Their number, at most `most`.
SearchSql countStudiesSql(const SqlDialect& dialect, const SearchQuery& query, int most);
SearchSql countSeriesSql(const SqlDialect& dialect, const SearchQuery& query, int most);

}  // namespace Kxg
