// What the cache costs, beside what its users would do without it: opening the DICOM files. Every benchmark reports
// images per second; sizes are counters. Compare only what ran in one run.
//
// Growth is measured as NAME/20/1000 (twenty studies of 1,000 images) against NAME/1/20000: both work on the same
// amount of memory, so that the processor's caches, into which one small study fits, do not take part.

#include "bench/Workload.h"
#include "kddlib/tagmodel/TagMap.h"
#include "platform/base/LogFile.h"

#include <QDataStream>

#include <benchmark/benchmark.h>
#include <dcmtk/dcmdata/dctk.h>
#include <dcmtk/oflog/oflog.h>
#include <malloc.h>

#include <vector>

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

/// As many studies of as many images as the benchmark's arguments say.
std::vector<std::unique_ptr<TagFile>> studiesFor(const benchmark::State& state)
{
    std::vector<std::unique_ptr<TagFile>> studies;
    for (int64_t i = 0; i < state.range(0); ++i)
        studies.push_back(thousandImages().study(static_cast<int>(state.range(1))));
    return studies;
}

void countImagesOfStudies(benchmark::State& state)
{
    countImages(state, state.range(0) * state.range(1));
}

void addImages(benchmark::State& state)
{
    const std::unique_ptr<TagFile> source = thousandImages().study(static_cast<int>(state.range(1)));
    for (auto step : state) {
        std::vector<TagFile> files(static_cast<std::size_t>(state.range(0)));
        for (TagFile& file : files) {
            for (const TagMap* image : source->imagesByUID())
                file.addTagMap(image->clone(), nullptr, false);
        }
        state.PauseTiming();
        files.clear();
        state.ResumeTiming();
    }
    countImagesOfStudies(state);
}

void optimizeAll(benchmark::State& state)
{
    for (auto step : state) {
        state.PauseTiming();
        auto studies = studiesFor(state);
        state.ResumeTiming();
        for (const auto& study : studies)
            study->optimizeAll();
        state.PauseTiming();
        studies.clear();
        state.ResumeTiming();
    }
    countImagesOfStudies(state);
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
    const QByteArray bytes = written(*optimised(static_cast<int>(state.range(1))));
    for (auto step : state) {
        std::vector<TagFile> files(static_cast<std::size_t>(state.range(0)));
        for (TagFile& file : files)
            read(file, bytes);
        state.PauseTiming();
        files.clear();
        state.ResumeTiming();
    }
    countImagesOfStudies(state);
}

/// Of the heap [bytes].
qint64 memoryInUse()
{
    const struct mallinfo2 use = mallinfo2();
    return static_cast<qint64>(use.uordblks) + static_cast<qint64>(use.hblkhd);
}

/// All that every image shows.
void walk(const TagFile& file)
{
    for (const TagMap* image : file.imagesByUID()) {
        const TagMap::iterator end = image->end();
        for (TagMap::iterator it = image->begin(); it != end; ++it)
            benchmark::DoNotOptimize(it.value());
    }
}

/// A study that is read and looked into as a whole, and how many times its uncompressed size it takes before and after.
void walkTagFile(benchmark::State& state)
{
    const QByteArray bytes = written(*optimised(static_cast<int>(state.range(0))));
    for (auto step : state) {
        state.PauseTiming();
        const qint64 before = memoryInUse();
        TagFile file;
        read(file, bytes);
        const double size = file.statistics().uncompressedSize;
        state.counters["read/size"] = static_cast<double>(memoryInUse() - before) / size;
        state.ResumeTiming();
        walk(file);
        state.PauseTiming();
        state.counters["walked/size"] = static_cast<double>(memoryInUse() - before) / size;
        file.clear();
        state.ResumeTiming();
    }
    countImages(state, state.range(0));
}

void destroy(benchmark::State& state)
{
    const QByteArray bytes = written(*optimised(static_cast<int>(state.range(1))));
    for (auto step : state) {
        state.PauseTiming();
        std::vector<TagFile> files(static_cast<std::size_t>(state.range(0)));
        for (TagFile& file : files)
            read(file, bytes);
        state.ResumeTiming();
        files.clear();
    }
    countImagesOfStudies(state);
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
BENCHMARK(addImages)->Args({1, 1000})->Args({20, 1000})->Args({1, 20000})->Unit(benchmark::kMillisecond);
BENCHMARK(optimizeAll)
    ->Args({1, 1000})
    ->Args({20, 1000})
    ->Args({1, 20000})
    ->Unit(benchmark::kMillisecond)
    ->Iterations(3);
BENCHMARK_CAPTURE(writeTagFile, none, TagFile::CompressionMode::None)
    ->Arg(1000)
    ->Unit(benchmark::kMillisecond);
BENCHMARK_CAPTURE(writeTagFile, zlib, TagFile::CompressionMode::Zlib)
    ->Arg(1000)
    ->Unit(benchmark::kMillisecond);
BENCHMARK_CAPTURE(writeTagFile, lzma, TagFile::CompressionMode::Lzma)
    ->Arg(1000)
    ->Unit(benchmark::kMillisecond);
BENCHMARK(readTagFile)->Args({1, 1000})->Args({20, 1000})->Args({1, 20000})->Unit(benchmark::kMillisecond);
BENCHMARK(walkTagFile)->Arg(1000)->Arg(20000)->Unit(benchmark::kMillisecond);
BENCHMARK(destroy)->Args({1, 1000})->Args({20, 1000})->Args({1, 20000})->Unit(benchmark::kMillisecond);
BENCHMARK(mergeOneImage)->Arg(1000)->Arg(5000)->Arg(20000)->Unit(benchmark::kMillisecond);
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
