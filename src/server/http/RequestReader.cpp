#include "server/http/RequestReader.h"

#include "server/http/RequestTarget.h"

#include <boost/beast/core/string.hpp>
#include <boost/beast/http/buffer_body.hpp>
#include <boost/beast/http/parser.hpp>

#include <algorithm>
#include <cstring>
#include <limits>
#include <optional>

namespace Kdd::Http
{
namespace
{

namespace http = boost::beast::http;
using Parser = http::request_parser<http::buffer_body>;

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

/// What a body in chunks ends with at least, "0", an empty line, and what ends them [bytes]. The parser does not expect to be
/// asked about fewer once it has seen the zero, and no byte of a body has to be handed on before.
constexpr int kShortestEnd = 5;

/// So much of a body in chunks is taken out of them at once [bytes].
constexpr int kBlock = 64 * 1024;

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
    boost::beast::error_code put();
    void forgetHanded();
    Body readPlain(const char*& bytes, int& count);
    Body readChunks(const char*& bytes, int& count);
    bool awaitsLeave();

    QByteArray unread;
    int handed = 0;  // of that, as bytes of a body
    std::optional<Parser> parser;
    quint64 left = 0;           // of a body whose length was told
    QByteArray unpacked;        // of one in chunks
    bool isUnderstood = false;  // the header, and what it says
    bool gaveLeave = false;
};

/// Once more of what is there.
boost::beast::error_code RequestReader::Private::put()
{
    boost::beast::error_code fault;
    const std::size_t used = parser->put(
        boost::asio::const_buffer(unread.constData(), static_cast<std::size_t>(unread.size())), fault);
    unread.remove(0, static_cast<int>(used));
    return fault;
}

void RequestReader::Private::forgetHanded()
{
    if (handed == unread.size())
        unread = QByteArray();
    else
        unread.remove(0, handed);
    handed = 0;
}

/// True once.
bool RequestReader::Private::awaitsLeave()
{
    if (gaveLeave || !boost::beast::iequals(parser->get()[http::field::expect], "100-continue"))
        return false;
    gaveLeave = true;
    return true;
}

RequestReader::RequestReader(Limits limits)
    : mLimits(limits)
    , d(std::make_unique<Private>())
{
}

RequestReader::~RequestReader() = default;

void RequestReader::add(const char* bytes, int size)
{
    d->forgetHanded();
    d->unread.append(bytes, size);
}

void RequestReader::add(const QByteArray& bytes)
{
    d->forgetHanded();
    if (d->unread.isEmpty())
        d->unread = bytes;
    else
        d->unread.append(bytes);
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
    d->forgetHanded();
    if (!d->parser) {
        // Empty lines before a request are from clients that end a body with one.
        int blank = 0;
        while (d->unread.mid(blank, 2) == "\r\n")
            blank += 2;
        d->unread.remove(0, blank);
        if (d->unread.isEmpty() || d->unread == "\r")
            return State::Between;
        d->parser.emplace();
        d->parser->header_limit(mLimits.header);
        // How much of a body is taken is for whoever takes it.
        d->parser->body_limit(std::numeric_limits<std::uint64_t>::max());
        d->isUnderstood = false;
        d->gaveLeave = false;
        mLetGo = 0;
    }
    while (!d->parser->is_header_done() && !d->unread.isEmpty()) {
        const boost::beast::error_code fault = d->put();
        if (fault == http::error::need_more)
            break;
        if (fault)
            return refuse(statusOf(fault));
    }
    if (!d->parser->is_header_done())
        return State::Begun;
    if (!d->isUnderstood) {
        const State understood = understand();
        if (understood == State::Refused)
            return understood;
        d->isUnderstood = true;
        d->left = d->parser->content_length().value_or(0);
        // Not before: fields behind a body would pass for those of the header, which others may have looked at on the way.
        d->parser->eager(true);
        if (mRequest.method == Method::Post)
            return State::Headed;
    }
    return letGo();
}

/// Reads the body for nothing.
RequestReader::State RequestReader::letGo()
{
    const auto length = d->parser->content_length();
    if (length && *length > static_cast<std::uint64_t>(mLimits.body))
        return refuse(413);
    while (true) {
        const char* bytes = nullptr;
        int count = 0;
        switch (readBody(bytes, count)) {
        case Body::Block:
            mLetGo += count;
            if (mLetGo > mLimits.body)
                return refuse(413);
            break;
        case Body::Awaited:
            return State::Begun;
        case Body::AwaitsLeave:
            return State::AwaitsLeave;
        case Body::End:
            return State::Whole;
        case Body::Malformed:
            return refuse(400);
        }
    }
}

RequestReader::Body RequestReader::readBody(const char*& bytes, int& count)
{
    count = 0;
    d->forgetHanded();
    Body read = Body::End;
    if (d->parser)
        read = d->parser->chunked() ? d->readChunks(bytes, count) : d->readPlain(bytes, count);
    // While it is waited for others may need the room.
    if (read != Body::Block)
        d->unpacked = QByteArray();
    if (read == Body::Awaited && d->awaitsLeave())
        return Body::AwaitsLeave;
    if (read == Body::End)
        d->parser.reset();
    return read;
}

/// Where it lies: what the parser would say of it is known.
RequestReader::Body RequestReader::Private::readPlain(const char*& bytes, int& count)
{
    if (left == 0)
        return Body::End;
    handed = static_cast<int>(std::min(left, static_cast<quint64>(unread.size())));
    left -= static_cast<quint64>(handed);
    bytes = unread.constData();
    count = handed;
    return count > 0 ? Body::Block : Body::Awaited;
}

RequestReader::Body RequestReader::Private::readChunks(const char*& bytes, int& count)
{
    unpacked.resize(kBlock);
    while (!parser->is_done() && unread.size() >= kShortestEnd && count < kBlock) {
        auto& body = parser->get().body();
        body.data = unpacked.data() + count;
        body.size = static_cast<std::size_t>(kBlock - count);
        body.more = true;
        const boost::beast::error_code fault = put();
        count = kBlock - static_cast<int>(body.size);
        if (fault == http::error::need_more)
            break;
        if (fault && fault != http::error::need_buffer)
            return Body::Malformed;
    }
    bytes = unpacked.constData();
    if (count > 0)
        return Body::Block;
    return parser->is_done() ? Body::End : Body::Awaited;
}

/// Takes over what the header says.
RequestReader::State RequestReader::understand()
{
    const auto& message = d->parser->get();
    mRequest = {};
    mRequest.method = methodOf(message.method());
    mRequest.target = bytesOf(message.target());
    mKeepsConnection = message.keep_alive();
    mIsOldVersion = message.version() < 11;
    int hosts = 0;
    bool isFramed = true;
    mHost.clear();
    for (const auto& field : message) {
        mRequest.headers.append({bytesOf(field.name_string()).toLower(), bytesOf(field.value())});
        if (field.name() == http::field::host) {
            mHost = bytesOf(field.value());
            ++hosts;
        }
        if (field.name() == http::field::transfer_encoding)
            isFramed = isFramed && !mIsOldVersion && boost::beast::iequals(field.value(), "chunked");
    }
    RequestTarget target;
    // Of two hosts whoever stands in front of us may have looked at the other one, and what it does not take for chunks is
    // the next request to it.
    if (!isFramed || hosts > 1 || (hosts == 0 && !mIsOldVersion) ||
        !RequestTarget::parse(mRequest.target, target))
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
