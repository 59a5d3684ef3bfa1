#include "kddlib/net/http/HeaderReceiver.h"

#include "kddlib/net/http/CurlError.h"
#include "kddlib/net/http/KxHttpStatus.h"
#include "kddlib/net/http/LowerCase.h"

#include <string>

namespace Kdd
{
namespace
{

void check(CURLcode code)
{
    if (code != CURLE_OK)
        throw CurlError(code);
}

/// What follows the colon. The blank there is customary, not required.
std::string_view valueAfter(std::string_view line, std::size_t colon)
{
    std::string_view value = line.substr(colon + 1);
    if (!value.empty() && (value.front() == ' ' || value.front() == '\t'))
        value.remove_prefix(1);
    return value;
}

}  // namespace

std::optional<HeaderLine> HeaderLine::parse(std::string_view line)
{
    constexpr std::size_t kLineEnd = 2;
    // The empty line that ends the headers is none of them.
    if (line.size() <= kLineEnd || line.substr(line.size() - kLineEnd) != "\r\n")
        return std::nullopt;
    line.remove_suffix(kLineEnd);
    const std::size_t colon = line.find(':');
    const bool hasValue = colon != std::string_view::npos;
    return HeaderLine{lowerCase(line.substr(0, colon)),
                      hasValue ? valueAfter(line, colon) : std::string_view()};
}

void HeaderReceiver::attach(CURL* easy)
{
    mEasy = easy;
    check(curl_easy_setopt(easy, CURLOPT_HEADERFUNCTION, &receive));
    check(curl_easy_setopt(easy, CURLOPT_HEADERDATA, this));
}

std::size_t HeaderReceiver::receive(char* bytes, std::size_t size, std::size_t count, void* receiver)
{
    auto& self = *static_cast<HeaderReceiver*>(receiver);
    const std::size_t length = size * count;
    return self.mFault.guard(length, [&] { self.takeLine(std::string_view(bytes, length)); });
}

void HeaderReceiver::takeLine(std::string_view line)
{
    if (!mStarted)
        mStatus.msToFirstHeader = mSinceStart.elapsed();
    mStarted = true;
    takeCode();

    // What came with an early hint gives way to the answer that follows.
    if (const auto header = HeaderLine::parse(line))
        mStatus.headers[header->name] = header->value;
}

/// Not only on the first line: below 200 the answer is still to come.
void HeaderReceiver::takeCode()
{
    if (mStatus.code >= 200)
        return;
    long code = 0;
    check(curl_easy_getinfo(mEasy, CURLINFO_RESPONSE_CODE, &code));
    mStatus.code = static_cast<qint32>(code);
}

}  // namespace Kdd
