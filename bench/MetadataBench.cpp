// What the metadata of a study of 1,000 images costs. The figure to look at is the processor's time for one study.

#include "bench/Workload.h"
#include "kddlib/items/DicomJson.h"
#include "kddlib/tagmodel/TagMap.h"

#include <benchmark/benchmark.h>
#include <dcmtk/dcmdata/dcdeftag.h>
#include <libdeflate.h>

namespace Kdd
{

namespace
{

std::unique_ptr<TagFile> optimisedStudy()
{
    std::unique_ptr<TagFile> file = thousandImages().study(1000);
    file->optimizeAll();
    return file;
}

QByteArray metadata(const TagFile& file, MetadataForm form, const QVector<DcmTagKey>& wanted = {})
{
    QByteArray text;
    text.reserve(16 * 1024 * 1024);
    DicomImageWriter writer(form, wanted);
    for (const TagMap* series : file.seriesByUID()) {
        for (const TagMap* image : series->children())
            writer.append(text, *image, "instances/" + image->uid(TagMap::ImageLevel) + "/bulkdata");
    }
    return text;
}

void writeMetadata(benchmark::State& state, MetadataForm form, const QVector<DcmTagKey>& wanted)
{
    const std::unique_ptr<TagFile> file = optimisedStudy();
    QByteArray text;
    for (auto step : state)
        text = metadata(*file, form, wanted);
    state.counters["bytes"] = text.size();
}

void compressMetadata(benchmark::State& state)
{
    const QByteArray text = metadata(*optimisedStudy(), MetadataForm::Json);
    libdeflate_compressor* compressor = libdeflate_alloc_compressor(static_cast<int>(state.range(0)));
    QByteArray out(text.size(), Qt::Uninitialized);
    size_t size = 0;
    for (auto step : state)
        size = libdeflate_gzip_compress(compressor, text.constData(), static_cast<size_t>(text.size()),
                                        out.data(), static_cast<size_t>(out.size()));
    libdeflate_free_compressor(compressor);
    state.counters["bytes"] = static_cast<double>(size);
}

void writeJson(benchmark::State& state)
{
    writeMetadata(state, MetadataForm::Json, {});
}

void writeSlimJson(benchmark::State& state)
{
    writeMetadata(state, MetadataForm::Json,
                  {DCM_Rows, DCM_ImagePositionPatient, DCM_ImageOrientationPatient});
}

void writeXml(benchmark::State& state)
{
    writeMetadata(state, MetadataForm::Xml, {});
}

BENCHMARK(writeJson)->Unit(benchmark::kMillisecond);
BENCHMARK(writeSlimJson)->Unit(benchmark::kMillisecond);
BENCHMARK(writeXml)->Unit(benchmark::kMillisecond);
BENCHMARK(compressMetadata)->Arg(1)->Arg(2)->Arg(3)->Arg(6)->Unit(benchmark::kMillisecond);

}  // namespace

}  // namespace Kdd
