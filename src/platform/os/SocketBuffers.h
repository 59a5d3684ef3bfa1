#pragma once

namespace Kdd
{

/// Gives a socket buffers of `bytes` for receiving and for sending. What the system refuses stays as it was: smaller
/// buffers are slower, not wrong.
void setSocketBuffers(int socket, int bytes);

}  // namespace Kdd
