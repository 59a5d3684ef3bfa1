// What it costs to have frames decoded by a process apart: the same codestreams decoded here and there. The figure to look
// at is `cpu`, what this process and its decoders take of a processor for a frame, which other programs disturb least;
// --benchmark_enable_random_interleaving=true --benchmark_repetitions=7 has both see the same machine.

#include "platform/decoder/DecoderPool.h"
#include "platform/volume/ApartFrame.h"
#include "platform/volume/CompressedFrame.h"
#include "platform/volume/FrameEncoding.h"
#include "platform/volume/FrameLayout.h"

#include <QFile>

#include <benchmark/benchmark.h>
#include <unistd.h>

#include <random>

namespace Kdd
{

namespace
{

FrameLayout squareOf(int side)
{
    FrameLayout layout;
    layout.rows = layout.columns = side;
    layout.bitsAllocated = 16;
    layout.bitsStored = 12;
    layout.highBit = 11;
    layout.photometric = "MONOCHROME2";
    return layout;
}

/// A slope with as much noise as a CT has.
QByteArray encodedSquare(FrameCoding coding, const FrameLayout& layout)
{
    std::mt19937 random(1);  // NOLINT(cert-msc51-cpp): the same pixels every time
    QByteArray pixels(static_cast<int>(layout.frameBytes()), 0);
    auto* values = reinterpret_cast<quint16*>(pixels.data());
    for (int i = 0; i < layout.rows * layout.columns; ++i)
        values[i] = static_cast<quint16>(i % layout.columns + 32 + int(random() % 32));
    QByteArray bytes;
    if (encodeFrame(coding, pixels, layout, bytes).bad())
        std::abort();
    return bytes;
}

/// What this process and its children have taken of a processor [s].
double takenTime()
{
    const auto secondsOf = [](const QString& folder) {
        QFile file(folder + QLatin1String("/schedstat"));
        return file.open(QIODevice::ReadOnly) ? file.readAll().split(' ').first().toDouble() / 1e9 : 0;
    };
    const QString own = QStringLiteral("/proc/self/task/%1").arg(::getpid());
    QFile children(own + QLatin1String("/children"));
    children.open(QIODevice::ReadOnly);
    double seconds = secondsOf(own);
    for (const QByteArray& child : children.readAll().simplified().split(' '))
        seconds += secondsOf(QStringLiteral("/proc/") + QString::fromLatin1(child));
    return seconds;
}

/// Decodes again and again, and tells what that takes.
template <typename Decode>
void measure(benchmark::State& state, const Decode& decode)
{
    decode();  // what the first one alone takes is not counted
    const double before = takenTime();
    for (auto step : state)
        decode();
    state.counters["cpu"] = benchmark::Counter((takenTime() - before) / double(state.iterations()));
}

void decodeInside(benchmark::State& state, FrameCoding coding)
{
    const FrameLayout layout = squareOf(static_cast<int>(state.range(0)));
    const QByteArray bytes = encodedSquare(coding, layout);
    StoredFrame frame;
    measure(state, [&] { benchmark::DoNotOptimize(decodeCodestream(bytes, layout, 0, frame).good()); });
}

void decodeApart(benchmark::State& state, FrameCoding coding)
{
    const FrameLayout layout = squareOf(static_cast<int>(state.range(0)));
    const QByteArray bytes = encodedSquare(coding, layout);
    StoredFrame frame;
    measure(state, [&] {
        const Result result = decodeFrameApart(DecoderPool::ofProcess(), bytes, layout, 0, frame);
        if (result.bad())
            state.SkipWithError(qPrintable(result.text()));
    });
}

/// The first frame of a process: the decoder has to be started for it.
void startDecoder(benchmark::State& state)
{
    const FrameLayout layout = squareOf(8);
    const QByteArray bytes = encodedSquare(FrameCoding::JpegLs, layout);
    StoredFrame frame;
    DecoderLimits limits;
    limits.life = std::chrono::milliseconds(0);
    DecoderPool pool(DecoderPool::programOfProcess(), limits);
    for (auto step : state) {
        if (const Result result = decodeFrameApart(pool, bytes, layout, 0, frame); result.bad())
            state.SkipWithError(qPrintable(result.text()));
    }
}

BENCHMARK_CAPTURE(decodeInside, JpegLossless, FrameCoding::JpegLossless)->Arg(512)->Arg(2048)->UseRealTime();
BENCHMARK_CAPTURE(decodeApart, JpegLossless, FrameCoding::JpegLossless)->Arg(512)->Arg(2048)->UseRealTime();
BENCHMARK_CAPTURE(decodeInside, JpegLs, FrameCoding::JpegLs)->Arg(512)->Arg(2048)->UseRealTime();
BENCHMARK_CAPTURE(decodeApart, JpegLs, FrameCoding::JpegLs)->Arg(512)->Arg(2048)->UseRealTime();
BENCHMARK(startDecoder)->UseRealTime();

}  // namespace

}  // namespace Kdd
