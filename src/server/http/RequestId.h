#pragma once

#include <QByteArray>

namespace Kdd::Http
{

/// By what a request is found again in logs: what its sender calls it, where that is a short word, else one that no other
/// request has.
QByteArray requestId(const QByteArray& given);

}  // namespace Kdd::Http
