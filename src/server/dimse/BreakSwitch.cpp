#include "server/dimse/BreakSwitch.h"

#include <fcntl.h>
#include <sys/socket.h>
#include <unistd.h>

namespace Kdd::Dimse
{

void BreakSwitch::breakOff()
{
    const std::lock_guard<std::mutex> lock(mMutex);
    mIsBroken = true;
    for (const int socket : mSockets)
        ::shutdown(socket, SHUT_RDWR);
}

bool BreakSwitch::isBroken() const
{
    const std::lock_guard<std::mutex> lock(mMutex);
    return mIsBroken;
}

BreakableSocket::BreakableSocket(BreakSwitch& breakSwitch, int socket)
    : mSwitch(breakSwitch)
    , mSocket(::fcntl(socket, F_DUPFD_CLOEXEC, 0))
{
    const std::lock_guard<std::mutex> lock(mSwitch.mMutex);
    if (mSwitch.mIsBroken || mSocket < 0)
        ::shutdown(socket, SHUT_RDWR);
    else
        mSwitch.mSockets.insert(mSocket);
}

BreakableSocket::~BreakableSocket()
{
    const std::lock_guard<std::mutex> lock(mSwitch.mMutex);
    mSwitch.mSockets.erase(mSocket);
    if (mSocket >= 0)
        ::close(mSocket);
}

}  // namespace Kdd::Dimse
