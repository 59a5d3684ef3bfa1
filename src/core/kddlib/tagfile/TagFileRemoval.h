#pragma once

#include "platform/os/SystemResult.h"

#include <QString>

#include <functional>

namespace Kdd
{

/// One attempt to delete the file at a path: good when there is none any more.
using RemovalAttempt = std::function<SystemResult(const QString& path)>;

/// Takes the lock of a tag file without waiting and deletes it with its journal.
SystemResult removeTagFileOnce(const QString& path);

/// Attempts to delete a tag file, and when that fails five times more, 10 ms apart. Whether it is gone; logs what took
/// more than one attempt.
bool removeTagFile(const QString& path, const RemovalAttempt& attempt = removeTagFileOnce);

}  // namespace Kdd
