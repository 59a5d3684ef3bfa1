#pragma once

#include "platform/database/DatabaseAddress.h"
#include "platform/os/WakeSignal.h"

#include <memory>

namespace Kxg
{

/// Hears at once when somebody leaves work in the queue of a database on a server, over a connection of its own. Notices
/// that nobody heard are gone: whoever works on the queue also looks from time to time. Used by one thread.
///
/// Qt's driver can do this only beneath an event loop, and goes on spinning in that when the connection is lost.
class QueueNotices
{
public:
    /// Null, with the reason, when the server cannot be reached. `stop`, which outlives the object, ends waiting.
    static std::unique_ptr<QueueNotices> open(const DatabaseAddress& address, const Kdd::WakeSignal& stop,
                                              Kdd::Result& result);

    ~QueueNotices();
    QueueNotices(const QueueNotices&) = delete;
    QueueNotices& operator=(const QueueNotices&) = delete;

    enum class Heard {
        Work,
        Nothing,  ///< the time has passed, or `stop` was woken
        Loss,     ///< of the connection
    };

    /// Waits for a notice, at most `ms` [ms].
    Heard await(int ms);

private:
    struct Private;
    explicit QueueNotices(std::unique_ptr<Private> made);
    std::unique_ptr<Private> d;
};

}  // namespace Kxg
