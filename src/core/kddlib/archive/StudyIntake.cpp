#include "kddlib/archive/StudyIntake.h"

#include "kddlib/archive/ArchiveDatabase.h"
#include "kddlib/archive/FileWalk.h"
#include "kddlib/archive/StudyCompletion.h"
#include "kddlib/tagmodel/OwnAttributes.h"
#include "kddlib/tagmodel/TagMap.h"
#include "platform/base/LogFile.h"

#include <algorithm>

namespace Kdd
{

namespace
{

/// Images held in memory before the studies that got none for the longest time are written.
constexpr int kMaxPendingImages = 50000;

}  // namespace

StudyIntake::StudyIntake(Kxg::Catalogue& catalogue, WorkObserver& observer)
    : mCatalogue(catalogue)
    , mObserver(observer)
    , mRegistration(catalogue)
{
}

bool StudyIntake::take(DicomInput input)
{
    if (!mRegistration.add(input))
        return false;
    return input.kind != DicomInput::Kind::Image || place(input);
}

bool StudyIntake::place(DicomInput& input)
{
    PendingStudy& study = mPending[input.studyUID];
    const QByteArray& path = input.path;
    const int before = study.file.imagesByUID().size();
    // The last of several files of one image is kept, as when they are added one after the other.
    TagMap* image = study.file.addTagMap(input.map.release(), path.constData(), true);
    if (image == nullptr) {
        LogFile::errorf("Could not take %s: it belongs nowhere", path.constData());
        mRefused.push_back({path, QStringLiteral("It belongs nowhere")});
        return true;
    }
    image->putAndInsertValue(kFilePath, VrCode::LO, path);
    const int added = study.file.imagesByUID().size() - before;
    study.images += added;
    mPendingImages += added;
    study.lastTouched = ++mClock;
    study.fileBytes += input.fileBytes;
    study.headerBytes += input.headerBytes;
    return mPendingImages <= kMaxPendingImages || writeLongestUntouched();
}

bool StudyIntake::writeLongestUntouched()
{
    return write(std::min_element(mPending.begin(), mPending.end(), [](const auto& a, const auto& b) {
        return a.second.lastTouched < b.second.lastTouched;
    }));
}

/// False when the database failed; a study that cannot be completed is told and counted.
bool StudyIntake::write(Pending::iterator study)
{
    if (!mRegistration.flush())
        return false;
    // Corrections may have led all its files elsewhere.
    if (!mRegistration.requests(study->first).isEmpty())
        complete(study->first, &study->second);
    mPendingImages -= study->second.images;
    mPending.erase(study);
    return true;
}

bool StudyIntake::finish()
{
    // Registered first, so that all of it is in the queue when somebody cancels.
    if (!mRegistration.flush())
        return false;
    const int total = static_cast<int>(mPending.size());
    while (!mPending.empty() && !mObserver.isCancelled()) {
        if (!write(mPending.begin()))
            return false;
        mObserver.progress(total - static_cast<int>(mPending.size()), total);
    }
    // Volume files without images, and studies that files were taken from.
    for (const QByteArray& studyUID : mRegistration.studies()) {
        if (!mCompleted.contains(studyUID) && !mObserver.isCancelled())
            complete(studyUID, nullptr);
    }
    return true;
}

bool StudyIntake::complete(const QByteArray& studyUID, PendingStudy* arrivals)
{
    mCompleted.insert(studyUID);
    const std::unique_ptr<Kxg::StudyClaim> claim = claimStudy(mCatalogue, studyUID);
    CompletedStudy completed;
    if (claim != nullptr) {
        StudyCompletion completion(mCatalogue);
        completed = arrivals != nullptr
                        ? completion.complete(*claim, arrivals->file, mRegistration.requests(studyUID))
                        : completion.build(*claim);
    }
    if (!completed.isDone) {
        mRefused.push_back({studyUID, QStringLiteral("Its tag file is not completed; it waits to be built")});
        return false;
    }
    if (completed.isRemoved)
        return true;
    StudyTotals& totals = mTotals[studyUID];
    totals.series = completed.statistics.series;
    totals.images = completed.statistics.images;
    totals.volumes = completed.statistics.volumes;
    totals.tagFileBytes = completed.statistics.storedSize;
    if (arrivals != nullptr) {
        totals.fileBytes += arrivals->fileBytes;
        totals.headerBytes += arrivals->headerBytes;
    }
    return true;
}

bool StudyIntake::completeWaiting(const QList<QByteArray>& paths)
{
    QSet<QByteArray> waiting;
    for (const QByteArray& path : paths) {
        QVector<QByteArray> studies;
        if (!succeeded(mCatalogue.waitingStudies(absolutePath(path), studies)))
            return false;
        for (const QByteArray& study : qAsConst(studies))
            waiting.insert(study);
    }
    for (const QByteArray& studyUID : qAsConst(waiting)) {
        if (!mObserver.isCancelled())
            complete(studyUID, nullptr);
    }
    return true;
}

}  // namespace Kdd
