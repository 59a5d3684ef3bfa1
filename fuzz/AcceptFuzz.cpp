// What clients say they take.

#include "fuzz/Property.h"
#include "server/http/AcceptHeader.h"

using namespace Kdd;
using namespace Kdd::Http;

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, std::size_t size)
{
    const QByteArray text = bytesOf(data, size);
    const AcceptHeader accept(text);
    int last = 1000;
    for (const MediaRange& range : accept.ranges()) {
        require(range.quality >= 0 && range.quality <= last, "qualities are thousandths and fall");
        require(range.name.contains('/'), "a range names a media type");
        require(range.closeness({range.name, range.parts}) > 0, "a range names itself");
        last = range.quality;
    }
    const QVector<MediaType> offers = {{"application/dicom+json", ""}, {"multipart/related", "application/dicom"}};
    const int chosen = accept.choose(offers);
    require(chosen == -1 || accept.quality(offers[chosen]) > 0, "what is refused is not chosen");

    Request request;
    request.headers = {{"accept-encoding", text}};
    acceptsCoding(request, "gzip");
    return 0;
}
