#include "server/DatabaseWitness.h"

#include <kddlib/LogFile.h>

namespace Kdd
{

bool DatabaseWitness::find(const QByteArray& studyUID, Kxg::TagFileProofs& proofs) const
{
    return mDatabase
        .ask(nullptr, [&](Kxg::StudySearch& search) { return search.tagFileProofs(studyUID, proofs); })
        .good();
}

bool DatabaseWitness::isDamaged(const QByteArray& studyUID, const Kxg::TagFileStamp& read)
{
    Kxg::TagFileProofs proofs;
    if (!mProves || !find(studyUID, proofs))
        return false;
    const Kxg::TagFileStamp& written = proofs.last;
    const bool isUntouched =
        written.modified != 0 && read.fileSize == written.fileSize && read.modified == written.modified;
    if (!isUntouched || read.digest == written.digest)
        return false;
    LogFile::errorf(
        "The tag file of study %s is damaged and not served: its bytes have changed, its size and "
        "time have not",
        studyUID.constData());
    return true;
}

/// One that is being removed has no images any more.
DicomWeb::Presence DatabaseWitness::whyAbsent(const QByteArray& studyUID)
{
    Kxg::TagFileProofs proofs;
    if (!find(studyUID, proofs) || !proofs.hasImages)
        return DicomWeb::Presence::Absent;
    if (proofs.isWaiting && proofs.last.digest.isEmpty())
        return DicomWeb::Presence::Unbuilt;
    LogFile::errorf("The tag file of study %s is missing", studyUID.constData());
    return DicomWeb::Presence::Missing;
}

}  // namespace Kdd
