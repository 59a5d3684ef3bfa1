// What clients send: their requests, and the addresses in them.

#include "fuzz/Property.h"
#include "server/dicomweb/uri/UriRequest.h"
#include "server/http/RequestReader.h"
#include "server/http/RequestTarget.h"

#include <algorithm>

using namespace Kdd;

namespace
{

constexpr Http::RequestReader::Limits kLimits = {4096, 1024};

QByteArray escaped(const QByteArray& text)
{
    return text.toPercentEncoding();
}

/// The parts written anew give the same parts.
void checkTarget(const QByteArray& target)
{
    Http::RequestTarget parsed;
    if (!Http::RequestTarget::parse(target, parsed)) {
        require(parsed.path.isEmpty() && parsed.query.isEmpty(), "nothing is left of what is refused");
        return;
    }
    QByteArray own = "/";
    for (const QByteArray& segment : parsed.path) {
        require(!segment.isEmpty() && segment != "." && segment != ".." && !segment.contains('/') &&
                    !segment.contains('\0'),
                "a segment leads one folder down");
        own += escaped(segment) + '/';
    }
    char separator = '?';
    for (const Http::Field& field : parsed.query) {
        own += separator + escaped(field.name) + '=' + escaped(field.value);
        separator = '&';
    }
    Http::RequestTarget again;
    require(Http::RequestTarget::parse(own, again), "its own text is accepted");
    require(again.path == parsed.path && again.query.size() == parsed.query.size() &&
                std::equal(parsed.query.begin(), parsed.query.end(), again.query.begin(),
                           [](const Http::Field& one, const Http::Field& other) {
                               return one.name == other.name && one.value == other.value;
                           }),
            "and gives the same parts");
}

/// What is taken of parameters lies within bounds.
void checkParameters(const QByteArray& target)
{
    Http::RequestTarget parsed;
    Http::Request request;
    DicomWeb::UriRequest wanted;
    if (!Http::RequestTarget::parse(target, parsed))
        return;
    request.query = parsed.query;
    // The others are looked at only when these are right.
    for (const char* uid : {"studyUID", "seriesUID", "objectUID"})
        request.query.prepend({uid, "1.2"});
    request.query.prepend({"requestType", "WADO"});
    if (DicomWeb::UriRequest::parse(request, wanted).bad())
        return;
    const DicomWeb::RenderRequest& rendering = wanted.rendering;
    const DicomWeb::SourceRegion& region = rendering.region;
    require(rendering.viewport.width() <= DicomWeb::kLongestSide &&
                rendering.viewport.height() <= DicomWeb::kLongestSide,
            "a picture is not too large");
    require(region.x >= 0 && region.y >= 0 && region.x + region.width < 1.000001 &&
                region.y + region.height < 1.000001,
            "a region lies within the picture");
    require(!rendering.window || rendering.window->width >= 1, "a window has a width");
    require(rendering.quality >= 1 && rendering.quality <= 100, "a quality is one");
}

/// What was understood, and whether what follows was refused.
struct Requests
{
    QByteArray text;
    bool isRefused = false;
};

/// What is made of the bytes when they come in pieces of a size.
Requests requestsIn(const QByteArray& bytes, int piece)
{
    Http::RequestReader reader(kLimits);
    QByteArray text;
    QByteArray body;
    auto state = Http::RequestReader::State::Between;
    for (int at = 0; at < bytes.size() && state != Http::RequestReader::State::Refused; at += piece) {
        reader.add(bytes.constData() + at, std::min(piece, bytes.size() - at));
        for (bool goesOn = true; goesOn;) {
            if (state == Http::RequestReader::State::Headed) {
                const char* block = nullptr;
                int count = 0;
                const auto read = reader.readBody(block, count);
                if (read == Http::RequestReader::Body::Malformed)
                    return {text, true};
                body.append(block, count);
                goesOn = read != Http::RequestReader::Body::Awaited;
                if (read != Http::RequestReader::Body::End)
                    continue;
                text += body + '\n';
                body.clear();
            }
            state = reader.advance();
            goesOn =
                state == Http::RequestReader::State::Whole || state == Http::RequestReader::State::Headed;
            if (!goesOn)
                break;
            const Http::Request request = reader.take();
            text += request.target + ' ' + reader.host() + '\n';
            for (const Http::Field& field : request.headers)
                text += field.name + '=' + field.value + '\n';
        }
    }
    return {text, reader.refusal() != 0};
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size)
{
    const QByteArray bytes(reinterpret_cast<const char*>(data),
                           static_cast<int>(std::min<size_t>(size, 20000)));
    checkTarget(bytes.left(bytes.indexOf('\n')));
    checkParameters("/wado?" + bytes.left(bytes.indexOf('\n')));
    const Requests whole = requestsIn(bytes, bytes.size() + 1);
    if (bytes.size() < 2000) {
        // Of what is wrong the beginning may be understood before the fault is there, and its rest be waited for.
        const Requests pieces = requestsIn(bytes, 7);
        require(whole.isRefused ? pieces.text.startsWith(whole.text)
                                : pieces.text == whole.text && !pieces.isRefused,
                "it does not matter in which pieces a request comes");
    }
    return 0;
}
