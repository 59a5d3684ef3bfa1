#pragma once

#include "platform/database/SearchSql.h"

namespace Kxg
{

/// The studies or series that a search finds, as "FROM ... WHERE ...": the table that it begins with, what is joined to
/// it, and the conditions.
///
/// Whose studies these may be is said first, and holds for whatever table it begins with: no condition and no table comes
/// in by another way, so that none can pass by the limits.
class SearchSelection
{
public:
    enum class Start {
        Studies,     ///< as `s`
        Modalities,  ///< of studies, as `m`; each has those of the study's columns by which lists are walked
        Series,      ///< as `r`, with their studies as `s`
    };

    /// Limits: null: all studies.
    SearchSelection(const SqlDialect& dialect, const StudyLimits* limits, Start start);

    Start start() const { return mStart; }

    /// A column of the study by its name in study_search: that of the first table where it has one, else that of the study,
    /// which is joined then.
    QByteArray study(const QByteArray& column);

    /// All of them hold. They name columns of studies as `study` does.
    void add(const SearchSql& condition) { mConditions.require(condition); }

    SearchSql sql() const;

private:
    const Start mStart;
    bool mHasStudy;
    SearchSql mConditions;
};

}  // namespace Kxg
