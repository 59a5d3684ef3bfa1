#pragma once

#include "server/access/AccessRules.h"

#include <condition_variable>
#include <deque>
#include <mutex>
#include <thread>

namespace Kdd::Access
{

/// Sends messages to a syslog receiver, on a thread of its own: nobody waits for it. What the receiver does not take is kept up to
/// a bound; what is lost beyond that is counted, and told in the log. May be used on any thread.
class SyslogSender
{
public:
    explicit SyslogSender(const SyslogRules& rules);

    /// Gives what is waiting a few seconds.
    ~SyslogSender();
    SyslogSender(const SyslogSender&) = delete;
    SyslogSender& operator=(const SyslogSender&) = delete;

    /// A whole message, as it is to arrive.
    void send(const QByteArray& message);

private:
    class Line;

    void run();
    bool waitForWork(std::unique_lock<std::mutex>& lock);
    void note(bool isSent, const QString& reason);

    const SyslogRules mRules;
    std::mutex mMutex;
    std::condition_variable mChanged;
    std::deque<QByteArray> mWaiting;
    qint64 mLost = 0;
    bool mIsBroken = false;
    bool mEnds = false;
    std::thread mThread;  // the last to be made
};

}  // namespace Kdd::Access
