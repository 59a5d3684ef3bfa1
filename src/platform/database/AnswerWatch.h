#pragma once

#include <QByteArray>
#include <QVariant>

#include <chrono>
#include <memory>

namespace Kxg
{

/// Ends waits for a server that does not answer.
///
/// A server that ends closes its connections, and one whose machine is gone is found out by what TCP sends from time to
/// time. One that merely stands still does neither: its machine goes on taking what is sent, and the driver waits for an
/// answer without end. So the connection's socket is shut down when a wait has lasted too long, which the driver sees as
/// a lost connection.
///
/// Belongs to the thread of its connection; one thread of the process looks after all of them.
class AnswerWatch
{
public:
    using Seconds = std::chrono::seconds;

    /// `handle` is what the driver gives of the open connection. Of an engine without server nothing is watched.
    explicit AnswerWatch(const QVariant& handle);
    ~AnswerWatch();
    AnswerWatch(const AnswerWatch&) = delete;
    AnswerWatch& operator=(const AnswerWatch&) = delete;

    /// While it lives the server is waited for, for so long at most; without end when that is 0.
    class Wait
    {
    public:
        Wait(AnswerWatch& watch, Seconds most);
        ~Wait();
        Wait(const Wait&) = delete;
        Wait& operator=(const Wait&) = delete;

    private:
        AnswerWatch& mWatch;
    };

    /// Whether a wait was ended. The connection is of no use any more then.
    bool hasEnded() const;

private:
    struct Watched;
    class Watcher;
    std::unique_ptr<Watched> mWatched;  // null: nothing is
};

/// Servers that did not answer in time, by address. As long as one stands still nobody but one at a time tries it, else
/// all threads of a process would soon wait for it, and what needs no database with them.
class SilentServers
{
public:
    /// False while it is better not to ask. Whoever may tells how it went.
    static bool mayAsk(const QByteArray& address);
    static void noteSilence(const QByteArray& address);
    static void noteAnswer(const QByteArray& address);
};

}  // namespace Kxg
