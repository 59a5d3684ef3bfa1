#include "kddlib/Limits.h"
#include "kddlib/tagfile/qa/ImageIdentity.h"
#include "kddlib/tagfile/qa/QAJob.h"
#include "kddlib/tagfile/qa/QAVolumes.h"
#include "kddlib/tagmodel/OwnAttributes.h"
#include "kddlib/tagmodel/TagElement.h"
#include "kddlib/tagmodel/TagMap.h"
#include "platform/base/LogFile.h"
#include "platform/os/PathName.h"

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

bool TagFile::QAJob::applyToImages()
{
    return std::all_of(mJob.images.cbegin(), mJob.images.cend(),
                       [this](const QByteArray& key) { return applyTo(key); });
}

bool TagFile::QAJob::applyTo(const QByteArray& key)
{
    TagMap* image = origin().findImage(key);
    if (image != nullptr)
        return applyTo(*image, key);
    // What an earlier run has moved is not missing.
    if (!mIsMove || mDestination.findImage(key) == nullptr)
        mJob.outcome.notFound.append(key);
    return true;
}

bool TagFile::QAJob::applyTo(TagMap& image, const QByteArray& key)
{
    Edit edit = {image, key, image.uid(TagMap::SeriesLevel), {}, {}};
    if (!edit.before.read(image))
        return failAt(key, QStringLiteral("its audit log is damaged"));
    if (mReordersImages)
        takeVolumes(origin(), *image.parent());
    const QString reason = substitute(edit);
    if (!reason.isEmpty())
        return failAt(key, reason);
    if (edit.changes.isEmpty())
        return true;
    if (!note(edit))
        return false;
    const bool isMoved = std::any_of(edit.changes.cbegin(), edit.changes.cend(),
                                     [](const AuditChange& change) { return movesImages(change.key); });
    if (isMoved)
        return move(edit);
    keep(edit, origin(), key, There::Nothing);
    return true;
}

QString TagFile::QAJob::substitute(Edit& edit) const
{
    QAEditor editor(edit.image, mJob.substitutions);
    QString reason;
    for (int i = 0; i < mJob.substitutions.size() && reason.isEmpty(); ++i)
        reason = editor.substitute(mJob.substitutions.at(i));
    // Whoever moves a series to a study need not say that its images then belong to that study.
    if (reason.isEmpty() && mIsMove && editor.hasChanged(DCM_SeriesInstanceUID))
        reason = editor.substitute({DCM_StudyInstanceUID, QString::fromLatin1(mJob.studyUID)});
    for (const AuditChange& change : editor.changes()) {
        // Pixels cannot be looked at, so only the log tells that this job was here before.
        if (change.key != DCM_PixelData || !isNoted(edit.before, mTime, change))
            edit.changes.append(change);
    }
    return reason;
}

/// Tells the changes in the image's audit log.
bool TagFile::QAJob::note(Edit& edit)
{
    AuditLog log = edit.before;
    log.append({mTime, edit.changes});
    mLogBytes += log.text().size();
    if (mLogBytes > kMaxBodySize)
        return failAt(edit.key, QStringLiteral("the audit logs become too long to be stored"));
    if (!log.store(edit.image))
        return failAt(edit.key, QStringLiteral("there is no private block left for its audit log"));
    if (!mJob.timestamp.trimmed().isEmpty() && !mJob.login.isEmpty())
        edit.image.putAndInsertValue(kAuditTime, kOurPrivateCreator, VrCode::DT, mJob.timestamp);
    ++mJob.outcome.changed;
    if (edit.hasChanged(DCM_PixelData) && edit.image.findElement(kPreview) != nullptr)
        renewPreview(edit);
    return true;
}

/// A picture of what was corrected away is worse than none.
void TagFile::QAJob::renewPreview(const Edit& edit)
{
    if (origin().addPreview(origin().findImage(edit.key), filePathOf(edit.image)))
        return;
    edit.image.deleteElement(kPreview);
    if (edit.image.findElement(kPreview) != nullptr)
        edit.image.markAsMissing(kPreview);
}

// ---- moving

/// Takes the volumes out of a series, once. Null when it has none.
QASeriesMove* TagFile::QAJob::takeVolumes(TagFile& file, TagMap& series)
{
    const Series key(&file, series.uid(TagMap::SeriesLevel));
    const auto found = mMoves.find(key);
    if (found != mMoves.end())
        return &found->second;
    if (series.volumes().isEmpty())
        return nullptr;
    return &mMoves.emplace(key, QAVolumes::takeOut(file, series)).first->second;
}

bool TagFile::QAJob::move(const Edit& edit)
{
    const bool staysInSeries =
        !edit.hasChanged(DCM_StudyInstanceUID) && !edit.hasChanged(DCM_SeriesInstanceUID);
    TagFile& target = staysInSeries ? origin() : mDestination;
    const QByteArray newKey = imageKey(edit.image);
    TagMap* there = target.findImage(newKey);
    ++mJob.outcome.moved;
    if (there == nullptr || there == &edit.image) {
        keep(edit, target, newKey, There::Nothing);
        return place(edit, target, newKey);
    }
    if (isMovedAlready(edit, *there)) {
        keep(edit, target, newKey, There::TheSame);
        dropFromOrigin(edit);
        return true;
    }
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

void TagFile::QAJob::keep(const Edit& edit, const TagFile& holder, const QByteArray& keyNow, There there)
{
    mRecord.note({mIsMove ? mJob.oldStudyUID : mJob.studyUID, edit.seriesUID, edit.key, edit.before,
                  edit.changes, &holder, keyNow, there == There::TheSame, there == There::Another});
}

/// An earlier run of the job may have ended when only the destination was written. What happened to the image there
/// since then stays.
bool TagFile::QAJob::isMovedAlready(const Edit& edit, const TagMap& there) const
{
    AuditLog log;
    return mIsMove && log.read(there) && isContinued(edit.before, edit.changes, log);
}

void TagFile::QAJob::dropFromOrigin(const Edit& edit)
{
    mLeft.insert({&origin(), edit.image.parent()->uid(TagMap::SeriesLevel)});
    delete origin().takeImage(edit.key);
}

bool TagFile::QAJob::place(const Edit& edit, TagFile& target, const QByteArray& newKey)
{
    TagMap& series = *edit.image.parent();
    const QByteArray seriesUID = series.uid(TagMap::SeriesLevel);
    if (QASeriesMove* volumes = takeVolumes(origin(), series))
        volumes->movedTo.insert(edit.key, newKey);
    mLeft.insert({&origin(), seriesUID});
    std::unique_ptr<TagMap> image(origin().takeImage(edit.key));
    image->deleteElement(kVolumeIndex);
    TagMap* placed = target.addTagMap(image.release(), nullptr, true);
    if (placed == nullptr)
        return failAt(edit.key,
                      QStringLiteral("study %1 does not take it").arg(QString::fromLatin1(mJob.studyUID)));
    return true;
}

}  // namespace Kdd
