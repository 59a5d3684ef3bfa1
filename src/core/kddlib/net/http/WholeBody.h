#pragma once

#include <QByteArray>

namespace Kdd
{

class KxCurlDownloadStream;
struct KxHttpStatus;

/// Reads a stream to its end, up to the bound of a response (Limits.h); a longer body counts as failed. `status` is
/// what became of the transfer.
QByteArray readWholeBody(KxCurlDownloadStream& stream, KxHttpStatus& status);

}  // namespace Kdd
