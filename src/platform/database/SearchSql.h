#pragma once

#include "platform/database/SqlDialect.h"
#include "platform/database/StudySearch.h"

#include <QSet>
#include <QVariant>

namespace Kxg
{

/// A question of a search or a condition of one, as the engine takes it.
struct SearchSql
{
    QByteArray text;
    QVariantList values;

    bool isEmpty() const { return text.isEmpty(); }

    /// Of conditions: another has to hold, too. An empty one is none.
    void require(const SearchSql& condition);
};

/// Whether so many texts have what a pattern asks for that walking the list finds a page sooner than to find all of them;
/// an empty text when the engine decides by itself.
SearchSql isFrequentSql(const SqlDialect& dialect, const SearchTerm& term, const QByteArray& pattern);

// Each but what is shown leaves out the studies that are not within `limits`, where that is not null.
//
// Studies: the ids of the page, in order. What it shows is large, and would be carried through the sorting.
//
// `frequent` are the patterns that so many studies have that walking the list finds a page sooner than the index.
SearchSql studyIdsSql(const SqlDialect& dialect, const SearchQuery& query, const StudyLimits* limits,
                      const QSet<QByteArray>& frequent = {});

// What is shown of the studies of these ids, in any order: id, uid, is_built, file_size, file_modified, digest, modalities,
// series, instances, attributes. The text is always the same.
SearchSql shownStudiesSql(const SqlDialect& dialect, const QVector<int>& ids);

// Series: the same of the study, then uid, instances, attributes.
SearchSql seriesSql(const SqlDialect& dialect, const SearchQuery& query, const StudyLimits* limits);

// Patients: number of studies, attributes.
SearchSql patientsSql(const SqlDialect& dialect, const SearchQuery& query, const StudyLimits* limits);

// UIDs, all of them.
SearchSql visibleSql(const SqlDialect& dialect, const SearchQuery& query, const StudyLimits& limits);

// Their number, at most `most`.
SearchSql countStudiesSql(const SqlDialect& dialect, const SearchQuery& query, const StudyLimits* limits,
                          int most);
SearchSql countSeriesSql(const SqlDialect& dialect, const SearchQuery& query, const StudyLimits* limits,
                         int most);

}  // namespace Kxg
