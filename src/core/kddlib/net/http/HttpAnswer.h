#pragma once

#include "kddlib/net/http/ByteRange.h"

#include <optional>
#include <string>

namespace Kdd
{

struct KxHttpStatus;

// The codes of answers on which it depends what is done next.
constexpr int kOk = 200;
constexpr int kCreated = 201;
constexpr int kPartialContent = 206;
constexpr int kResumeIncomplete = 308;  // of an upload that is to go on
constexpr int kRangeNotSatisfiable = 416;

/// The value of a response's header by its name in lower case; null when there is none. Owned by the status.
const std::string* findHeader(const KxHttpStatus& status, const char* name);

/// Which part of the object the response says that it carries; nothing when it says none, or none that can be.
std::optional<ContentRange> contentRangeOf(const KxHttpStatus& status);

/// The length of the whole object, also when the response carries a part of it [bytes]; 0 when it is not told, which is
/// logged with all headers unless the body is chunked.
qint64 objectLengthOf(const KxHttpStatus& status);

}  // namespace Kdd
