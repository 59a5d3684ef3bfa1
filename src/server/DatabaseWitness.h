#pragma once

#include "server/dicomweb/StudyShelf.h"
#include "server/dicomweb/search/ThreadSearch.h"

namespace Kdd
{

/// Holds tag files against what the image database knows of the one that was written last. Where the database does not
/// answer, or knows of another file, a tag file is believed. May be used on any thread.
class DatabaseWitness : public DicomWeb::TagFileWitness
{
public:
    /// The database outlives this.
    explicit DatabaseWitness(const DicomWeb::ThreadSearch& database)
        : mDatabase(database)
    {
    }

    bool isDamaged(const QByteArray& studyUID, const Kxg::TagFileStamp& read) override;

private:
    const DicomWeb::ThreadSearch& mDatabase;
};

}  // namespace Kdd
