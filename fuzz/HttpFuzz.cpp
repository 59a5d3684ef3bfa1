// What servers say in their headers, and the names that callers give to objects.

#include "fuzz/Property.h"
#include "kddlib/net/cloud/CloudAddress.h"
#include "kddlib/net/dicom/StoragePath.h"
#include "kddlib/net/http/ByteRange.h"
#include "kddlib/net/http/HeaderReceiver.h"
#include "kddlib/net/http/RequestAddress.h"

#include <algorithm>
#include <string>
#include <string_view>

using namespace Kdd;

namespace
{

void checkHeaderLine(std::string_view line)
{
    const auto header = HeaderLine::parse(line);
    if (!header)
        return;
    require(header->name.find(':') == std::string::npos, "the name ends at the first colon");
    const std::string own = header->name + ": " + std::string(header->value) + "\r\n";
    const auto again = HeaderLine::parse(own);
    require(again && again->name == header->name && again->value == header->value,
            "a line made of the parts gives the same parts");
}

void checkContentRange(std::string_view value)
{
    const auto parsed = ContentRange::parse(value);
    if (!parsed)
        return;
    const ByteRange& range = parsed->range;
    require(range.first >= 0 && range.first <= range.last, "a range has at least one byte");
    require(parsed->total == -1 || range.last < parsed->total, "a range ends within its object");
    require(range.last == std::numeric_limits<qint64>::max() || range.length() > 0,
            "a length is no overflow");

    const std::string digits = std::to_string(range.first) + '-' + std::to_string(range.last);
    const std::string total = parsed->total < 0 ? "*" : std::to_string(parsed->total);
    require(ContentRange::parse("bytes " + digits + '/' + total).has_value(), "its own text is accepted");
    require(WantedRange(digits).isAnsweredBy(*parsed), "the range that was asked for is the answer");
}

void checkAddress(const std::string& address)
{
    const std::string url = storageUrl(address, "1");
    require(url.empty() || url.compare(0, 7, "http://") == 0, "a storage path becomes a URL of HTTP");
    if (isCloudAddress(address))
        require(cloudUrl(address, CloudEndpoint::Api).compare(0, 4, "http") == 0, "so does a cloud address");
    for (const std::string& made :
         {url, isCloudAddress(address) ? cloudUrl(address, CloudEndpoint::Api) : ""})
        require(made.find_first_of(std::string("# \n\0", 4)) == std::string::npos,
                "no name breaks its address");
    require(withSessionId(address, "").size() == address.size(), "no session adds nothing");
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, std::size_t size)
{
    const QByteArray bytes = bytesOf(data, size);
    const std::string_view text(bytes.constData(), static_cast<std::size_t>(bytes.size()));
    checkHeaderLine(text);
    checkContentRange(text);
    checkContentRange("bytes " + std::string(text));
    static_cast<void>(WantedRange(text).isAnsweredBy({{0, 0}, 1}));
    checkAddress(std::string(text));
    return 0;
}
