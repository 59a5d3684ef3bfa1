#pragma once

#include <QSet>

#include <kddlib/StudyIndexing.h>
#include <kddlib/StudySearch.h>

namespace Kdd::DicomWeb
{

/// A study that is written again and again while it is looked at is answered as it was found last.
constexpr int kRefreshes = 3;

inline const Kxg::FoundStudy& studyOf(const Kxg::FoundStudy& study)
{
    return study;
}

inline const Kxg::FoundStudy& studyOf(const Kxg::FoundSeries& series)
{
    return series.study;
}

/// Those whose tag files are others now, each once.
template <typename Found>
std::vector<const Kxg::FoundStudy*> changedAmong(const std::vector<Found>& found)
{
    std::vector<const Kxg::FoundStudy*> changed;
    QSet<int> seen;
    for (const Found& each : found) {
        const Kxg::FoundStudy& study = studyOf(each);
        if (seen.contains(study.id))
            continue;
        seen.insert(study.id);
        if (!StudyIndexing::isCurrent(study))
            changed.push_back(&study);
    }
    return changed;
}

/// Asks until nothing that was found has changed since.
template <typename Found, typename Ask>
Result findCurrent(Kxg::StudySearch& search, std::vector<Found>& found, const Ask& ask)
{
    Result result = ask();
    for (int i = 0; i < kRefreshes && result.good(); ++i) {
        const std::vector<const Kxg::FoundStudy*> changed = changedAmong(found);
        if (changed.empty() || StudyIndexing(search).refresh(changed) == 0)
            break;
        result = ask();
    }
    return result;
}

}  // namespace Kdd::DicomWeb
