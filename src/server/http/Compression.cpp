#include "server/http/Compression.h"

#include "server/http/AcceptHeader.h"
#include "server/http/GzipEncoder.h"

namespace Kdd::Http
{
namespace
{

// What fits one packet with the head comes no sooner when it is smaller.
constexpr qint64 kWorth = 1024;  // [bytes]

}  // namespace

bool isWorthCompressing(const Request& request, qint64 size)
{
    return size >= kWorth && acceptsCoding(request, "gzip");
}

void compress(const Request& request, Response& response)
{
    auto* const body = response.body.size() == 1 ? std::get_if<QByteArray>(&response.body.front()) : nullptr;
    if (body == nullptr)
        return;
    response.addHeader("Vary", "Accept-Encoding");
    if (!isWorthCompressing(request, body->size()))
        return;
    *body = gzipped(*body);
    response.addHeader("Content-Encoding", "gzip");
}

}  // namespace Kdd::Http
