#include "platform/database/SearchSql.h"

#include "platform/database/SearchColumns.h"
#include "platform/database/SearchLimits.h"
#include "platform/database/SqlConnection.h"

#include <algorithm>

namespace Kxg
{
namespace
{

/// The engine's index of parts finds what has at least so many characters.
constexpr int kIndexedPart = 3;

/// From so many on, of however many studies, it takes less time to walk the list than to find and sort all that have a
/// part of a text.
constexpr int kFrequent = 2000;

/// The longest piece between two stars.
QByteArray longestPart(const QByteArray& pattern)
{
    QByteArray longest;
    for (const QByteArray& part : pattern.split('*')) {
        if (part.size() > longest.size())
            longest = part;
    }
    return longest;
}

/// What is in a column, as the index of parts is asked for it.
QByteArray phrase(const QByteArray& column, QByteArray part)
{
    return column + " : \"" + part.replace('"', "\"\"") + '"';
}

/// Conditions are collected here, and what they are bound to in the same order.
class Conditions
{
public:
    Conditions(const SqlDialect& dialect, const StudyLimits* limits, const QSet<QByteArray>& frequent)
        : mDialect(dialect)
        , mFrequent(frequent)
        , mStudy(limits != nullptr ? limitsSql(dialect, *limits) : SearchSql())
    {
    }

    void add(const SearchTerm& term)
    {
        const Column column = columnOf(term.column);
        if (term.column == SearchColumn::ModalitiesInStudy)
            addModalities(term);
        else if (term.column == SearchColumn::SOPInstanceUID)
            addImages(term);
        else if (column.where == Where::Series || column.where == Where::Request)
            addTo(column.where == Where::Series ? mSeries : mRequest, term, column);
        else
            addTo(mStudy, term, column);
    }

    bool hasSeries() const { return !mSeries.text.isEmpty() || !mRequest.text.isEmpty(); }

    const SearchSql& study() const { return mStudy; }

    /// Of a series that is named `r` outside.
    SearchSql series() const
    {
        SearchSql all = mSeries;
        if (!mRequest.text.isEmpty()) {
            all.text += " AND EXISTS (SELECT 1 FROM series_request q WHERE q.study_id = r.study_id AND q.uid "
                        "= r.uid" +
                        mRequest.text + ')';
            all.values += mRequest.values;
        }
        return all;
    }

private:
    static void append(SearchSql& sql, const QByteArray& condition, const QVariantList& values)
    {
        sql.text += " AND " + condition;
        sql.values += values;
    }

    void addTo(SearchSql& sql, const SearchTerm& term, const Column& column)
    {
        const QByteArray name = column.name;
        if (!term.values.isEmpty())
            append(sql, name + " IN (?" + QByteArray(", ?").repeated(term.values.size() - 1) + ')',
                   texts(term.values));
        for (const QByteArray& pattern : term.patterns) {
            if (column.words != nullptr)
                addWords(sql, column.words, pattern);
            else
                append(sql, matches(name), {textValue(mDialect.pattern(pattern))});
        }
        if (!term.from.isEmpty() || !term.to.isEmpty())
            addRange(sql, term, name);
    }

    QByteArray matches(const QByteArray& column) const
    {
        return mDialect.wordsOf.arg(QLatin1String(column)).toLatin1();
    }

    void addRange(SearchSql& sql, const SearchTerm& term, const QByteArray& name)
    {
        // What has no value is in no range.
        if (term.from.isEmpty())
            append(sql, name + " > ''", {});
        if (!term.fromTime.isEmpty())
            append(sql, "(s.study_date, s.study_time) >= (?, ?)", texts({term.from, term.fromTime}));
        if (!term.from.isEmpty())
            append(sql, name + " >= ?", texts({term.from}));
        if (!term.toTime.isEmpty())
            append(sql, "(s.study_date, s.study_time) <= (?, ?)", texts({term.to, term.toTime}));
        if (!term.to.isEmpty())
            append(sql, name + " <= ?", texts({term.to}));
    }

    void addWords(SearchSql& sql, const QByteArray& column, const QByteArray& pattern)
    {
        const QVariant whole = textValue(mDialect.pattern(pattern));
        const QByteArray part = longestPart(pattern);
        // Names stand in the list's index, so that to walk the whole list takes no longer than to look through all texts.
        const bool isName = column == "patient_name";
        const QByteArray ofRow =
            isName ? QByteArray("s.name_words")
                   : "(SELECT w." + column + " FROM study_words w WHERE w.study_id = s.study_id)";
        if (mFrequent.contains(pattern) ||
            (isName && (!mDialect.hasMatchIndex || part.size() < kIndexedPart))) {
            append(sql, matches(ofRow), {whole});
            return;
        }
        if (mDialect.hasMatchIndex && part.size() >= kIndexedPart)
            append(sql, "s.study_id IN (SELECT rowid FROM study_parts WHERE study_parts MATCH ?)",
                   {textValue(phrase(column, part))});
        if (!mDialect.hasMatchIndex || part.size() < kIndexedPart)
            append(sql,
                   "s.study_id IN (SELECT w.study_id FROM study_words w WHERE " + matches("w." + column) +
                       ')',
                   {whole});
        else if (pattern != '*' + part + '*')
            append(sql, matches(ofRow), {whole});
    }

    void addModalities(const SearchTerm& term)
    {
        QByteArray condition;
        QVariantList values = texts(term.values);
        if (!term.values.isEmpty())
            condition += " AND m.modality IN (?" + QByteArray(", ?").repeated(term.values.size() - 1) + ')';
        for (const QByteArray& pattern : term.patterns) {
            condition += " AND " + matches("m.modality");
            values << textValue(mDialect.pattern(pattern));
        }
        append(mStudy,
               "EXISTS (SELECT 1 FROM study_modality m WHERE m.study_id = s.study_id" + condition + ')',
               values);
    }

    /// Files that wait to be built in are among them; whoever shows images looks for them in the tag file.
    void addImages(const SearchTerm& term)
    {
        append(
            mSeries,
            "(r.study_id, r.uid) IN (SELECT t.study_id, t.uid FROM file f JOIN series t ON t.id = f.series_id"
            " WHERE f.kind = 1 AND f.sop_uid IN (?" +
                QByteArray(", ?").repeated(qMax(1, term.values.size()) - 1) + "))",
            texts(term.values));
    }

    static QVariantList texts(const QVector<QByteArray>& values)
    {
        QVariantList list;
        for (const QByteArray& value : values)
            list << textValue(value);
        return list;
    }

    const SqlDialect& mDialect;
    const QSet<QByteArray>& mFrequent;
    SearchSql mStudy;
    SearchSql mSeries;
    SearchSql mRequest;
};

const char kStudyColumns[] =
    "s.study_id, s.uid, s.is_built, s.file_size, s.file_modified, s.digest, s.modalities,"
    " s.series_count, s.instance_count";

bool isNewestFirst(const SearchQuery& query)
{
    return query.order.empty() || (query.order.size() == 1 && query.order[0].isDescending &&
                                   query.order[0].column == SearchColumn::StudyDate);
}

/// Of the table of that name. Ends with the UID, so that pages never overlap.
QByteArray order(const SearchQuery& query, const QByteArray& table)
{
    QByteArray text = " ORDER BY ";
    const auto by = [&](const char* column, bool isDescending) {
        text += table + QByteArray(column).mid(1) + (isDescending ? " DESC, " : ", ");
    };
    bool hasDate = false;
    for (const SearchOrder& each : query.order) {
        const Column column = columnOf(each.column);
        if (column.name == nullptr || column.name[0] != 's')
            continue;
        by(column.name, each.isDescending);
        if (each.column == SearchColumn::PatientName)
            by("s.patient_id", each.isDescending);
        if (each.column == SearchColumn::StudyDate) {
            by("s.study_time", each.isDescending);
            hasDate = true;
        }
    }
    if (!hasDate) {
        by("s.study_date", true);
        by("s.study_time", true);
    }
    return text + table + ".uid";
}

/// Whether the list is walked for the term anyway, or may be.
bool isWalked(const SqlDialect& dialect, const SearchTerm& term, const QSet<QByteArray>& frequent)
{
    if (!term.values.isEmpty())
        return false;
    if (term.column == SearchColumn::StudyDate)
        return true;
    // A server weighs that against its index itself.
    if (!dialect.hasMatchIndex)
        return columnOf(term.column).words != nullptr;
    return !term.patterns.isEmpty() &&
           std::all_of(term.patterns.begin(), term.patterns.end(), [&](const QByteArray& each) {
               return frequent.contains(each) ||
                      (term.column == SearchColumn::PatientName && longestPart(each).size() < kIndexedPart);
           });
}

/// The one modality that is asked for and nothing that narrows the search more.
const SearchTerm* leadingModality(const SqlDialect& dialect, const SearchQuery& query,
                                  const QSet<QByteArray>& frequent)
{
    const SearchTerm* modality = nullptr;
    for (const SearchTerm& term : query.terms) {
        if (term.column == SearchColumn::ModalitiesInStudy && term.values.size() == 1 &&
            term.patterns.isEmpty())
            modality = &term;
        else if (!isWalked(dialect, term, frequent))
            return nullptr;
    }
    return isNewestFirst(query) ? modality : nullptr;
}

/// "FROM ... WHERE ..." of the studies that are found, as `s`.
SearchSql studiesFrom(const SqlDialect& dialect, const SearchQuery& query, const StudyLimits* limits,
                      bool isListed, const QSet<QByteArray>& frequent = {})
{
    Conditions conditions(dialect, limits, frequent);
    // The list of a modality is kept in its order. Walking it looks at nothing that is not wanted, but what somebody may see
    // is no part of it.
    const SearchTerm* leading =
        isListed && limits == nullptr ? leadingModality(dialect, query, frequent) : nullptr;
    for (const SearchTerm& term : query.terms) {
        if (&term != leading)
            conditions.add(term);
    }
    SearchSql sql;
    if (leading != nullptr) {
        // Both tables have the columns that are asked of and sorted by; what else is asked of is in the other one.
        SearchSql dates = conditions.study();
        dates.text.replace("s.study_", "m.study_");
        sql.text = " FROM study_modality m";
        if (dates.text.contains("s.name_words"))
            sql.text += " JOIN study_search s ON s.study_id = m.study_id";
        sql.text += " WHERE m.modality = ?" + dates.text;
        sql.values << textValue(leading->values.front());
        sql.values += dates.values;
        return sql;
    }
    sql.text = " FROM study_search s WHERE 1 = 1" + conditions.study().text;
    sql.values = conditions.study().values;
    if (conditions.hasSeries()) {
        const SearchSql series = conditions.series();
        sql.text +=
            " AND s.study_id IN (SELECT r.study_id FROM series_search r WHERE 1 = 1" + series.text + ')';
        sql.values += series.values;
    }
    return sql;
}

SearchSql seriesFrom(const SqlDialect& dialect, const SearchQuery& query, const StudyLimits* limits)
{
    static const QSet<QByteArray> kNone;
    Conditions conditions(dialect, limits, kNone);
    for (const SearchTerm& term : query.terms)
        conditions.add(term);
    const SearchSql series = conditions.series();
    SearchSql sql;
    sql.text = " FROM series_search r JOIN study_search s ON s.study_id = r.study_id WHERE 1 = 1" +
               series.text + conditions.study().text;
    sql.values = series.values + conditions.study().values;
    return sql;
}

void addPage(SearchSql& sql, const SearchQuery& query)
{
    sql.text += " LIMIT ? OFFSET ?";
    sql.values << std::max(0, query.limit) + std::max(0, query.counted) << std::max(0, query.offset);
}

SearchSql counted(const SearchSql& from, int most)
{
    return {"SELECT COUNT(*) FROM (SELECT 1" + from.text + " LIMIT ?) counted",
            from.values + QVariantList{most}};
}

}  // namespace

SearchSql isFrequentSql(const SqlDialect& dialect, const SearchTerm& term, const QByteArray& pattern)
{
    const char* const column = columnOf(term.column).words;
    const QByteArray part = longestPart(pattern);
    if (!dialect.hasMatchIndex || column == nullptr || part.size() < kIndexedPart)
        return {};
    return {"SELECT COUNT(*) >= ? FROM (SELECT 1 FROM study_parts WHERE study_parts MATCH ? LIMIT ?) counted",
            {kFrequent, textValue(phrase(column, part)), kFrequent}};
}

SearchSql studyIdsSql(const SqlDialect& dialect, const SearchQuery& query, const StudyLimits* limits,
                      const QSet<QByteArray>& frequent)
{
    SearchSql sql = studiesFrom(dialect, query, limits, true, frequent);
    const QByteArray table = sql.text.startsWith(" FROM study_modality") ? "m" : "s";
    sql.text = "SELECT " + table + ".study_id" + sql.text + order(query, table);
    addPage(sql, query);
    return sql;
}

SearchSql shownStudiesSql(const SqlDialect& dialect, const QVector<int>& ids)
{
    QByteArrayList numbers;
    for (const int id : ids)
        numbers << QByteArray::number(id);
    return {QByteArray("SELECT ") + kStudyColumns +
                ", a.attributes FROM study_search s JOIN study_answer a ON a.study_id = s.study_id"
                " WHERE s.study_id " +
                dialect.isOneOf.toLatin1(),
            {dialect.list.arg(QLatin1String(numbers.join(',')))}};
}

SearchSql seriesSql(const SqlDialect& dialect, const SearchQuery& query, const StudyLimits* limits)
{
    SearchSql sql = seriesFrom(dialect, query, limits);
    sql.text = QByteArray("SELECT page.*, a.attributes, r.instance_count, r.attributes FROM (SELECT ") +
               kStudyColumns +
               ", r.uid AS series_uid, s.study_date, s.study_time, s.sort_name, s.patient_id,"
               " s.accession_number, s.patient_birth_date, s.patient_sex, s.study_code, r.series_number" +
               sql.text + order(query, "s") + ", r.series_number, r.uid";
    addPage(sql, query);
    sql.text += ") page JOIN study_answer a ON a.study_id = page.study_id"
                " JOIN series_search r ON r.study_id = page.study_id AND r.uid = page.series_uid" +
                order(query, "page") + ", page.series_number, page.series_uid";
    return sql;
}

SearchSql patientsSql(const SqlDialect& dialect, const SearchQuery& query, const StudyLimits* limits)
{
    SearchSql sql = studiesFrom(dialect, query, limits, false);
    sql.text =
        "SELECT page.studies, a.attributes FROM (SELECT s.sort_name, s.patient_id, COUNT(*) AS studies,"
        " MAX(s.study_id) AS study_id" +
        sql.text + " GROUP BY s.sort_name, s.patient_id ORDER BY s.sort_name, s.patient_id";
    addPage(sql, query);
    sql.text += ") page JOIN study_answer a ON a.study_id = page.study_id"
                " ORDER BY page.sort_name, page.patient_id";
    return sql;
}

SearchSql visibleSql(const SqlDialect& dialect, const SearchQuery& query, const StudyLimits& limits)
{
    SearchSql sql = studiesFrom(dialect, query, &limits, false);
    sql.text.prepend("SELECT s.uid");
    return sql;
}

SearchSql countStudiesSql(const SqlDialect& dialect, const SearchQuery& query, const StudyLimits* limits,
                          int most)
{
    return counted(studiesFrom(dialect, query, limits, true), most);
}

SearchSql countSeriesSql(const SqlDialect& dialect, const SearchQuery& query, const StudyLimits* limits,
                         int most)
{
    return counted(seriesFrom(dialect, query, limits), most);
}

}  // namespace Kxg
