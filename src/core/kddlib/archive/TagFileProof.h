#pragma once

#include "platform/database/StudyProofs.h"

#include <QString>

#include <memory>

namespace Kdd
{

/// Tells of a study's tag file by its bytes whether it is the one that was written last, all of it, and what it is if not.
///
/// A builder writes the file before the database knows of it; so a file that is another one is looked at again under the
/// study's claim, which is kept then, and nobody is blamed for work at hand. Used by the thread of its catalogue.
class TagFileProof
{
public:
    enum class State {
        Unproven,  ///< the study waits to be built or has no tag file, somebody works on it, or none was written since
                   ///< digests are kept
        AsWritten,  ///< every byte
        Absent,
        Older,    ///< the archive wrote it before the last one: a backup was brought back
        Damaged,  ///< it cannot be read, or its bytes changed and its time did not
        Foreign,  ///< something else wrote it
    };

    TagFileProof(Kxg::Catalogue& catalogue, QByteArray studyUID)
        : mCatalogue(catalogue)
        , mStudyUID(std::move(studyUID))
    {
    }

    /// Waits up to `patienceMs` [ms] for whoever works on the study. Failure: that of the database.
    Result run(int patienceMs);

    State state() const { return mState; }
    bool isFault() const { return mState != State::Unproven && mState != State::AsWritten; }

    /// What is wrong, in a sentence.
    QString fault() const;

    /// Of a fault, unless the database cannot be changed; else null.
    Kxg::StudyClaim* claim() const { return mClaim.get(); }

    qint64 fileSize() const { return mProofs.last.size; }

private:
    Result look();
    State compare();

    Kxg::Catalogue& mCatalogue;
    const QByteArray mStudyUID;
    State mState = State::Unproven;
    QString mPath;
    QString mReason;
    Kxg::TagFileProofs mProofs;
    std::unique_ptr<Kxg::StudyClaim> mClaim;
};

}  // namespace Kdd
