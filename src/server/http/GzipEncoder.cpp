#include "server/http/GzipEncoder.h"

#include <isa-l/igzip_lib.h>

namespace Kdd::Http
{
namespace
{

// Metadata is so alike from image to image that higher levels take several times as long to save some tenths.
constexpr quint32 kLevel = 1;

// What the level works in, beside the state of some 80 KiB. Four times as much saves a thousandth; and each client that
// takes its answer slowly holds one.
constexpr int kTables = ISAL_DEF_LVL1_SMALL;  // [bytes]

constexpr int kStep = 16 * 1024;  // of output [bytes]

}  // namespace

struct GzipEncoder::Private
{
    void run(const QByteArray& block, bool isEnd, QByteArray& out);

    isal_zstream stream;
    QByteArray tables;
};

void GzipEncoder::Private::run(const QByteArray& block, bool isEnd, QByteArray& out)
{
    // What is read is not written to.
    stream.next_in = reinterpret_cast<uint8_t*>(const_cast<char*>(block.constData()));
    stream.avail_in = static_cast<uint32_t>(block.size());
    stream.end_of_stream = isEnd ? 1 : 0;
    do {
        const int former = out.size();
        out.resize(former + kStep);
        stream.next_out = reinterpret_cast<uint8_t*>(out.data()) + former;
        stream.avail_out = kStep;
        // It fails for wrong arguments only.
        isal_deflate(&stream);
        out.resize(former + kStep - static_cast<int>(stream.avail_out));
    } while (stream.avail_out == 0);
}

GzipEncoder::GzipEncoder(Frame frame)
    : d(new Private)
{
    d->tables.resize(kTables);
    isal_deflate_init(&d->stream);
    d->stream.gzip_flag = frame == Frame::Gzip ? IGZIP_GZIP : IGZIP_DEFLATE;
    d->stream.level = kLevel;
    d->stream.level_buf = reinterpret_cast<uint8_t*>(d->tables.data());
    d->stream.level_buf_size = kTables;
}

GzipEncoder::~GzipEncoder() = default;

void GzipEncoder::add(const QByteArray& block, QByteArray& out)
{
    d->run(block, false, out);
}

void GzipEncoder::finish(QByteArray& out)
{
    d->run({}, true, out);
}

QByteArray gzipped(const QByteArray& bytes)
{
    QByteArray compressed;
    GzipEncoder encoder;
    encoder.add(bytes, compressed);
    encoder.finish(compressed);
    return compressed;
}

}  // namespace Kdd::Http
