#include "platform/database/SearchSelection.h"

#include "platform/database/SearchLimits.h"

namespace Kxg
{
namespace
{

/// What each modality of a study has along, in the index of its list.
bool isOfModality(const QByteArray& column)
{
    return column == "study_id" || column == "uid" || column == "study_date" || column == "study_time" ||
           column == "name_words" || column == "marks";
}

}  // namespace

SearchSelection::SearchSelection(const SqlDialect& dialect, const StudyLimits* limits, Start start)
    : mStart(start)
    , mHasStudy(start != Start::Modalities)
{
    if (limits != nullptr)
        addLimits(*this, dialect, *limits);
}

QByteArray SearchSelection::study(const QByteArray& column)
{
    if (mStart == Start::Modalities && isOfModality(column))
        return "m." + column;
    mHasStudy = true;
    return "s." + column;
}

SearchSql SearchSelection::sql() const
{
    QByteArray from = " FROM study_search s";
    if (mStart == Start::Modalities)
        from = " FROM study_modality m";
    else if (mStart == Start::Series)
        from = " FROM series_search r";
    if (mStart != Start::Studies && mHasStudy)
        from += QByteArray(" JOIN study_search s ON s.study_id = ") + (mStart == Start::Series ? "r" : "m") +
                ".study_id";
    return {mConditions.isEmpty() ? from : from + " WHERE " + mConditions.text, mConditions.values};
}

}  // namespace Kxg
