#pragma once

#include "platform/os/SystemResult.h"

#include <QByteArray>

namespace Kdd
{

/// Rights to do something about what has a name, each of which one holder has at a time among all threads and processes:
/// any number of names by one file, of which each name locks a byte of its own. (Two names meet once in 2^62.) The rights
/// end with the object, and with its process. Used by one thread at a time.
class NamedLocks
{
public:
    enum class IfHeld { Wait, Fail };

    NamedLocks() = default;
    ~NamedLocks();
    NamedLocks(const NamedLocks&) = delete;
    NamedLocks& operator=(const NamedLocks&) = delete;

    /// Makes the file where it is absent; it stays, and stays empty. To be called once.
    SystemResult open(const QByteArray& path);

    /// EWOULDBLOCK: another one has it. What is held already is simply kept.
    SystemResult acquire(const QByteArray& name, IfHeld ifHeld);

    /// Lets go of all.
    void release();

private:
    int mDescriptor = -1;
};

}  // namespace Kdd
