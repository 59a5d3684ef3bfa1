#include "platform/os/WakeSignal.h"

#include <poll.h>
#include <sys/eventfd.h>
#include <unistd.h>

#include <cerrno>
#include <cstdint>
#include <system_error>

namespace Kdd
{

WakeSignal::WakeSignal()
    : mDescriptor(::eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK))
{
    if (mDescriptor < 0)
        throw std::system_error(errno, std::generic_category(), "No descriptor to be woken by");
}

WakeSignal::~WakeSignal()
{
    ::close(mDescriptor);
}

void WakeSignal::wake() const
{
    const std::uint64_t once = 1;
    // It can only fail where it was woken so often that the number does not grow any more.
    (void)!::write(mDescriptor, &once, sizeof once);
}

WakeSignal::Woken WakeSignal::await(int descriptor, int ms) const
{
    pollfd both[] = {{mDescriptor, POLLIN, 0}, {descriptor, POLLIN, 0}};
    // A signal of the system ends the wait early, which callers take for the time.
    if (::poll(both, 2, ms) <= 0)
        return Woken::ByTime;
    return both[0].revents != 0 ? Woken::BySignal : Woken::ByDescriptor;
}

}  // namespace Kdd
