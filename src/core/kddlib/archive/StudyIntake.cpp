#include "kddlib/archive/StudyIntake.h"

#include "kddlib/TagFileGenerator.h"
#include "kddlib/archive/ArchiveDatabase.h"
#include "kddlib/archive/FileWalk.h"
#include "kddlib/archive/StudyCompletion.h"
#include "kddlib/net/http/ObjectAddress.h"
#include "kddlib/tagmodel/TagMap.h"
#include "platform/base/LogFile.h"

#include <algorithm>

namespace Kdd
{

namespace
{

/// Images held in memory before the studies that got none for the longest time are written.
constexpr int kMaxPendingImages = 50000;

/// Where to look for studies that wait: of objects behind URLs their folders, for lists have many of one.
QList<QByteArray> placesOf(const QList<QByteArray>& paths)
{
    QList<QByteArray> places;
    QSet<QByteArray> folders;
    for (const QByteArray& path : paths) {
        const QByteArray place =
            isObjectAddress(path) ? path.left(path.lastIndexOf('/')) : absolutePath(path);
        if (!folders.contains(place))
            places.append(place);
        folders.insert(place);
    }
    return places;
}

}  // namespace

StudyIntake::StudyIntake(Kxg::Catalogue& catalogue, WorkObserver& observer)
    : mCatalogue(catalogue)
    , mObserver(observer)
    , mRegistration(catalogue)
{
}

Result StudyIntake::take(DicomInput input)
{
    Result registered = mRegistration.add(input);
    return registered.good() && input.kind == DicomInput::Kind::Image ? place(input) : registered;
}

Result StudyIntake::place(DicomInput& input)
{
    PendingStudy& study = mPending[input.studyUID];
    const QByteArray& path = input.path;
    // Counted by what the study grows: a second file of an image takes the place of the first.
    const int before = study.file.imagesByUID().size();
    if (TagFileGenerator::place(study.file, std::move(input.map), path) == nullptr) {
        LogFile::errorf("Could not take %s: it belongs nowhere", shownAddress(path).constData());
        mRefused.push_back({shownAddress(path), QStringLiteral("It belongs nowhere")});
        return {};
    }
    const int added = study.file.imagesByUID().size() - before;
    study.images += added;
    mPendingImages += added;
    study.lastTouched = ++mClock;
    study.fileBytes += input.fileBytes;
    study.headerBytes += input.headerBytes;
    // Files of one study mostly come together, so the one that was left alone longest is likely complete.
    return mPendingImages <= kMaxPendingImages ? Result() : writeLongestUntouched();
}

Result StudyIntake::writeLongestUntouched()
{
    return write(std::min_element(mPending.begin(), mPending.end(), [](const auto& a, const auto& b) {
        return a.second.lastTouched < b.second.lastTouched;
    }));
}

/// Completes a study and lets go of what was gathered of it, whatever
/// comes of that: what fails waits in the queue.
Result StudyIntake::write(Pending::iterator study)
{
    // Registered before its tag file is touched: what dies on the way leaves a study that waits.
    Result registered = mRegistration.flush();
    if (registered.bad())
        return registered;
    // Corrections may have led all its files elsewhere.
    if (!mRegistration.requests(study->first).isEmpty())
        complete(study->first, &study->second);
    mPendingImages -= study->second.images;
    mPending.erase(study);
    return {};
}

Result StudyIntake::finish()
{
    // Registered first, so that all of it is in the queue when somebody cancels.
    Result result = mRegistration.flush();
    if (result.bad())
        return result;
    const int total = static_cast<int>(mPending.size());
    while (!mPending.empty() && !mObserver.isCancelled()) {
        result = write(mPending.begin());
        if (result.bad())
            return result;
        mObserver.progress(total - static_cast<int>(mPending.size()), total);
    }
    // Volume files without images, and studies that files were taken from.
    for (const QByteArray& studyUID : mRegistration.studies()) {
        if (!mCompleted.contains(studyUID) && !mObserver.isCancelled())
            complete(studyUID, nullptr);
    }
    return {};
}

/// With what has arrived; without arrivals from all files of the study.
void StudyIntake::complete(const QByteArray& studyUID, PendingStudy* arrivals)
{
    mCompleted.insert(studyUID);
    std::unique_ptr<Kxg::StudyClaim> claim;
    CompletedStudy completed;
    completed.result = claimStudy(mCatalogue, studyUID, claim);
    if (claim != nullptr) {
        StudyCompletion completion(mCatalogue);
        completed = arrivals != nullptr
                        ? completion.complete(*claim, arrivals->file, mRegistration.requests(studyUID))
                        : completion.build(*claim);
    }
    if (!succeeded(completed.result)) {
        mRefused.push_back({studyUID, QStringLiteral("Its tag file is not completed; it waits to be built")});
        return;
    }
    if (completed.isRemoved)
        return;
    StudyTotals& totals = mTotals[studyUID];
    totals.series = completed.statistics.series;
    totals.images = completed.statistics.images;
    totals.volumes = completed.statistics.volumes;
    totals.tagFileBytes = completed.statistics.storedSize;
    if (arrivals != nullptr) {
        totals.fileBytes += arrivals->fileBytes;
        totals.headerBytes += arrivals->headerBytes;
    }
}

Result StudyIntake::completeWaiting(const QList<QByteArray>& paths)
{
    // Once for each study, though several paths may lead to its files.
    QSet<QByteArray> waiting;
    for (const QByteArray& place : placesOf(paths)) {
        QVector<QByteArray> studies;
        Result asked = mCatalogue.waitingStudies(place, studies);
        if (asked.bad())
            return asked;
        for (const QByteArray& study : qAsConst(studies))
            waiting.insert(study);
    }
    for (const QByteArray& studyUID : qAsConst(waiting)) {
        if (!mObserver.isCancelled())
            complete(studyUID, nullptr);
    }
    return {};
}

}  // namespace Kdd
