#include "platform/database/SearchSql.h"

#include "platform/database/SearchColumns.h"
#include "platform/database/SearchConditions.h"
#include "platform/database/SqlConnection.h"

#include <algorithm>

namespace Kxg
{
namespace
{

using Start = SearchSelection::Start;

/// From so many on, of however many studies, it takes less time to walk the list than to find and sort all that have a
/// part of a text.
constexpr int kFrequent = 2000;

const char kStudyColumns[] =
    "s.study_id, s.uid, s.is_built, s.file_size, s.file_modified, s.digest, s.modalities,"
    " s.series_count, s.instance_count";

bool isNewestFirst(const SearchQuery& query)
{
    return query.order.empty() || (query.order.size() == 1 && query.order[0].isDescending &&
                                   query.order[0].column == SearchColumn::StudyDate);
}

/// Of columns of the study, which `name` tells in full. Ends with the UID, so that pages never overlap.
template <typename Name>
QByteArray order(const SearchQuery& query, const Name& name)
{
    QByteArray text = " ORDER BY ";
    const auto by = [&](const char* column, bool isDescending) {
        text += name(column) + (isDescending ? " DESC, " : ", ");
    };
    bool hasDate = false;
    for (const SearchOrder& each : query.order) {
        const Column column = columnOf(each.column);
        if (column.name == nullptr || (column.where != Where::Study && column.where != Where::Words))
            continue;
        by(column.name, each.isDescending);
        if (each.column == SearchColumn::PatientName)
            by("patient_id", each.isDescending);
        if (each.column == SearchColumn::StudyDate) {
            by("study_time", each.isDescending);
            hasDate = true;
        }
    }
    if (!hasDate) {
        by("study_date", true);
        by("study_time", true);
    }
    return text + name("uid");
}

QByteArray orderOfPage(const SearchQuery& query)
{
    return order(query, [](const QByteArray& column) { return "page." + column; });
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

SearchSelection selected(const SqlDialect& dialect, const SearchQuery& query, const StudyLimits* limits,
                         Start start, const QSet<QByteArray>& frequent = {},
                         const SearchTerm* leading = nullptr)
{
    SearchSelection selection(dialect, limits, start);
    SearchConditions conditions(dialect, frequent, selection);
    if (leading != nullptr)
        selection.add({"m.modality = ?", {textValue(leading->values.front())}});
    for (const SearchTerm& term : query.terms) {
        if (&term != leading)
            conditions.add(term);
    }
    conditions.close();
    return selection;
}

/// In the order of the list the studies of a modality are at hand: walking these looks at nothing that is not wanted.
SearchSelection listed(const SqlDialect& dialect, const SearchQuery& query, const StudyLimits* limits,
                       const QSet<QByteArray>& frequent = {})
{
    const SearchTerm* leading = leadingModality(dialect, query, frequent);
    return selected(dialect, query, limits, leading != nullptr ? Start::Modalities : Start::Studies, frequent,
                    leading);
}

void addPage(SearchSql& sql, const SearchQuery& query)
{
    sql.text += " LIMIT ? OFFSET ?";
    sql.values << std::max(0, query.limit) + std::max(0, query.counted) << std::max(0, query.offset);
}

SearchSql counted(const SearchSelection& selection, int most)
{
    const SearchSql from = selection.sql();
    return {"SELECT COUNT(*) FROM (SELECT 1" + from.text + " LIMIT ?) counted",
            from.values + QVariantList{most}};
}

}  // namespace

void SearchSql::require(const SearchSql& condition)
{
    if (!isEmpty() && !condition.isEmpty())
        text += " AND ";
    text += condition.text;
    values += condition.values;
}

SearchSql isFrequentSql(const SqlDialect& dialect, const SearchTerm& term, const QByteArray& pattern)
{
    const char* const column = columnOf(term.column).words;
    const QByteArray part = longestPart(pattern);
    if (!dialect.hasMatchIndex || column == nullptr || part.size() < kIndexedPart)
        return {};
    return {"SELECT COUNT(*) >= ? FROM (SELECT 1 FROM study_parts WHERE study_parts MATCH ? LIMIT ?) counted",
            {kFrequent, textValue(partPhrase(column, part)), kFrequent}};
}

SearchSql studyIdsSql(const SqlDialect& dialect, const SearchQuery& query, const StudyLimits* limits,
                      const QSet<QByteArray>& frequent)
{
    SearchSelection selection = listed(dialect, query, limits, frequent);
    const auto name = [&](const QByteArray& column) { return selection.study(column); };
    const QByteArray sorted = order(query, name);
    SearchSql sql = selection.sql();
    sql.text = "SELECT " + name("study_id") + sql.text + sorted;
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
    SearchSelection selection = selected(dialect, query, limits, Start::Series);
    SearchSql sql = selection.sql();
    sql.text = QByteArray("SELECT page.*, a.attributes, r.instance_count, r.attributes FROM (SELECT ") +
               kStudyColumns +
               ", r.uid AS series_uid, s.study_date, s.study_time, s.sort_name, s.patient_id,"
               " s.accession_number, s.patient_birth_date, s.patient_sex, s.study_code, r.series_number" +
               sql.text + order(query, [&](const QByteArray& column) { return selection.study(column); }) +
               ", r.series_number, r.uid";
    addPage(sql, query);
    sql.text += ") page JOIN study_answer a ON a.study_id = page.study_id"
                " JOIN series_search r ON r.study_id = page.study_id AND r.uid = page.series_uid" +
                orderOfPage(query) + ", page.series_number, page.series_uid";
    return sql;
}

SearchSql patientsSql(const SqlDialect& dialect, const SearchQuery& query, const StudyLimits* limits)
{
    SearchSql sql = selected(dialect, query, limits, Start::Studies).sql();
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
    SearchSql sql = selected(dialect, query, &limits, Start::Studies).sql();
    sql.text.prepend("SELECT s.uid");
    return sql;
}

SearchSql countStudiesSql(const SqlDialect& dialect, const SearchQuery& query, const StudyLimits* limits,
                          int most)
{
    return counted(listed(dialect, query, limits), most);
}

SearchSql countSeriesSql(const SqlDialect& dialect, const SearchQuery& query, const StudyLimits* limits,
                         int most)
{
    return counted(selected(dialect, query, limits, Start::Series), most);
}

}  // namespace Kxg
