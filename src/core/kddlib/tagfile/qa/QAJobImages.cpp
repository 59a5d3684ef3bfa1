#include "kddlib/Limits.h"
#include "kddlib/tagfile/StudyPreviews.h"
#include "kddlib/tagfile/qa/ImageIdentity.h"
#include "kddlib/tagfile/qa/QAEditor.h"
#include "kddlib/tagfile/qa/QAJob.h"
#include "kddlib/tagfile/qa/QAVolumes.h"
#include "kddlib/tagmodel/OwnAttributes.h"
#include "kddlib/tagmodel/TagElement.h"
#include "kddlib/tagmodel/TagMap.h"
#include "platform/base/LogFile.h"

#include <QSet>

#include <dcmtk/dcmdata/dcdeftag.h>

#include <algorithm>
#include <memory>

namespace Kdd
{

namespace
{

const DcmTagKey kAuditTime(0x0071, 0x0022);

/// Whether the log tells already of the change at that time.
bool isNoted(const AuditLog& log, const QString& time, const AuditChange& change)
{
    QVector<AuditEntry> entries;
    log.decode(entries);
    return std::any_of(entries.cbegin(), entries.cend(), [&](const AuditEntry& entry) {
        return entry.time == time && entry.changes.contains(change);
    });
}

}  // namespace

bool movesImages(const DcmTagKey& key)
{
    return key == DCM_StudyInstanceUID || key == DCM_SeriesInstanceUID || key == DCM_SOPInstanceUID;
}

/// What was named as a whole is meant as it is now, while nobody else can change it.
void QAJob::selectImages()
{
    QSet<QByteArray> named;
    const auto addImage = [&](const QByteArray& key) {
        if (!named.contains(key))
            mImages.append(key);
        named.insert(key);
    };
    const auto add = [&](const TagMap& series) {
        for (const TagMap* image : series.children())
            addImage(StudyTree::imageKey(*image));
    };
    for (const QByteArray& key : qAsConst(mJob.images))
        addImage(key);
    for (const QByteArray& uid : qAsConst(mJob.series)) {
        if (const TagMap* series = origin().findSeries(uid))
            add(*series);
        else if (!mIsMove || mDestination.tree().findSeries(uid) == nullptr)
            mJob.outcome.notFound.append(uid);
    }
    if (mJob.isOfWholeStudy) {
        for (const TagMap* series : origin().series())
            add(*series);
    }
    mJob.outcome.asked = mImages.size();
}

Result QAJob::applyToImages()
{
    Result result;
    for (auto key = mImages.cbegin(); key != mImages.cend() && result.good(); ++key)
        result = applyTo(*key);
    return result;
}

Result QAJob::applyTo(const QByteArray& key)
{
    TagMap* image = origin().findImage(key);
    if (image != nullptr)
        return applyTo(*image, key);
    // What an earlier run has moved is not missing.
    if (!mIsMove || mDestination.tree().findImage(key) == nullptr)
        mJob.outcome.notFound.append(key);
    return {};
}

Result QAJob::applyTo(TagMap& image, const QByteArray& key)
{
    Edit edit = {image, key, image.uid(TagMap::SeriesLevel), {}, {}};
    // What a damaged log told could not be told again, so nothing may be written in its place; and behind what is cut off
    // a new entry would be read as its rest.
    QVector<AuditEntry> entries;
    if (!edit.before.read(image) || !edit.before.decode(entries))
        return failAt(key, QStringLiteral("its audit log is damaged"));
    if (mReordersImages)
        // Before the image changes, while volume and image still agree on its place.
        takeVolumes(origin(), *image.parent());
    Result result = substitute(edit);
    if (result.bad())
        return failAt(key, result.text());
    // All is there already, so the job leaves no entry: running it again changes nothing.
    if (edit.changes.isEmpty())
        return result;
    result = note(edit);
    if (result.bad())
        return result;
    const bool isMoved = std::any_of(edit.changes.cbegin(), edit.changes.cend(),
                                     [](const AuditChange& change) { return movesImages(change.key); });
    if (isMoved)
        return move(edit);
    keep(edit, origin(), key, There::Nothing);
    return result;
}

Result QAJob::substitute(Edit& edit) const
{
    QAEditor editor(edit.image, mJob.substitutions);
    Result result;
    for (int i = 0; i < mJob.substitutions.size() && result.good(); ++i)
        result = editor.substitute(mJob.substitutions.at(i));
    // Whoever moves a series to a study need not say that its images then belong to that study.
    if (result.good() && mIsMove && editor.hasChanged(DCM_SeriesInstanceUID))
        result = editor.substitute({DCM_StudyInstanceUID, QString::fromLatin1(mJob.studyUID)});
    for (const AuditChange& change : editor.changes()) {
        // Pixels cannot be looked at, so only the log tells that this job was here before.
        if (change.key != DCM_PixelData || !isNoted(edit.before, mTime, change))
            edit.changes.append(change);
    }
    return result;
}

/// Tells the changes in the image's audit log.
Result QAJob::note(Edit& edit)
{
    AuditLog log = edit.before;
    log.append({mTime, edit.changes});
    // Found out here and not at the end, before logs of many images have taken the memory.
    mLogBytes += log.text().size();
    if (mLogBytes > kMaxBodySize)
        return failAt(edit.key, QStringLiteral("the audit logs become too long to be stored"));
    if (!log.store(edit.image))
        return failAt(edit.key, QStringLiteral("there is no private block left for its audit log"));
    if (!mJob.timestamp.trimmed().isEmpty() && !mJob.login.isEmpty())
        edit.image.putAndInsertValue(kAuditTime, kOurPrivateCreator, VrCode::DT, mJob.timestamp);
    ++mJob.outcome.changed;
    mJob.outcome.images.append({edit.key, edit.changes});
    // Making one takes its time, and nobody will see it.
    if (mIsPreview)
        return {};
    if (edit.hasChanged(DCM_PixelData) && edit.image.findElement(kPreview) != nullptr)
        renewPreview(edit);
    return {};
}

/// A picture of what was corrected away is worse than none.
void QAJob::renewPreview(const Edit& edit)
{
    if (addPreview(&edit.image, filePathOf(edit.image)))
        return;
    edit.image.deleteElement(kPreview);
    if (edit.image.findElement(kPreview) != nullptr)
        // The series may hold one for all its images, which this one must not show either.
        edit.image.markAsMissing(kPreview);
}

// ---- moving

/// Takes the volumes out of a series, once. Null when it has none.
QASeriesMove* QAJob::takeVolumes(StudyTree& tree, TagMap& series)
{
    const Series key(&tree, series.uid(TagMap::SeriesLevel));
    const auto found = mMoves.find(key);
    if (found != mMoves.end())
        return &found->second;
    if (series.volumes().isEmpty())
        return nullptr;
    return &mMoves.emplace(key, QAVolumes::takeOut(tree, series)).first->second;
}

/// Puts the image where its UIDs now say. An image of the same UID that is there may be the same one, brought
/// by an earlier run; another one is replaced, unless the job itself has given the UID.
Result QAJob::move(const Edit& edit)
{
    const bool staysInSeries =
        !edit.hasChanged(DCM_StudyInstanceUID) && !edit.hasChanged(DCM_SeriesInstanceUID);
    StudyTree& target = staysInSeries ? origin() : mDestination.tree();
    const QByteArray newKey = StudyTree::imageKey(edit.image);
    TagMap* there = target.findImage(newKey);
    ++mJob.outcome.moved;
    if (there == nullptr || there == &edit.image) {
        keep(edit, target, newKey, There::Nothing);
        return place(edit, target, newKey);
    }
    if (isMovedAlready(edit, *there)) {
        keep(edit, target, newKey, There::TheSame);
        dropFromOrigin(edit);
        return {};
    }
    // A UID that the job gives is the job's fault; the same image in both studies is not.
    if (edit.hasChanged(DCM_SOPInstanceUID))
        return failAt(edit.key, QStringLiteral("there is another image %1").arg(QString::fromLatin1(newKey)));
    LogFile::warnf("Image %s of study %s replaces the one that study %s had", newKey.constData(),
                   mJob.oldStudyUID.constData(), mJob.studyUID.constData());
    const QByteArray seriesUID = there->uid(TagMap::SeriesLevel);
    takeVolumes(target, *there->parent());
    mLeft.insert({&target, seriesUID});
    keep(edit, target, newKey, There::Another);
    return place(edit, target, newKey);
}

void QAJob::keep(const Edit& edit, const StudyTree& holder, const QByteArray& keyNow, There there)
{
    mRecord.note({mIsMove ? mJob.oldStudyUID : mJob.studyUID, edit.seriesUID, edit.key, edit.before,
                  edit.changes, &holder, keyNow, there == There::TheSame, there == There::Another});
}

/// An earlier run of the job may have ended when only the destination was written. What happened to the image there
/// since then stays.
bool QAJob::isMovedAlready(const Edit& edit, const TagMap& there) const
{
    AuditLog log;
    return mIsMove && log.read(there) && isContinued(edit.before, edit.changes, log);
}

void QAJob::dropFromOrigin(const Edit& edit)
{
    mLeft.insert({&origin(), edit.image.parent()->uid(TagMap::SeriesLevel)});
    delete origin().takeImage(edit.key);
}

Result QAJob::place(const Edit& edit, StudyTree& target, const QByteArray& newKey)
{
    TagMap& series = *edit.image.parent();
    const QByteArray seriesUID = series.uid(TagMap::SeriesLevel);
    if (QASeriesMove* volumes = takeVolumes(origin(), series))
        volumes->movedTo.insert(edit.key, newKey);
    mLeft.insert({&origin(), seriesUID});
    std::unique_ptr<TagMap> image(origin().takeImage(edit.key));
    // It named volumes of its old series; its places are given back by image when all have moved.
    image->deleteElement(kVolumeIndex);
    const TagMap* placed = target.add(image.release(), nullptr, true);
    if (placed == nullptr)
        return failAt(edit.key,
                      QStringLiteral("study %1 does not take it").arg(QString::fromLatin1(mJob.studyUID)));
    return {};
}

}  // namespace Kdd
