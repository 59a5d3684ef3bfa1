#pragma once

#include <mutex>
#include <set>

namespace Kdd::Dimse
{

/// Ends connections from another thread: of whoever waits on one and cannot be told otherwise. May be used on any thread.
class BreakSwitch
{
public:
    /// Ends what is connected, and from now on whatever will be.
    void breakOff();

    bool isBroken() const;

private:
    friend class BreakableSocket;

    mutable std::mutex mMutex;
    std::set<int> mSockets;
    bool mIsBroken = false;
};

/// A socket that the switch ends, for as long as this lives.
class BreakableSocket
{
public:
    /// The switch outlives it. The socket is known by a number of its own, so that whoever has it may close his at any time.
    BreakableSocket(BreakSwitch& breakSwitch, int socket);
    ~BreakableSocket();
    BreakableSocket(const BreakableSocket&) = delete;
    BreakableSocket& operator=(const BreakableSocket&) = delete;

private:
    BreakSwitch& mSwitch;
    const int mSocket;
};

}  // namespace Kdd::Dimse
