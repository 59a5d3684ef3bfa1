#pragma once

#include "platform/database/SearchSelection.h"

#include <QSet>

namespace Kxg
{

/// SQLite's index of parts finds what has at least so many characters.
constexpr int kIndexedPart = 3;

/// The longest piece of a pattern between two stars.
QByteArray longestPart(const QByteArray& pattern);

/// What is in a column, as that index is asked for it.
QByteArray partPhrase(const QByteArray& column, QByteArray part);

/// Puts what a search asks for into a selection.
class SearchConditions
{
public:
    /// Of `frequent` patterns it takes less time to look at the studies in the order of the list than to ask the index of
    /// parts. All must outlive the object.
    SearchConditions(const SqlDialect& dialect, const QSet<QByteArray>& frequent, SearchSelection& selection)
        : mDialect(dialect)
        , mFrequent(frequent)
        , mSelection(selection)
    {
    }

    void add(const SearchTerm& term);

    /// After the last one: what is asked of series holds for one and the same, and of its requests for one.
    void close();

private:
    void addStudy(const SearchTerm& term);
    SearchSql ofText(const QByteArray& column, const QByteArray& pattern);
    SearchSql ofModalities(const SearchTerm& term);
    SearchSql comparisons(const SearchTerm& term, const QByteArray& column);
    SearchSql range(const SearchTerm& term, const QByteArray& column);
    SearchSql like(const QByteArray& column, const QByteArray& pattern) const;

    const SqlDialect& mDialect;
    const QSet<QByteArray>& mFrequent;
    SearchSelection& mSelection;
    SearchSql mSeries;
    SearchSql mRequest;
};

}  // namespace Kxg
