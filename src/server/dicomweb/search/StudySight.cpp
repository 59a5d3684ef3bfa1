#include "server/dicomweb/search/StudySight.h"

#include "server/dicomweb/search/CurrentRows.h"

#include <kddlib/TagMap.h>

namespace Kdd::DicomWeb
{

Result StudySight::find(const Limits& limits, const QByteArray& studyUID,
                        std::vector<Kxg::FoundStudy>& found) const
{
    Kxg::SearchQuery query;
    Kxg::SearchTerm term;
    term.values.append(studyUID);
    query.terms.push_back(term);
    query.limit = 1;
    return mDatabase.ask(limits, [&](Kxg::StudySearch& search) {
        return findCurrent(search, found, [&] { return search.studies(query, found); });
    });
}

Sight StudySight::look(const Limits& limits, const QByteArray& studyUID) const
{
    std::vector<Kxg::FoundStudy> found;
    Result result;
    const auto isThere = [&] {
        result = find(limits, studyUID, found);
        return result.bad() || !found.empty();
    };
    // By what it is known may have arrived a moment ago.
    if (isLackingAfter(isThere, studyUID, mShelf.arrivals()) || result.bad())
        return Sight::Unknown;
    return found.empty() ? Sight::Hidden : Sight::Seen;
}

bool StudySight::admits(const Limits& limits, const TagMap& image) const
{
    if (limits == nullptr)
        return true;
    const StudyIndexing::Standing standing = StudyIndexing::standingOf(image, *limits);
    if (standing == StudyIndexing::Standing::Beyond)
        return false;
    const QByteArray study = image.uid(TagMap::StudyLevel);
    std::vector<Kxg::FoundStudy> found;
    if (find(limits, study, found).bad())
        return false;
    if (!found.empty())
        return true;
    // Of one that is being received not all is known yet; its first image has told whose it is.
    const bool isOthers = find(nullptr, study, found).bad() || (!found.empty() && found.front().isBuilt);
    return !isOthers && standing == StudyIndexing::Standing::Within;
}

}  // namespace Kdd::DicomWeb
