#pragma once

#include <QByteArray>

namespace Kdd::Access
{

/// The host of "host", "host:port" or "[::1]:port", in small letters and without the port; null when it is none of these.
QByteArray hostOf(const QByteArray& authority);

/// Whether it names this machine, to which no page of another origin can give its own name.
bool isLoopbackName(const QByteArray& host);

/// A numeric address in the one way that it is written in comparisons; null when it is none.
QByteArray numericAddress(const QByteArray& text);

}  // namespace Kdd::Access
