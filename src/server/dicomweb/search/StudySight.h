#pragma once

#include "server/dicomweb/StudyShelf.h"
#include "server/dicomweb/search/ThreadSearch.h"

namespace Kdd
{
class TagMap;
}

namespace Kdd::DicomWeb
{

enum class Sight {
    Seen,
    Hidden,   ///< or there is no such study
    Unknown,  ///< the database cannot be asked
};

/// Whether studies are within the limits of whoever asks. May be used on any thread.
class StudySight
{
public:
    using Limits = std::shared_ptr<const Kxg::StudyLimits>;

    /// Both must outlive the object.
    StudySight(const ThreadSearch& database, StudyShelf& shelf)
        : mDatabase(database)
        , mShelf(shelf)
    {
    }

    /// By what searches know of it, brought up to date where its tag file is another one now.
    Sight look(const Limits& limits, const QByteArray& studyUID) const;

    /// Whether an image that somebody with these limits sends may be stored: it says nothing that is beyond them, and joins a
    /// study that is within them or begins one.
    bool admits(const Limits& limits, const TagMap& image) const;

private:
    Result find(const Limits& limits, const QByteArray& studyUID, std::vector<Kxg::FoundStudy>& found) const;

    const ThreadSearch& mDatabase;
    StudyShelf& mShelf;
};

}  // namespace Kdd::DicomWeb
