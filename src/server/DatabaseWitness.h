#pragma once

#include "server/dicomweb/StudyShelf.h"
#include "server/dicomweb/search/ThreadSearch.h"

#include <kddlib/StudyProofs.h>

namespace Kdd
{

/// Holds tag files against what the image database knows of the one that was written last. Where the database does not
/// answer, or knows of another file, a tag file is believed, and so is its absence. May be used on any thread.
class DatabaseWitness : public DicomWeb::TagFileWitness
{
public:
    /// The database outlives this. `proves`: the bytes of each tag file that is read are looked at, not its absence alone.
    DatabaseWitness(const DicomWeb::ThreadSearch& database, bool proves)
        : mDatabase(database)
        , mProves(proves)
    {
    }

    bool isDamaged(const QByteArray& studyUID, const Kxg::TagFileStamp& read) override;
    DicomWeb::Presence whyAbsent(const QByteArray& studyUID) override;

private:
    bool find(const QByteArray& studyUID, Kxg::TagFileProofs& proofs) const;

    const DicomWeb::ThreadSearch& mDatabase;
    const bool mProves;
};

}  // namespace Kdd
