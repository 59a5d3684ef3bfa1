#include "kddlib/archive/TagFileProof.h"

#include "kddlib/tagfile/StudyRecord.h"
#include "kddlib/tagfile/TagFile.h"
#include "platform/os/FileStatus.h"
#include "platform/os/PathName.h"

#include <algorithm>

namespace Kdd
{

Result TagFileProof::run(int patienceMs)
{
    Result result = look();
    if (result.bad() || !isFault())
        return result;
    const Result claimed = mCatalogue.claim(mStudyUID, patienceMs, mClaim);
    if (claimed.good() && mClaim == nullptr) {
        mState = State::Unproven;
        return {};
    }
    // Also without the claim, which is not to be had of a database that this process may only read, nor of a study that is
    // gone by now.
    result = look();
    if (result.good() && !isFault())
        mClaim.reset();
    return result;
}

Result TagFileProof::look()
{
    mState = State::Unproven;
    Result result = mCatalogue.tagFileProofs(mStudyUID, mProofs);
    if (result.good() && !mProofs.isWaiting && mProofs.hasImages)
        mState = compare();
    return result;
}

TagFileProof::State TagFileProof::compare()
{
    mPath = TagFile::cacheFilePathForStudy(mStudyUID.constData());
    if (isTagFile(mPath, mProofs.last))
        return State::AsWritten;
    if (presenceOf(mPath) == FilePresence::Absent)
        return State::Absent;
    mReason = QStringLiteral("it is empty");
    if (presenceOf(mPath) == FilePresence::Empty)
        return State::Damaged;
    // Reading it ends a write that somebody began who died.
    TagFile file;
    const bool isReadable = file.readWhenFreeForStudy(mStudyUID.constData(), false);
    if (!isReadable && file.wasLockedOut())
        return State::Unproven;
    if (isTagFile(mPath, mProofs.last))
        return State::AsWritten;
    if (std::any_of(mProofs.former.begin(), mProofs.former.end(),
                    [this](const Kxg::TagFileStamp& former) { return isTagFile(mPath, former); }))
        return State::Older;
    const Kxg::TagFileStamp& last = mProofs.last;
    // Written before digests were kept.
    if (isReadable && last.digest.isEmpty())
        return State::Unproven;
    FileStatus status;
    mReason = isReadable ? QStringLiteral("its bytes have changed, its size and time have not")
                         : QStringLiteral("it cannot be read: %1").arg(file.failure());
    const bool isUntouched = last.modified != 0 && statusOf(pathBytes(mPath).constData(), status) &&
                             status.size == last.fileSize && status.modified == last.modified;
    return isReadable && !isUntouched ? State::Foreign : State::Damaged;
}

QString TagFileProof::fault() const
{
    const auto told = [this](const QString& what) {
        return QStringLiteral("The tag file of study %1, %2, %3")
            .arg(QString::fromUtf8(mStudyUID), mPath, what);
    };
    switch (mState) {
    case State::Absent:
        return told(QStringLiteral("is not there"));
    case State::Older:
        return told(
            QStringLiteral("is not the one that was written last: it is an earlier one of this archive"));
    case State::Foreign:
        return told(QStringLiteral("is not the one that was written last: something else wrote it"));
    case State::Damaged:
        return told(QStringLiteral("is damaged: %1").arg(mReason));
    default:
        return {};
    }
}

}  // namespace Kdd
