#pragma once

#include "platform/base/Result.h"

#include <QByteArray>

#include <functional>

namespace Kxg
{

class SqlConnection;

/// Runs `work` in a reading transaction of the calling thread's own connection to the database that is set.
Kdd::Result askDatabase(const std::function<void(SqlConnection&)>& work);

/// Names the user in the server's log and its list of connections; an engine without a server has neither.
void noteUser(SqlConnection& connection, const QByteArray& user);

}  // namespace Kxg
