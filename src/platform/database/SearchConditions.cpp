#include "platform/database/SearchConditions.h"

#include "platform/database/SearchColumns.h"
#include "platform/database/SqlConnection.h"

namespace Kxg
{
namespace
{

QVariantList texts(const QVector<QByteArray>& values)
{
    QVariantList list;
    for (const QByteArray& value : values)
        list << textValue(value);
    return list;
}

QByteArray places(const QVector<QByteArray>& values)
{
    return "(?" + QByteArray(", ?").repeated(qMax(1, values.size()) - 1) + ')';
}

SearchSql inParentheses(const QByteArray& before, const SearchSql& condition)
{
    return {before + condition.text + ')', condition.values};
}

/// Files that wait to be built in are among them; whoever shows images looks for them in the tag file.
SearchSql ofImages(const SearchTerm& term)
{
    return {"(r.study_id, r.uid) IN (SELECT t.study_id, t.uid FROM file f JOIN series t ON t.id = f.series_id"
            " WHERE f.kind = 1 AND f.sop_uid IN " +
                places(term.values) + ')',
            texts(term.values)};
}

}  // namespace

QByteArray longestPart(const QByteArray& pattern)
{
    QByteArray longest;
    for (const QByteArray& part : pattern.split('*')) {
        if (part.size() > longest.size())
            longest = part;
    }
    return longest;
}

QByteArray partPhrase(const QByteArray& column, QByteArray part)
{
    return column + " : \"" + part.replace('"', "\"\"") + '"';
}

void SearchConditions::add(const SearchTerm& term)
{
    const Column column = columnOf(term.column);
    switch (column.where) {
    case Where::Study:
    case Where::Words:
        return addStudy(term);
    case Where::Modality:
        return mSelection.add(ofModalities(term));
    case Where::Series:
        return mSeries.require(comparisons(term, QByteArray("r.") + column.name));
    case Where::Request:
        return mRequest.require(comparisons(term, QByteArray("q.") + column.name));
    case Where::Image:
        return mSeries.require(ofImages(term));
    }
}

void SearchConditions::close()
{
    if (!mRequest.isEmpty())
        mSeries.require(inParentheses("EXISTS (SELECT 1 FROM series_request q WHERE q.study_id = r.study_id"
                                      " AND q.uid = r.uid AND ",
                                      mRequest));
    if (mSelection.start() == SearchSelection::Start::Series || mSeries.isEmpty())
        mSelection.add(mSeries);
    else
        mSelection.add(inParentheses(
            mSelection.study("study_id") + " IN (SELECT r.study_id FROM series_search r WHERE ", mSeries));
}

void SearchConditions::addStudy(const SearchTerm& term)
{
    const Column column = columnOf(term.column);
    SearchTerm rest = term;
    if (column.words != nullptr) {
        for (const QByteArray& pattern : term.patterns)
            mSelection.add(ofText(column.words, pattern));
        rest.patterns.clear();
    }
    // Only where it is asked for: the table that has it may have to be joined.
    if (column.name != nullptr &&
        !(rest.values.isEmpty() && rest.patterns.isEmpty() && rest.from.isEmpty() && rest.to.isEmpty()))
        mSelection.add(comparisons(rest, mSelection.study(column.name)));
}

SearchSql SearchConditions::ofText(const QByteArray& column, const QByteArray& pattern)
{
    const QByteArray part = longestPart(pattern);
    const bool isIndexed = mDialect.hasMatchIndex && part.size() >= kIndexedPart;
    // Names stand in the list's index, so that to walk the whole list takes no longer than to look through all texts.
    const bool isName = column == "patient_name";
    const auto ofRow = [&] {
        return like(isName ? mSelection.study("name_words")
                           : "(SELECT w." + column + " FROM study_words w WHERE w.study_id = " +
                                 mSelection.study("study_id") + ')',
                    pattern);
    };
    if (mFrequent.contains(pattern) || (isName && !isIndexed))
        return ofRow();
    const QByteArray isAmong = mSelection.study("study_id") + " IN (SELECT ";
    if (!isIndexed)
        return inParentheses(isAmong + "w.study_id FROM study_words w WHERE ", like("w." + column, pattern));
    SearchSql found{isAmong + "rowid FROM study_parts WHERE study_parts MATCH ?)",
                    {textValue(partPhrase(column, part))}};
    if (pattern != '*' + part + '*')
        found.require(ofRow());
    return found;
}

SearchSql SearchConditions::ofModalities(const SearchTerm& term)
{
    SearchSql one{"e.study_id = " + mSelection.study("study_id"), {}};
    one.require(comparisons(term, "e.modality"));
    return inParentheses("EXISTS (SELECT 1 FROM study_modality e WHERE ", one);
}

SearchSql SearchConditions::comparisons(const SearchTerm& term, const QByteArray& column)
{
    SearchSql all;
    if (!term.values.isEmpty())
        all.require({column + " IN " + places(term.values), texts(term.values)});
    for (const QByteArray& pattern : term.patterns)
        all.require(like(column, pattern));
    if (!term.from.isEmpty() || !term.to.isEmpty())
        all.require(range(term, column));
    return all;
}

SearchSql SearchConditions::range(const SearchTerm& term, const QByteArray& column)
{
    SearchSql all;
    const auto moment = [&] { return '(' + column + ", " + mSelection.study("study_time") + ')'; };
    // What has no value is in no range.
    if (term.from.isEmpty())
        all.require({column + " > ''", {}});
    if (!term.fromTime.isEmpty())
        all.require({moment() + " >= (?, ?)", texts({term.from, term.fromTime})});
    if (!term.from.isEmpty())
        all.require({column + " >= ?", texts({term.from})});
    if (!term.toTime.isEmpty())
        all.require({moment() + " <= (?, ?)", texts({term.to, term.toTime})});
    if (!term.to.isEmpty())
        all.require({column + " <= ?", texts({term.to})});
    return all;
}

SearchSql SearchConditions::like(const QByteArray& column, const QByteArray& pattern) const
{
    return {mDialect.wordsOf.arg(QLatin1String(column)).toLatin1(), {textValue(mDialect.pattern(pattern))}};
}

}  // namespace Kxg
