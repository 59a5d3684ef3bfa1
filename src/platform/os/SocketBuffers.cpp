#include "platform/os/SocketBuffers.h"

#include <sys/socket.h>

namespace Kdd
{

void setSocketBuffers(int socket, int bytes)
{
    // Refusals are passed over, because a transfer goes well with any buffers.
    ::setsockopt(socket, SOL_SOCKET, SO_RCVBUF, &bytes, sizeof bytes);
    ::setsockopt(socket, SOL_SOCKET, SO_SNDBUF, &bytes, sizeof bytes);
}

}  // namespace Kdd
