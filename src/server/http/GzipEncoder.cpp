#include "server/http/GzipEncoder.h"

#include <zlib.h>

#include <new>

namespace Kdd::Http
{
namespace
{

// Metadata is so alike from image to image that higher levels take several times as long to save some tenths.
constexpr int kLevel = 1;

constexpr int kWindowBits = 15;  // the largest window
constexpr int kMemoryLevel = 9;
constexpr int kStep = 16 * 1024;  // of output [bytes]

}  // namespace

struct GzipEncoder::Private
{
    void run(const QByteArray& block, int flush, QByteArray& out);

    z_stream stream = {};
};

void GzipEncoder::Private::run(const QByteArray& block, int flush, QByteArray& out)
{
    // zlib does not write to what it reads.
    stream.next_in = reinterpret_cast<z_const Bytef*>(const_cast<char*>(block.constData()));
    stream.avail_in = static_cast<uInt>(block.size());
    do {
        const int former = out.size();
        out.resize(former + kStep);
        stream.next_out = reinterpret_cast<Bytef*>(out.data()) + former;
        stream.avail_out = kStep;
        deflate(&stream, flush);
        out.resize(former + kStep - static_cast<int>(stream.avail_out));
    } while (stream.avail_out == 0);
}

GzipEncoder::GzipEncoder(Frame frame)
    : d(std::make_unique<Private>())
{
    const int bits = frame == Frame::Gzip ? kWindowBits + 16 : -kWindowBits;
    // With these arguments it fails for want of memory only.
    if (deflateInit2(&d->stream, kLevel, Z_DEFLATED, bits, kMemoryLevel, Z_DEFAULT_STRATEGY) != Z_OK)
        throw std::bad_alloc();
}

GzipEncoder::~GzipEncoder()
{
    deflateEnd(&d->stream);
}

void GzipEncoder::add(const QByteArray& block, QByteArray& out)
{
    d->run(block, Z_NO_FLUSH, out);
}

void GzipEncoder::finish(QByteArray& out)
{
    d->run({}, Z_FINISH, out);
}

}  // namespace Kdd::Http
