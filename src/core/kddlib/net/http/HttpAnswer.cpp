#include "kddlib/net/http/HttpAnswer.h"

#include "kddlib/net/http/KxHttpStatus.h"
#include "platform/base/LogFile.h"

namespace Kdd
{
namespace
{

constexpr char kContentRange[] = "content-range";

}  // namespace

const std::string* findHeader(const KxHttpStatus& status, const char* name)
{
    const auto found = status.headers.find(name);
    return found == status.headers.end() ? nullptr : &found->second;
}

std::optional<ContentRange> contentRangeOf(const KxHttpStatus& status)
{
    const std::string* const value = findHeader(status, kContentRange);
    return value ? ContentRange::parse(*value) : std::nullopt;
}

qint64 objectLengthOf(const KxHttpStatus& status)
{
    // Only the total is looked at: a caller may have asked for parts that mean something to the server alone.
    const std::string* const range = findHeader(status, kContentRange);
    if (status.code == kPartialContent && range) {
        if (const auto total = ContentRange::totalIn(*range))
            return parseByteCount(*total).value_or(0);
        LogFile::warnf("Could not parse Content-Range: %s", range->c_str());
    }
    // Without a range that tells it, the length of the body is taken for that of the object.
    if (const std::string* const length = findHeader(status, "content-length"))
        return parseByteCount(*length).value_or(0);
    if (const std::string* const encoding = findHeader(status, "transfer-encoding");
        encoding && *encoding == "chunked")
        return 0;
    LogFile::warnf("Could not get content length. Received headers:");
    for (const auto& [name, value] : status.headers)
        LogFile::warnf("%s: %s", name.c_str(), value.c_str());
    return 0;
}

}  // namespace Kdd
