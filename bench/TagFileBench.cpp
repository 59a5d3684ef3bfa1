// What the cache costs, beside what its users would do without it: opening the DICOM files. Every benchmark reports
// images per second; sizes are counters. Compare only what ran in one run.

#include "bench/Workload.h"
#include "kddlib/tagmodel/TagMap.h"
#include "platform/base/LogFile.h"

#include <QDataStream>

#include <benchmark/benchmark.h>
#include <dcmtk/dcmdata/dctk.h>
#include <dcmtk/oflog/oflog.h>

namespace Kdd
{

namespace
{

QByteArray written(TagFile& file)
{
    QByteArray bytes;
    QDataStream out(&bytes, QIODevice::WriteOnly);
    file.writeCacheFile(out);
    return bytes;
}

void read(TagFile& file, const QByteArray& bytes)
{
    QDataStream in(bytes);
    file.readCacheFile(in, nullptr);
}

std::unique_ptr<TagFile> optimised(int images)
{
    std::unique_ptr<TagFile> file = thousandImages().study(images);
    file->optimizeAll();
    return file;
}

void countImages(benchmark::State& state, qint64 images)
{
    state.SetItemsProcessed(static_cast<int64_t>(state.iterations()) * images);
}

/// Opening the DICOM files, which the cache saves.
void loadFile(benchmark::State& state)
{
    for (auto step : state) {
        for (const std::string& path : thousandImages().files()) {
            DcmFileFormat file;
            file.loadFile(path.c_str());
            benchmark::DoNotOptimize(file);
        }
    }
    countImages(state, static_cast<qint64>(thousandImages().files().size()));
}

void buildTagFile(benchmark::State& state)
{
    const int images = static_cast<int>(thousandImages().files().size());
    QByteArray bytes;
    for (auto step : state)
        bytes = written(*optimised(images));
    countImages(state, images);
    state.counters["bytes"] = bytes.size();
    state.counters["headers/bytes"] = static_cast<double>(thousandImages().headerBytes()) / bytes.size();
}

void addImages(benchmark::State& state)
{
    const int images = static_cast<int>(state.range(0));
    const std::unique_ptr<TagFile> source = thousandImages().study(images);
    for (auto step : state) {
        TagFile file;
        for (const TagMap* image : source->imagesByUID())
            file.addTagMap(image->clone(), nullptr, false);
        state.PauseTiming();
        file.clear();
        state.ResumeTiming();
    }
    countImages(state, images);
}

void optimizeAll(benchmark::State& state)
{
    const int images = static_cast<int>(state.range(0));
    for (auto step : state) {
        state.PauseTiming();
        std::unique_ptr<TagFile> file = thousandImages().study(images);
        state.ResumeTiming();
        file->optimizeAll();
        state.PauseTiming();
        file.reset();
        state.ResumeTiming();
    }
    countImages(state, images);
}

void writeTagFile(benchmark::State& state, TagFile::CompressionMode mode)
{
    const int images = static_cast<int>(state.range(0));
    const std::unique_ptr<TagFile> file = optimised(images);
    TagFile::setCompressionMode(mode);
    QByteArray bytes;
    for (auto step : state)
        bytes = written(*file);
    TagFile::setCompressionMode(TagFile::CompressionMode::Zlib);
    countImages(state, images);
    state.counters["bytes"] = bytes.size();
}

void readTagFile(benchmark::State& state)
{
    const int images = static_cast<int>(state.range(0));
    const QByteArray bytes = written(*optimised(images));
    for (auto step : state) {
        TagFile file;
        read(file, bytes);
        state.PauseTiming();
        file.clear();
        state.ResumeTiming();
    }
    countImages(state, images);
}

void destroy(benchmark::State& state)
{
    const int images = static_cast<int>(state.range(0));
    const QByteArray bytes = written(*optimised(images));
    for (auto step : state) {
        state.PauseTiming();
        TagFile file;
        read(file, bytes);
        state.ResumeTiming();
        file.clear();
    }
    countImages(state, images);
}

/// One image into the file of a large study, under its lock.
void mergeOneImage(benchmark::State& state)
{
    const int images = static_cast<int>(state.range(0));
    QTemporaryDir folder;
    TagFile::setMetaFolder(folder.path().toLocal8Bit().constData());
    std::unique_ptr<TagFile> stored = optimised(images);
    const TagMap* largest = stored->seriesByUID().first();
    for (const TagMap* series : stored->seriesByUID())
        largest = series->children().size() > largest->children().size() ? series : largest;
    const std::unique_ptr<TagMap> image(largest->children().last()->clone());
    stored->writeCacheFile();
    stored.reset();
    for (auto step : state) {
        TagFile fresh;
        fresh.addTagMap(image->clone(), nullptr, false);
        fresh.mergeIntoCacheFile();
        state.PauseTiming();
        fresh.clear();
        state.ResumeTiming();
    }
    countImages(state, images);
}

void findAttribute(benchmark::State& state)
{
    const std::unique_ptr<TagFile> file = optimised(1000);
    const QByteArray sopUID = file->imagesByUID().lastKey();
    for (auto step : state) {
        QByteArray name;
        file->findImage(sopUID)->findAndGetString(DCM_PatientName, name);
        benchmark::DoNotOptimize(name);
    }
}

BENCHMARK(loadFile)->Unit(benchmark::kMillisecond);
BENCHMARK(buildTagFile)->Unit(benchmark::kMillisecond);
BENCHMARK(addImages)->Arg(1000)->Arg(20000)->Unit(benchmark::kMillisecond);
BENCHMARK(optimizeAll)->Arg(1000)->Arg(20000)->Unit(benchmark::kMillisecond)->Iterations(3);
BENCHMARK_CAPTURE(writeTagFile, none, TagFile::CompressionMode::None)
    ->Arg(1000)
    ->Unit(benchmark::kMillisecond);
BENCHMARK_CAPTURE(writeTagFile, zlib, TagFile::CompressionMode::Zlib)
    ->Arg(1000)
    ->Unit(benchmark::kMillisecond);
BENCHMARK_CAPTURE(writeTagFile, lzma, TagFile::CompressionMode::Lzma)
    ->Arg(1000)
    ->Unit(benchmark::kMillisecond);
BENCHMARK(readTagFile)->Arg(1000)->Arg(20000)->Unit(benchmark::kMillisecond);
BENCHMARK(destroy)->Arg(1000)->Arg(20000)->Unit(benchmark::kMillisecond);
BENCHMARK(mergeOneImage)->Arg(1000)->Arg(20000)->Unit(benchmark::kMillisecond);
BENCHMARK(findAttribute);

}  // namespace

}  // namespace Kdd

int main(int argc, char** argv)
{
    Kdd::LogFile::setLevel(Kdd::LogFile::Level::Errors);
    OFLog::configure(OFLogger::OFF_LOG_LEVEL);
    benchmark::Initialize(&argc, argv);
    Kdd::thousandImages();  // made before the first clock starts
    benchmark::RunSpecifiedBenchmarks();
    return 0;
}
