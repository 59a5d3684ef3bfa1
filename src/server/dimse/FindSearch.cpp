#include "server/dimse/FindSearch.h"

#include "server/dicomweb/search/SearchRun.h"

#include <dcmtk/dcmdata/dcdeftag.h>

#include <algorithm>

namespace Kdd::Dimse
{
namespace
{

using namespace DicomWeb;

/// Studies that have just come are known at once, but not what they consist of. False when that cannot be had now, of the study
/// that is named.
bool bringInArrivals(const SearchRequest& search, StudyShelf& shelf)
{
    const bool isBelowStudies = search.level == SearchLevel::Series || search.level == SearchLevel::Instances;
    if (!isBelowStudies || shelf.arrivals() == nullptr)
        return true;
    const auto named =
        std::find_if(search.conditions.begin(), search.conditions.end(), [](const SearchCondition& each) {
            return each.key() == DCM_StudyInstanceUID && !each.isInItems() && each.list.size() == 1;
        });
    if (named != search.conditions.end())
        return shelf.arrivals()->bringIn(named->list.front().toUtf8()) != Arrived::Held;
    shelf.arrivals()->bringInOwn({});
    return true;
}

QueryEnding studyIsWritten()
{
    return {kBusy, QStringLiteral("A study is being written; ask again")};
}

QueryEnding endingOf(const SearchRun& run, int limit)
{
    if (!run.tooBroad().isEmpty())
        return {kTooMany, run.tooBroad()};
    if (run.isHeldUp())
        return studyIsWritten();
    if (run.unread() > 0)
        return {kUnreadable,
                QStringLiteral("Of %1 studies the tag files could not be read").arg(run.unread())};
    if (run.remaining() > 0)
        return {kTooMany, QStringLiteral("There are more than %1 answers: narrow the search").arg(limit)};
    return {};
}

}  // namespace

QueryEnding findObjects(const SearchRequest& search, const StudyLimits& limits, const ThreadSearch& database,
                        StudyShelf& shelf, std::vector<QByteArray>& found)
{
    SearchPlan plan;
    QString reason;
    if (!SearchPlan::make(search, plan, reason))
        return {kMisunderstood, reason};
    if (!bringInArrivals(search, shelf))
        return studyIsWritten();
    QueryEnding ending;
    const QByteArray root;
    const Result result = database.ask(limits, [&](Kxg::StudySearch& connection) {
        FoundAnswers answers(search, root);
        SearchRun run(search, plan, connection, shelf);
        const Result done = run.run(answers);
        // A search that failed may be done once more.
        found.clear();
        for (int i = 0; i < answers.count(); ++i)
            found.push_back(answers.object(i));
        ending = endingOf(run, search.limit);
        return done;
    });
    return result.good() ? ending
                         : QueryEnding{kNoDatabase, QStringLiteral("The image database cannot be asked now")};
}

}  // namespace Kdd::Dimse
