#pragma once

#include "platform/base/Export.h"

#include <QtGlobal>

#include <chrono>
#include <memory>

namespace Kdd
{

/// Looks slowly at all bytes of an archive, again and again, on a thread of its own: of each study the tag file, then DICOM
/// and volume files as `StudyProof` does, those studies first that were looked at the longest ago. Faults are told in the
/// log. How far it has come is in the database, so that it goes on there after a restart; of any number of processes that
/// do this one is at work at a time, and another one goes on when that ends.
///
/// Used by one thread.
class KDD_EXPORT BackgroundCheck
{
public:
    struct Pace
    {
        qint64 bytesPerSecond = 1 << 20;
        std::chrono::milliseconds again{std::chrono::hours(168)};  ///< after which a study is looked at again
        bool heals = false;                      ///< tag files that are not those written last are built anew
        bool records = false;                    ///< files without a digest get one
        std::chrono::milliseconds look{60'000};  ///< between questions for something to do,
        std::chrono::milliseconds note{30'000};  ///< and between notes of how far a study has come
        std::chrono::milliseconds away{500};     ///< before the database is asked again, the first time
    };

    /// What was done since the start.
    struct Counts
    {
        qint64 studies = 0;
        qint64 bytes = 0;
        qint64 faults = 0;  ///< files that were found not to be as they should
        qint64 healed = 0;  ///< of these
        int faulty = 0;     ///< studies with such files as of the last look at each, whoever looked
    };

    /// Of the database that `Kxg::SetDatabaseServer` named.
    explicit BackgroundCheck(const Pace& pace);

    /// As `stop`.
    ~BackgroundCheck();

    void start();

    /// Ends what is at hand, and returns then: a file that is being read is left, a tag file that is being built is not.
    void stop();

    /// On any thread.
    Counts counts() const;

private:
    struct KDD_LOCAL Private;
    std::unique_ptr<Private> d;
};

}  // namespace Kdd
