#include "platform/database/StudySearch.h"

#include "platform/database/ChangeLog.h"
#include "platform/database/ProofRows.h"
#include "platform/database/Schema.h"
#include "platform/database/SearchRows.h"
#include "platform/database/SearchSql.h"
#include "platform/database/SearchWords.h"
#include "platform/database/SqlConnection.h"
#include "platform/database/StudyMarks.h"
#include "platform/database/StudyProofs.h"
#include "platform/resources/ExResource.h"

#include <QHash>

#include <algorithm>
#include <chrono>
#include <utility>

namespace Kxg
{
namespace
{

using Access = SqlConnection::Access;

constexpr int kStudyColumns = 9;
constexpr int kSortColumns = 8;  // which the engine gives along with series

constexpr int kShownAtOnce = 1000;  // studies, whose attributes are in memory twice meanwhile

constexpr int kMarkedAtOnce = 500;  // studies, in one transaction

/// Of changes, where not all may be seen: so many are read at a time, and looked at for one answer.
constexpr int kChangesAtOnce = 500;
constexpr int kMostLooked = 20000;

FoundStudy studyOf(const SqlRows& rows, int attributes)
{
    FoundStudy study;
    study.id = static_cast<int>(rows.number(0));
    study.uid = rows.text(1);
    study.isBuilt = rows.truth(2);
    study.tagFile.fileSize = rows.number(3);
    study.tagFile.modified = rows.number(4);
    study.tagFile.digest = rows.bytes(5);
    study.modalities = rows.text(6);
    study.series = static_cast<int>(rows.number(7));
    study.instances = static_cast<int>(rows.number(8));
    study.attributes = rows.bytes(attributes);
    return study;
}

/// A row of the page is taken by `take`, one behind it counted.
template <typename Found, typename Take>
void takeOrCount(std::vector<Found>& found, int limit, int* behind, const Take& take)
{
    if (found.size() < static_cast<std::size_t>(std::max(0, limit)))
        found.push_back(take());
    else if (behind != nullptr)
        ++*behind;
}

}  // namespace

struct StudySearch::Private
{
    explicit Private(const DatabaseAddress& address)
        : connection(address, SqlConnection::IfAbsent::Fail)
    {
        requireSchema(connection);
        bringSchemaUpToDate(connection);
        connection.limitWork(std::chrono::seconds(Kdd::ExResource::databasePatience()));
    }

    const SqlDialect& dialect() const { return SqlDialect::of(connection.address().engine); }

    Kdd::Result transact(Access access, const std::function<void()>& work)
    {
        return attempt(connection.address(), [&] { connection.transact(access, work); });
    }

    /// `take` gets each row of the answer.
    Kdd::Result ask(const SearchSql& sql, const std::function<void(const SqlRows&)>& take)
    {
        return transact(Access::Read, [&] {
            SqlRows rows = connection.askOnce(sql.text, sql.values);
            while (rows.next())
                take(rows);
        });
    }

    /// The patterns of the query that many studies have. Within a transaction.
    QSet<QByteArray> frequentOf(const SearchQuery& query)
    {
        QSet<QByteArray> frequent;
        // The other engine knows by its statistics.
        if (!dialect().hasMatchIndex)
            return frequent;
        for (const SearchTerm& term : query.terms) {
            for (const QByteArray& pattern : term.patterns) {
                const SearchSql sql = isFrequentSql(dialect(), term, pattern);
                if (sql.text.isEmpty())
                    continue;
                SqlRows rows = connection.ask(sql.text, sql.values);
                if (rows.next() && rows.truth(0))
                    frequent.insert(pattern);
            }
        }
        return frequent;
    }

    /// Of the page and of what is counted behind it, in order. Within a transaction.
    QVector<int> idsOf(const SearchQuery& query)
    {
        const SearchSql sql = studyIdsSql(dialect(), query, limits.get(), frequentOf(query));
        QVector<int> ids;
        SqlRows rows = connection.askOnce(sql.text, sql.values);
        while (rows.next())
            ids.append(static_cast<int>(rows.number(0)));
        return ids;
    }

    /// Appends what is shown of the studies, in the order of their ids. Within a transaction.
    void show(const QVector<int>& ids, std::vector<FoundStudy>& found)
    {
        const std::size_t before = found.size();
        QHash<int, std::size_t> places;
        for (const int id : ids)
            places.insert(id, before + static_cast<std::size_t>(places.size()));
        found.resize(before + static_cast<std::size_t>(places.size()));
        const SearchSql sql = shownStudiesSql(dialect(), ids);
        SqlRows rows = connection.ask(sql.text, sql.values);
        while (rows.next())
            found[places.value(static_cast<int>(rows.number(0)), before)] = studyOf(rows, kStudyColumns);
    }

    /// Those of the studies that are within the limits.
    QSet<QByteArray> visible(const QVector<QByteArray>& studyUIDs)
    {
        QSet<QByteArray> found;
        SearchQuery query;
        query.terms.push_back({SearchColumn::StudyUID, studyUIDs, {}, {}, {}, {}, {}});
        const SearchSql sql = visibleSql(dialect(), query, *limits);
        SqlRows rows = connection.askOnce(sql.text, sql.values);
        while (rows.next())
            found.insert(rows.text(0));
        return found;
    }

    /// As many as are missing; `last` is the position of the last one that was looked at.
    void takeVisible(const std::vector<StudyChangeNote>& page, int missing,
                     std::vector<StudyChangeNote>& changes, qint64& last)
    {
        QVector<QByteArray> named;
        for (const StudyChangeNote& change : page)
            named << change.studyInstanceUID << change.movedFrom << change.movedTo;
        const QSet<QByteArray> seen =
            limits != nullptr && !page.empty() ? visible(named) : QSet<QByteArray>();
        const auto isSeen = [&](const QByteArray& uid) { return limits == nullptr || seen.contains(uid); };
        for (StudyChangeNote change : page) {
            if (missing == 0)
                return;
            last = change.position;
            if (!isSeen(change.studyInstanceUID))
                continue;
            for (QByteArray* other : {&change.movedFrom, &change.movedTo})
                if (!isSeen(*other))
                    other->clear();
            changes.push_back(std::move(change));
            --missing;
        }
    }

    /// Gives studies after that one their marks, as many as others can wait for. The last of them; -1: there is none.
    qint64 markSome(qint64 after)
    {
        QVector<qint64> studies;
        {
            SqlRows rows = connection.ask("SELECT study_id FROM study_search WHERE marks = ? AND study_id > ?"
                                          " ORDER BY study_id LIMIT ?",
                                          {textValue(kAnyMark), after, kMarkedAtOnce});
            while (rows.next())
                studies.push_back(rows.number(0));
        }
        for (const qint64 study : qAsConst(studies))
            putMarks(connection, study);
        return studies.isEmpty() ? -1 : studies.last();
    }

    SqlConnection connection;
    std::shared_ptr<const StudyLimits> limits;
};

std::unique_ptr<StudySearch> StudySearch::open(const QByteArray& address, Kdd::Result& result)
{
    std::unique_ptr<StudySearch> search;
    DatabaseAddress parsed;
    result = DatabaseAddress::parse(address, parsed);
    if (result.good())
        result = attempt(parsed, [&] { search.reset(new StudySearch(std::make_unique<Private>(parsed))); });
    return search;
}

StudySearch::StudySearch(std::unique_ptr<Private> made)
    : d(std::move(made))
{
}

StudySearch::~StudySearch() = default;

void StudySearch::limitTo(std::shared_ptr<const StudyLimits> limits)
{
    d->limits = std::move(limits);
}

Kdd::Result StudySearch::studies(const SearchQuery& query, std::vector<FoundStudy>& found, int* behind)
{
    found.clear();
    if (behind != nullptr)
        *behind = 0;
    return d->transact(Access::Read, [&] {
        const QVector<int> ids = d->idsOf(query);
        const int page = std::min(ids.size(), std::max(0, query.limit));
        for (int first = 0; first < page; first += kShownAtOnce)
            d->show(ids.mid(first, std::min(kShownAtOnce, page - first)), found);
        if (behind != nullptr)
            *behind = ids.size() - page;
    });
}

Kdd::Result StudySearch::series(const SearchQuery& query, std::vector<FoundSeries>& found, int* behind)
{
    found.clear();
    if (behind != nullptr)
        *behind = 0;
    return d->ask(seriesSql(d->dialect(), query, d->limits.get()), [&](const SqlRows& rows) {
        // The series' UID and number stand among those that it is sorted by.
        const int attributes = kStudyColumns + kSortColumns + 2;
        takeOrCount(found, query.limit, behind, [&] {
            return FoundSeries{studyOf(rows, attributes), rows.text(kStudyColumns),
                               static_cast<int>(rows.number(attributes + 1)), rows.bytes(attributes + 2)};
        });
    });
}

Kdd::Result StudySearch::patients(const SearchQuery& query, std::vector<FoundPatient>& found)
{
    found.clear();
    return d->ask(patientsSql(d->dialect(), query, d->limits.get()), [&](const SqlRows& rows) {
        found.push_back({static_cast<int>(rows.number(0)), rows.bytes(1)});
    });
}

Kdd::Result StudySearch::countStudies(const SearchQuery& query, int most, int& count)
{
    return d->ask(countStudiesSql(d->dialect(), query, d->limits.get(), most),
                  [&](const SqlRows& rows) { count = static_cast<int>(rows.number(0)); });
}

Kdd::Result StudySearch::countSeries(const SearchQuery& query, int most, int& count)
{
    return d->ask(countSeriesSql(d->dialect(), query, d->limits.get(), most),
                  [&](const SqlRows& rows) { count = static_cast<int>(rows.number(0)); });
}

Kdd::Result StudySearch::changes(qint64 position, int limit, std::vector<StudyChangeNote>& changes,
                                 qint64& last)
{
    return d->transact(Access::Read, [&] {
        changes.clear();
        last = position;
        int missing = limit;
        for (int looked = 0; missing > 0 && looked < kMostLooked;) {
            const int wanted = d->limits == nullptr ? missing : kChangesAtOnce;
            const std::vector<StudyChangeNote> page = changesAfter(d->connection, last, wanted);
            d->takeVisible(page, missing, changes, last);
            missing = limit - static_cast<int>(changes.size());
            looked += wanted;
            if (static_cast<int>(page.size()) < wanted)
                return;
        }
    });
}

Kdd::Result StudySearch::tagFileProofs(const QByteArray& studyUID, TagFileProofs& proofs)
{
    return d->transact(Access::Read, [&] {
        TagFileProofs found;
        readTagFileProofs(d->connection, studyUID, found);
        proofs = std::move(found);
    });
}

Kdd::Result StudySearch::refresh(const FoundStudy& former, const BuiltStudy& present, bool& isDone)
{
    isDone = false;
    return d->transact(Access::Write, [&] {
        const SearchRowState row = searchRowOf(d->connection, former.id);
        const bool isAsRead = row.isBuilt == former.isBuilt &&
                              row.tagFile.fileSize == former.tagFile.fileSize &&
                              row.tagFile.modified == former.tagFile.modified;
        if (!isAsRead || present.search.series.empty())
            return;
        putSearchRows(d->connection, former.id, present.search, present.tagFile);
        isDone = true;
        // The same content under another time, as after a copy, is nothing new.
        if (row.isBuilt && row.tagFile.digest == present.tagFile.digest)
            return;
        int instances = 0;
        for (const SeriesSearchRecord& series : present.search.series)
            instances += series.instances;
        noteChange(
            d->connection,
            {row.isBuilt ? ChangeKind::Corrected : ChangeKind::Arrived, former.uid, {}, {}, instances});
    });
}

Kdd::Result StudySearch::unknownStudies(const QByteArray& after, int limit, QVector<QByteArray>& studyUIDs)
{
    studyUIDs.clear();
    return d->transact(Access::Read, [&] {
        SqlRows rows = d->connection.ask("SELECT study.uid FROM study JOIN study_search"
                                         " ON study_search.study_id = study.id WHERE study.uid > ?"
                                         " AND study_search.is_built = 0 AND study.tag_file_size > 0"
                                         " ORDER BY study.uid LIMIT ?",
                                         {textValue(after), limit});
        while (rows.next())
            studyUIDs.push_back(rows.text(0));
    });
}

Kdd::Result StudySearch::prepare()
{
    const SqlConnection::Unhurried unhurried(d->connection);
    Kdd::Result result = d->transact(Access::Write, [&] {
        obtainWordsIndex(d->connection);
        QVector<qint64> studies;
        {
            SqlRows rows =
                d->connection.ask("SELECT id FROM study WHERE NOT EXISTS (SELECT 1 FROM study_search"
                                  " WHERE study_id = study.id)");
            while (rows.next())
                studies.push_back(rows.number(0));
        }
        for (const qint64 study : qAsConst(studies))
            putRegisteredRows(d->connection, study);
    });
    qint64 marked = 0;
    while (result.good() && marked >= 0)
        result = d->transact(Access::Write, [&] { marked = d->markSome(marked); });
    return result;
}

Kdd::Result StudySearch::explainStudies(const SearchQuery& query, QByteArray& plan)
{
    plan.clear();
    return d->transact(Access::Read, [&] {
        const SearchSql sql = studyIdsSql(d->dialect(), query, d->limits.get(), d->frequentOf(query));
        const bool isSqlite = d->connection.address().engine == DatabaseAddress::Engine::Sqlite;
        SqlRows rows = d->connection.askOnce(
            (isSqlite ? "EXPLAIN QUERY PLAN " : "EXPLAIN (ANALYZE, BUFFERS) ") + sql.text, sql.values);
        while (rows.next())
            plan += rows.text(isSqlite ? 3 : 0) + '\n';
    });
}

}  // namespace Kxg
