#include "server/dicomweb/search/SearchRun.h"

#include "server/dicomweb/search/CurrentRows.h"

#include <dcmtk/dcmdata/dcdeftag.h>
#include <kddlib/TagFile.h>
#include <kddlib/TagMap.h>

#include <algorithm>

namespace Kdd::DicomWeb
{
namespace
{

// What one request may look at besides what indexes find: rows of the database, some microseconds each, and tag files,
// some milliseconds each.
constexpr int kMaxRows = 20000;
constexpr int kMaxTagFiles = 500;

// Clients only want to know that there is more.
constexpr int kMaxRemaining = 1000;

// As many are found along with a page. Where a part of a text is looked for each costs as much as one on the page.
constexpr int kCounted = 20;

constexpr int kRowsAtOnce = 1000;
constexpr int kSeriesAtOnce = 500;

/// What all studies of a patient have alike.
bool isOfPatient(const SearchCondition* condition)
{
    return condition->path.front().getGroup() == DCM_PatientID.getGroup();
}

int instanceNumber(const TagMap& image)
{
    int number = 0;
    return image.findAndGetInt(DCM_InstanceNumber, number) ? number : std::numeric_limits<int>::max();
}

/// In the order in which answers have them.
std::vector<const TagMap*> imagesOf(const TagMap& series)
{
    std::vector<std::pair<std::pair<int, QByteArray>, const TagMap*>> keyed;
    for (const TagMap* image : series.children())
        keyed.push_back({{instanceNumber(*image), image->uid(TagMap::ImageLevel)}, image});
    std::sort(keyed.begin(), keyed.end(), [](const auto& a, const auto& b) { return a.first < b.first; });
    std::vector<const TagMap*> images;
    images.reserve(keyed.size());
    for (const auto& each : keyed)
        images.push_back(each.second);
    return images;
}

}  // namespace

Result SearchRun::run(FoundAnswers& answers)
{
    if (!mPlan.isExact() && !mPlan.isNarrowed) {
        mTooBroad =
            QStringLiteral("No index helps to find this: ask also for a name, date, identifier or UID");
        return {};
    }
    switch (mRequest.level) {
    case SearchLevel::Patients:
        return runPatients(answers);
    case SearchLevel::Studies:
        return runStudies(answers);
    case SearchLevel::Series:
        return runSeries(answers);
    case SearchLevel::Instances:
        return runImages(answers);
    }
    return {};
}

Result SearchRun::findStudies(const Kxg::SearchQuery& query, std::vector<Kxg::FoundStudy>& found, int* behind)
{
    return findCurrent(mSearch, found, [&] { return mSearch.studies(query, found, behind); });
}

Result SearchRun::findSeries(const Kxg::SearchQuery& query, std::vector<Kxg::FoundSeries>& found, int* behind)
{
    return findCurrent(mSearch, found, [&] { return mSearch.series(query, found, behind); });
}

void SearchRun::noteRemaining(int remaining, int most)
{
    mRemaining = std::max(0, std::min(remaining, most));
    mIsRemainingCut = remaining > most;
}

// ---- looking once more

/// Null when there is nothing to look at.
std::shared_ptr<const ServedStudy> SearchRun::obtain(const QByteArray& studyUID)
{
    std::shared_ptr<const ServedStudy> study;
    const Presence presence = mShelf.find(studyUID, study);
    mIsHeldUp = mIsHeldUp || presence == Presence::Held;
    if (presence == Presence::Damaged || presence == Presence::Missing)
        mUnread.insert(studyUID);
    return study;
}

bool SearchRun::holdsImage(const QByteArray& studyUID, const QByteArray& seriesUID)
{
    if (mPlan.onImages.empty())
        return true;
    const std::shared_ptr<const ServedStudy> study = obtain(studyUID);
    return study != nullptr && study->look([&](const TagFile& file) {
        const auto& images = file.imagesByUID();
        return std::any_of(images.begin(), images.end(), [&](const TagMap* image) {
            return (seriesUID.isEmpty() || image->uid(TagMap::SeriesLevel) == seriesUID) &&
                   holdAll(mPlan.onImages, ImageAttributes(*image), mRequest);
        });
    });
}

bool SearchRun::holds(const Kxg::FoundStudy& study) const
{
    return holdAll(mPlan.onStudy, KeptAttributes(study.attributes), mRequest);
}

bool SearchRun::holds(const Kxg::FoundSeries& series) const
{
    return holdAll(mPlan.onStudy, KeptAttributes(series.study.attributes), mRequest) &&
           holdAll(mPlan.onSeries, KeptAttributes(series.attributes), mRequest);
}

// ---- studies, series, patients

/// `find(query, found, behind)` and `count(query, most, number)` ask the database, `holds(found)` looks once more.
template <typename Found, typename Find, typename Count, typename Holds>
Result SearchRun::runListed(FoundAnswers& answers, const Find& find, const Count& count, const Holds& holds)
{
    Kxg::SearchQuery query = mPlan.query;
    std::vector<Found> found;
    if (mPlan.isExact()) {
        query.offset = mRequest.offset;
        query.limit = mRequest.limit;
        query.counted = kCounted + 1;
        int behind = 0;
        const Result result = find(query, found, &behind);
        for (const Found& each : found)
            answers.add(each);
        noteRemaining(behind, kCounted);
        return result;
    }
    // How many are to be looked at is bounded, and so is what is in memory of them.
    const int most = mPlan.onImages.empty() ? kMaxRows : kMaxTagFiles;
    int candidates = 0;
    int matched = 0;
    Result result = count(query, most + 1, candidates);
    if (candidates > most) {
        mTooBroad = QStringLiteral(
                        "More than %1 studies or series would have to be looked through: narrow the search")
                        .arg(most);
        return result;
    }
    query.limit = kRowsAtOnce;
    for (query.offset = 0; result.good() && query.offset < candidates; query.offset += kRowsAtOnce) {
        result = find(query, found, nullptr);
        for (const Found& each : found) {
            if (!holds(each))
                continue;
            if (matched >= mRequest.offset && answers.count() < mRequest.limit)
                answers.add(each);
            ++matched;
        }
    }
    noteRemaining(matched - mRequest.offset - answers.count(), kMaxRemaining);
    return result;
}

Result SearchRun::runStudies(FoundAnswers& answers)
{
    return runListed<Kxg::FoundStudy>(
        answers,
        [this](const auto& query, auto& found, int* behind) { return findStudies(query, found, behind); },
        [this](const auto& query, int most, int& number) {
            return mSearch.countStudies(query, most, number);
        },
        [this](const Kxg::FoundStudy& study) { return holds(study) && holdsImage(study.uid, {}); });
}

Result SearchRun::runSeries(FoundAnswers& answers)
{
    return runListed<Kxg::FoundSeries>(
        answers,
        [this](const auto& query, auto& found, int* behind) { return findSeries(query, found, behind); },
        [this](const auto& query, int most, int& number) { return mSearch.countSeries(query, most, number); },
        [this](const Kxg::FoundSeries& series) {
            return holds(series) && holdsImage(series.study.uid, series.uid);
        });
}

Result SearchRun::runPatients(FoundAnswers& answers)
{
    const bool isOfPatients = mPlan.onSeries.empty() && mPlan.onImages.empty() &&
                              std::all_of(mPlan.onStudy.begin(), mPlan.onStudy.end(), isOfPatient);
    if (!isOfPatients) {
        mTooBroad = QStringLiteral("Patients are found by what is indexed of their studies only");
        return {};
    }
    if (!mPlan.isExact())
        return lookThroughPatients(answers);
    Kxg::SearchQuery query = mPlan.query;
    std::vector<Kxg::FoundPatient> found;
    query.offset = mRequest.offset;
    query.limit = mRequest.limit + 1;
    Result result = mSearch.patients(query, found);
    const int shown = std::min(mRequest.limit, static_cast<int>(found.size()));
    for (int i = 0; i < shown; ++i)
        answers.add(found[static_cast<size_t>(i)]);
    // Nobody has counted them; there is one more at least.
    mRemaining = static_cast<int>(found.size()) - shown;
    mIsRemainingCut = mRemaining > 0;
    return result;
}

/// Those of the index may be more than are meant.
Result SearchRun::lookThroughPatients(FoundAnswers& answers)
{
    Kxg::SearchQuery query = mPlan.query;
    std::vector<Kxg::FoundPatient> found;
    query.limit = kRowsAtOnce;
    int matched = 0;
    Result result = mSearch.patients(query, found);
    while (result.good() && !found.empty()) {
        for (const Kxg::FoundPatient& patient : found) {
            if (!holdAll(mPlan.onStudy, KeptAttributes(patient.attributes), mRequest))
                continue;
            if (matched++ >= mRequest.offset && answers.count() < mRequest.limit)
                answers.add(patient);
        }
        query.offset += kRowsAtOnce;
        if (query.offset >= kMaxRows) {
            mTooBroad =
                QStringLiteral("More than %1 patients would have to be looked through: narrow the search")
                    .arg(kMaxRows);
            return result;
        }
        result = mSearch.patients(query, found);
    }
    noteRemaining(matched - mRequest.offset - answers.count(), kMaxRemaining);
    return result;
}

// ---- images

/// Adds images of a series behind the first `skipped` that hold. How many there are besides `skipped`.
int SearchRun::addImages(const Kxg::FoundSeries& series, int skipped, int wanted, FoundAnswers& answers)
{
    const std::shared_ptr<const ServedStudy> study = obtain(series.study.uid);
    if (study == nullptr)
        return 0;
    return study->look([&](const TagFile& file) {
        const TagMap* held = file.findSeries(series.uid);
        int matched = 0;
        if (held == nullptr)
            return 0;
        for (const TagMap* image : imagesOf(*held)) {
            if (!holdAll(mPlan.onImages, ImageAttributes(*image), mRequest))
                continue;
            if (matched++ >= skipped && wanted-- > 0)
                answers.add(series, *image);
        }
        return matched;
    });
}

/// False when enough is known.
bool SearchRun::takeImages(const std::vector<Kxg::FoundSeries>& page, int& skipped, FoundAnswers& answers)
{
    for (const Kxg::FoundSeries& series : page) {
        if (!series.study.isBuilt || !holds(series))
            continue;
        const int wanted = mRequest.limit - answers.count();
        // Where every image holds, their number is known without looking.
        const bool isPassed = mPlan.onImages.empty() && (series.instances <= skipped || wanted <= 0);
        const int before = answers.count();
        const int matched =
            isPassed ? series.instances : addImages(series, skipped, std::max(0, wanted), answers);
        const int passed = std::min(skipped, matched);
        skipped -= passed;
        mRemaining += matched - passed - (answers.count() - before);
        if (mRemaining > kMaxRemaining)
            return false;
    }
    return true;
}

Result SearchRun::runImages(FoundAnswers& answers)
{
    const bool opensAll = !mPlan.onImages.empty();
    int candidates = 0;
    Result result = opensAll ? mSearch.countSeries(mPlan.query, kMaxTagFiles + 1, candidates) : Result();
    if (candidates > kMaxTagFiles) {
        mTooBroad =
            QStringLiteral(
                "The images of more than %1 series would have to be looked through: narrow the search")
                .arg(kMaxTagFiles);
        return result;
    }
    int skipped = mRequest.offset;
    Kxg::SearchQuery query = mPlan.query;
    query.limit = kSeriesAtOnce;
    std::vector<Kxg::FoundSeries> page;
    bool isMore = true;
    while (result.good() && isMore) {
        result = findSeries(query, page);
        isMore = result.good() && takeImages(page, skipped, answers) &&
                 static_cast<int>(page.size()) == kSeriesAtOnce && query.offset < kMaxRows;
        query.offset += kSeriesAtOnce;
    }
    mIsRemainingCut = mRemaining > kMaxRemaining || query.offset > kMaxRows;
    mRemaining = std::min(mRemaining, kMaxRemaining);
    return result;
}

}  // namespace Kdd::DicomWeb
