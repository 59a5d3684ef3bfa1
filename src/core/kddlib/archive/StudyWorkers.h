#pragma once

#include "platform/base/Export.h"

#include <chrono>
#include <memory>

namespace Kdd
{

/// Works the database's queue off for as long as it is let, on threads of its own, together with any number of others on
/// any number of machines. What it does at a time is one claimed study: a process that dies gives it back.
///
/// On a server it is told of work, and looks for what nobody told of from time to time; an SQLite database it only looks
/// into. What has just arrived is left to whoever took it in, and taken over when nothing came of that. A study that
/// fails is tried again later, after longer and longer pauses; while the database is away it is asked for likewise.
///
/// Used by one thread.
class KDD_EXPORT StudyWorkers
{
public:
    struct Pace
    {
        std::chrono::milliseconds look{5000};       ///< between looks at a server's queue,
        std::chrono::milliseconds lookFile{1000};   ///< and at that of a file
        std::chrono::milliseconds arrivals{15000};  ///< after which arrivals are taken over
        std::chrono::milliseconds again{
            10000};                           ///< before a study that failed is tried again, the first time
        std::chrono::milliseconds away{500};  ///< before the database is asked again, the first time
    };

    /// `jobs` studies at once, of the database that `Kxg::SetDatabaseServer` named.
    explicit StudyWorkers(int jobs);
    StudyWorkers(int jobs, Pace pace);

    /// As `stop`.
    ~StudyWorkers();

    void start();

    /// Ends what is at hand, and returns then.
    void stop();

    /// How many studies were completed so far.
    int completed() const;

private:
    struct KDD_LOCAL Private;
    std::unique_ptr<Private> d;
};

}  // namespace Kdd
