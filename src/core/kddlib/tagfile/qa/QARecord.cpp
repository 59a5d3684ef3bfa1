#include "kddlib/tagfile/qa/QARecord.h"

#include "kddlib/tagfile/SeriesRecord.h"
#include "kddlib/tagfile/StudyRecord.h"
#include "kddlib/tagfile/StudyTree.h"
#include "kddlib/tagfile/TagFileSettings.h"
#include "kddlib/tagfile/qa/BuildCorrections.h"
#include "kddlib/tagfile/qa/QAData.h"
#include "kddlib/tagmodel/OwnAttributes.h"
#include "kddlib/tagmodel/TagMap.h"
#include "platform/base/LogFile.h"
#include "platform/database/Kxg.h"

#include <QSet>

#include <dcmtk/dcmdata/dcdeftag.h>

#include <algorithm>

namespace Kdd
{

namespace
{

/// As long as tag files are waited for [ms].
constexpr int kPatience = 400;

const char* const kNotKept = "The correction could not be kept";

/// Whether `log` goes on where the image's log ended before the job, and with these changes.
bool tellsOf(const QAImageChange& change, const AuditLog& log)
{
    return isContinued(change.before, change.changes, log);
}

/// Of an image that was never corrected before.
Kxg::ImageCorrection noCorrection(const ImageIdentity& identity, const QByteArray& seriesUID)
{
    return {identity.studyUID, identity.image, identity.studyUID, seriesUID, identity.image, QByteArray()};
}

bool isHeld(const Kxg::StudyContents& contents, const QByteArray& key)
{
    return std::any_of(contents.images.begin(), contents.images.end(),
                       [&](const Kxg::ListedImage& listed) { return key == listed.key(); });
}

}  // namespace

QARecord::~QARecord()
{
    for (auto& each : mStudies) {
        // One that was made and got no images is nobody's.
        if (each.second.isMade && mRequests.isEmpty())
            each.second.claim->finishRemoved();
    }
}

/// The studies in the order in which they are claimed, and those of them that the database knows. Where it knows none there
/// is nothing to keep, and no catalogue.
Result QARecord::open(const QAData& job, QList<QByteArray>& uids, QVector<QByteArray>& known)
{
    const QByteArray address = Kxg::DatabaseServer();
    if (address.isEmpty())
        // Without a database the correction lives in the tag files alone.
        return {};
    Result result;
    std::unique_ptr<Kxg::Catalogue> catalogue = Kxg::Catalogue::open(address, result);
    uids = {job.studyUID};
    if (!job.oldStudyUID.isEmpty())
        uids.append(job.oldStudyUID);
    // The order of the files, so that two jobs that each move images to the other's study do not wait for each other.
    std::sort(uids.begin(), uids.end(), [](const QByteArray& a, const QByteArray& b) {
        return TagFileSettings::cacheFilePathForStudy(a.constData()) <
               TagFileSettings::cacheFilePathForStudy(b.constData());
    });
    // All are looked up before one is claimed: where the database knows none there is nothing to keep.
    for (const QByteArray& uid : qAsConst(uids)) {
        bool isThere = false;
        if (result.good())
            result = catalogue->findStudy(uid, isThere);
        if (isThere)
            known.append(uid);
    }
    if (result.bad())
        return asked(result).within(QString::fromLatin1(kNotKept));
    // Images that no database lists are not built again either, so there is nobody to be told.
    if (!known.isEmpty())
        mCatalogue = std::move(catalogue);
    return {};
}

Result QARecord::consult(const QAData& job)
{
    QList<QByteArray> uids;
    QVector<QByteArray> known;
    const Result result = open(job, uids, known);
    for (const QByteArray& uid : qAsConst(known))
        mStudies[uid] = {};
    return result;
}

Result QARecord::claim(const QAData& job)
{
    QList<QByteArray> uids;
    QVector<QByteArray> known;
    Result result = open(job, uids, known);
    if (mCatalogue == nullptr)
        return result;
    mIsClaimed = true;
    for (const QByteArray& uid : qAsConst(uids)) {
        const bool isDestination = uid == job.studyUID;
        if (!isDestination && !known.contains(uid))
            continue;
        result = claimOne(uid, isDestination);
        if (result.bad())
            return result;
        const auto claimed = mStudies.find(uid);
        if (claimed != mStudies.end())
            claimed->second.isMade = !known.contains(uid);
    }
    return {};
}

Result QARecord::lockedOut(const QString& reason)
{
    mFault = ChangeFault::LockedOut;
    return Result::failure(reason);
}

/// What the database said.
Result QARecord::asked(const Result& result)
{
    if (result.bad())
        mFault = ChangeFault::Unasked;
    return result;
}

/// The destination is made when it is not there. Another study may have lost its last image and be gone meanwhile.
Result QARecord::claimOne(const QByteArray& studyUID, bool isDestination)
{
    using Making = Kxg::Catalogue::IfAbsent;
    std::unique_ptr<Kxg::StudyClaim> claim;
    bool isThere = false;
    const Result result =
        mCatalogue->claim(studyUID, kPatience, claim, isDestination ? Making::Create : Making::Fail);
    const QString study = QString::fromLatin1(studyUID);
    if (result.bad() && mCatalogue->findStudy(studyUID, isThere).good() && !isThere)
        return {};
    if (result.bad())
        return asked(result).within(QStringLiteral("Study %1 cannot be claimed").arg(study));
    if (claim == nullptr)
        return lockedOut(QStringLiteral("Study %1 is being worked on by another process").arg(study));
    Study& claimed = mStudies[studyUID];
    claimed.claim = std::move(claim);
    return {};
}

/// Once the tag files are held.
Result QARecord::read()
{
    Result result;
    for (auto& each : mStudies) {
        Study& study = each.second;
        if (result.good())
            result = mCatalogue->studyContents(each.first, study.contents);
        if (result.good())
            result = mCatalogue->corrections(each.first, study.corrections);
        // Asked before the job writes: afterwards the file is another one in any case.
        const Kxg::TagFileStamp& stamp = study.contents.tagFile;
        study.isRecognised = stamp.digest.isEmpty() ||
                             isTagFile(TagFileSettings::cacheFilePathForStudy(each.first.constData()), stamp);
    }
    return result;
}

// ---- which image it was

const Kxg::ImageCorrection* QARecord::findShown(const QByteArray& studyUID, const QByteArray& key,
                                                const AuditLog& log) const
{
    const Kxg::ImageCorrection* found = nullptr;
    const auto study = mStudies.find(studyUID);
    if (study == mStudies.end())
        return nullptr;
    // Two files may be shown as the same image, one in front of the other: their logs tell them apart.
    for (const Kxg::ImageCorrection& each : study->second.corrections) {
        if (each.shownStudyUID == studyUID && each.shownImage == key &&
            (found == nullptr || logOf(each).text() == log.text()))
            found = &each;
    }
    return found;
}

const Kxg::ImageCorrection* QARecord::find(const ImageIdentity& identity) const
{
    for (const auto& study : mStudies) {
        for (const Kxg::ImageCorrection& each : study.second.corrections) {
            if (ImageIdentity{each.studyInstanceUID, each.image} == identity)
                return &each;
        }
    }
    return nullptr;
}

/// The correction that is to be replaced, without changes when there is none yet. False when the database knows of one
/// that the tag file does not show: its study waits to be built.
bool QARecord::identify(const QAImageChange& change, Kxg::ImageCorrection& former)
{
    if (const Kxg::ImageCorrection* shown = findShown(change.studyUID, change.key, change.before)) {
        former = *shown;
        const AuditLog log = logOf(*shown);
        return isSameOrContinued(log, change.before) || tellsOf(change, log);
    }
    const QByteArray studyNow = change.holder->studyInstanceUID();
    const Kxg::ImageCorrection* there = findShown(studyNow, change.keyNow, change.before);
    const Kxg::ImageCorrection* left = find({change.studyUID, change.key});
    for (const Kxg::ImageCorrection* each : {there, left}) {
        // An earlier run of this job ended when only the database was done.
        if (each != nullptr && tellsOf(change, logOf(*each))) {
            former = *each;
            return true;
        }
    }
    if (left != nullptr)
        return false;
    former = noCorrection({change.studyUID, change.key}, change.seriesUID);
    const auto study = mStudies.find(change.studyUID);
    const bool isListed = study != mStudies.end() && isHeld(study->second.contents, change.key);
    return isListed || identifyByLog(change, former);
}

/// An image that a correction of which the database knows nothing moved here.
bool QARecord::identifyByLog(const QAImageChange& change, Kxg::ImageCorrection& former)
{
    const TagMap* image = change.holder->findImage(change.keyNow);
    const ImageIdentity identity =
        identityBefore(change.before, {change.studyUID, change.key}, filePathOf(*image));
    std::vector<Kxg::ImageCorrection> known;
    if (asked(mCatalogue->corrections(identity.studyUID, known)).bad())
        return false;
    for (const Kxg::ImageCorrection& each : known) {
        if (ImageIdentity{each.studyInstanceUID, each.image} == identity)
            return false;
    }
    former = noCorrection(identity, change.seriesUID);
    return true;
}

// ---- keeping it

Result QARecord::plan()
{
    if (mCatalogue == nullptr)
        return {};
    Result result = asked(read());
    for (const QAImageChange& change : mChanges) {
        Kxg::ImageCorrection former;
        if (result.bad())
            break;
        // A later change of the same job may have given its place to another image.
        if (change.holder->findImage(change.keyNow) == nullptr)
            continue;
        if (change.wasThereAlready &&
            findShown(change.holder->studyInstanceUID(), change.keyNow, change.before) != nullptr)
            continue;
        const bool isKnown = identify(change, former);
        if (!isKnown && mFault == ChangeFault::Unasked) {
            result =
                Result::failure(QStringLiteral("the image database does not tell of earlier corrections"));
            break;
        }
        if (!isKnown) {
            const QString reason =
                QStringLiteral("Image %1: study %2 is to be built first, for its tag file does not "
                               "show an earlier correction yet")
                    .arg(QString::fromLatin1(change.key), QString::fromLatin1(change.studyUID));
            // It came into being after this job had asked for it: now it can be claimed as well.
            if (mStudies.find(change.studyUID) == mStudies.end())
                return lockedOut(reason);
            mRefusedImage = change.key;
            mFault = ChangeFault::Refused;
            // So that the job can be run when the build is done.
            if (mIsClaimed)
                mCatalogue->requestBuild({change.studyUID}, Kxg::Catalogue::IfGone::PassOver);
            return Result::failure(reason);
        }
        result = add(change, former);
        mIsFinal = mIsFinal || change.replacedAnother;
    }
    return result.within(QString::fromLatin1(kNotKept));
}

Result QARecord::record()
{
    Result result = plan();
    if (result.good() && !mRecorded.empty())
        result =
            asked(mCatalogue->recordCorrections(mRecorded, mRequests)).within(QString::fromLatin1(kNotKept));
    return result;
}

Result QARecord::add(const QAImageChange& change, const Kxg::ImageCorrection& former)
{
    const TagMap* image = change.holder->findImage(change.keyNow);
    ImageOverlay overlay;
    if (!former.changes.isEmpty() && !overlay.decode(former.changes))
        return Result::failure(
            QStringLiteral("what the image database has of earlier corrections of image %1 "
                           "is damaged")
                .arg(QString::fromLatin1(change.key)));
    for (const AuditChange& each : change.changes) {
        if (each.key != DCM_PixelData)
            overlay.note(*image, each.key);
    }
    // And what its log tells of earlier corrections, the log itself included.
    overlay.noteLogged(*image);
    const QByteArray seriesUID = overlay.seriesOf(*image);
    mFormer.push_back(former);
    if (seriesUID.isEmpty() && former.shownStudyUID == change.holder->studyInstanceUID())
        mFormer.back().shownSeriesUID.clear();
    mRecorded.push_back({former.studyInstanceUID, former.image, change.holder->studyInstanceUID(), seriesUID,
                         change.keyNow, overlay.encode()});
    return {};
}

Result QARecord::takeBack()
{
    if (mRecorded.empty())
        return {};
    // Files of the image that was replaced would go along.
    if (mIsFinal)
        return Result::failure(
            QStringLiteral("the image database keeps the correction, and the next build makes it"));
    QMap<QByteArray, qint64> requests;
    const Result result = mCatalogue->recordCorrections(mFormer, requests);
    if (result.bad())
        return Result::failure(
            QStringLiteral("the image database keeps the correction (%1), and the next build makes it")
                .arg(result.text()));
    mCatalogue->finishRequests(mRequests.values().toVector() + requests.values().toVector());
    mRequests.clear();
    mRecorded.clear();
    return {};
}

/// Whether an image is listed now that stood behind one which left: only a build can read it.
bool QARecord::uncovers(const StudyTree& tree, const QByteArray& studyUID)
{
    QSet<QByteArray> left;
    for (const QAImageChange& change : mChanges) {
        if (change.studyUID == studyUID && tree.findImage(change.key) == nullptr)
            left.insert(change.key);
    }
    if (left.isEmpty())
        return false;
    Kxg::StudyContents contents;
    // In doubt it is built.
    if (mCatalogue->studyContents(studyUID, contents).bad())
        return true;
    return std::any_of(contents.images.begin(), contents.images.end(),
                       [&](const Kxg::ListedImage& listed) { return left.contains(listed.key()); });
}

void QARecord::finish(const StudyTree& tree, const Kxg::TagFileStamp& stamp, const QByteArray& studyUID)
{
    const auto found = mStudies.find(studyUID);
    const qint64 request = mRequests.value(studyUID, 0);
    if (found == mStudies.end() || request == 0)
        return;
    Study& study = found->second;
    Result result;
    Kxg::BuiltStudy shown = builtStudy(tree.series(), stamp);
    for (const QAImageChange& change : mChanges) {
        if (change.studyUID != change.holder->studyInstanceUID()) {
            shown.movedFrom = change.studyUID;
            shown.movedTo = change.holder->studyInstanceUID();
        }
    }
    // A tag file that was not the one that the database knows may lack more than this correction.
    if (!study.isRecognised) {
        result = study.claim->noteSearch(shown);
    } else if (!tree.isEmpty()) {
        result = study.claim->finishChange(shown, uncovers(tree, studyUID) ? 0 : request);
    } else {
        Kxg::StudyContents left;
        result = mCatalogue->studyContents(studyUID, left);
        // With volume files left the study stays in the database, but has no tag file.
        const bool isGone = left.images.empty() && left.volumes.isEmpty();
        if (result.good() && isGone)
            result = mCatalogue->finishRequests({request});
        if (result.good() && isGone)
            result = study.claim->finishRemoved();
        else if (result.good() && left.images.empty())
            result = study.claim->finishChange(shown, request);
    }
    if (result.bad())
        LogFile::warnf("Study %s is built once more: %s", studyUID.constData(),
                       qUtf8Printable(result.text()));
}

}  // namespace Kdd
