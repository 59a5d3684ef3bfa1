#include "server/http/RequestReader.h"

#include "server/http/RequestTarget.h"

#include <boost/beast/core/string.hpp>
#include <boost/beast/http/parser.hpp>
#include <boost/beast/http/string_body.hpp>

#include <algorithm>
#include <cstring>
#include <optional>

namespace Kdd::Http
{
namespace
{

namespace http = boost::beast::http;
using Parser = http::request_parser<http::string_body>;

QByteArray bytesOf(boost::beast::string_view text)
{
    return {text.data(), static_cast<int>(text.size())};
}

Method methodOf(http::verb verb)
{
    switch (verb) {
    case http::verb::get:
        return Method::Get;
    case http::verb::head:
        return Method::Head;
    case http::verb::options:
        return Method::Options;
    case http::verb::post:
        return Method::Post;
    case http::verb::delete_:
        return Method::Delete;
    default:
        return Method::Other;
    }
}

int statusOf(const boost::beast::error_code& fault)
{
    if (fault == http::error::header_limit)
        return 431;
    if (fault == http::error::body_limit)
        return 413;
    return fault == http::error::bad_version ? 505 : 400;
}

/// "host:80", "[::1]": letters that cannot pass for another part of an address that it is put into.
bool isHost(const QByteArray& text)
{
    return std::all_of(text.begin(), text.end(), [](char each) {
        return (each >= 'a' && each <= 'z') || (each >= 'A' && each <= 'Z') || (each >= '0' && each <= '9') ||
               (each != '\0' && std::strchr("-._:[]", each) != nullptr);
    });
}

}  // namespace

struct RequestReader::Private
{
    QByteArray unread;
    std::optional<Parser> parser;
    bool gaveLeave = false;
};

RequestReader::RequestReader(Limits limits)
    : mLimits(limits)
    , d(std::make_unique<Private>())
{
}

RequestReader::~RequestReader() = default;

void RequestReader::add(const char* bytes, int size)
{
    d->unread.append(bytes, size);
}

RequestReader::State RequestReader::refuse(int status)
{
    mRefusal = status;
    return State::Refused;
}

RequestReader::State RequestReader::advance()
{
    if (mRefusal != 0)
        return State::Refused;
    if (!d->parser) {
        // Empty lines before a request are from clients that end a body with one.
        int blank = 0;
        while (d->unread.mid(blank, 2) == "\r\n")
            blank += 2;
        d->unread.remove(0, blank);
        if (d->unread.isEmpty())
            return State::Between;
        d->parser.emplace();
        d->parser->header_limit(mLimits.header);
        d->parser->body_limit(static_cast<std::uint64_t>(mLimits.body));
        d->parser->eager(true);
        d->gaveLeave = false;
    }
    while (!d->parser->is_done() && !d->unread.isEmpty()) {
        boost::beast::error_code fault;
        const std::size_t used = d->parser->put(
            boost::asio::const_buffer(d->unread.constData(), static_cast<std::size_t>(d->unread.size())),
            fault);
        d->unread.remove(0, static_cast<int>(used));
        if (fault == http::error::need_more)
            break;
        if (fault)
            return refuse(statusOf(fault));
    }
    if (d->parser->is_done())
        return finish();
    if (d->parser->is_header_done() && !d->gaveLeave &&
        boost::beast::iequals(d->parser->get()[http::field::expect], "100-continue")) {
        d->gaveLeave = true;
        return State::AwaitsLeave;
    }
    return State::Begun;
}

RequestReader::State RequestReader::finish()
{
    const auto& message = d->parser->get();
    mRequest = {};
    mRequest.method = methodOf(message.method());
    mRequest.target = bytesOf(message.target());
    mKeepsConnection = message.keep_alive();
    mIsOldVersion = message.version() < 11;
    int hosts = 0;
    mHost.clear();
    for (const auto& field : message) {
        mRequest.headers.append({bytesOf(field.name_string()).toLower(), bytesOf(field.value())});
        if (field.name() == http::field::host) {
            mHost = bytesOf(field.value());
            ++hosts;
        }
    }
    d->parser.reset();
    RequestTarget target;
    // Of two hosts whoever stands in front of us may have looked at the other one.
    if (hosts > 1 || (hosts == 0 && !mIsOldVersion) || !RequestTarget::parse(mRequest.target, target))
        return refuse(400);
    if (!target.authority.isNull())
        mHost = target.authority;
    if (!isHost(mHost))
        return refuse(400);
    mRequest.path = target.path;
    mRequest.query = target.query;
    return State::Whole;
}

Request RequestReader::take()
{
    Request request = std::move(mRequest);
    mRequest = {};
    return request;
}

}  // namespace Kdd::Http
