// What a request for an image's metadata costs once its study's tag file is read, beside opening the DICOM file.

#include "bench/Workload.h"
#include "kddlib/Loader.h"
#include "kddlib/items/kdditem.h"
#include "kddlib/tagmodel/OwnAttributes.h"
#include "kddlib/tagmodel/TagMap.h"

#include <QDataStream>

#include <benchmark/benchmark.h>
#include <dcmtk/dcmdata/dctk.h>

#include <algorithm>
#include <cstdlib>
#include <random>
#include <string>
#include <vector>

namespace Kdd
{

namespace
{

/// The study as a server holds it: read from its tag file.
std::shared_ptr<TagFile> servedStudy()
{
    const std::unique_ptr<TagFile> built =
        thousandImages().study(static_cast<int>(thousandImages().files().size()));
    built->optimizeAll();
    QByteArray bytes;
    QDataStream out(&bytes, QIODevice::WriteOnly);
    QDataStream in(&bytes, QIODevice::ReadOnly);
    auto served = std::make_shared<TagFile>();
    if (!built->writeCacheFile(out) || !served->readCacheFile(in, nullptr))
        std::abort();
    return served;
}

/// Under which paths the images are asked for.
std::vector<QByteArray> servedPaths(const TagFile& study, bool isShuffled)
{
    std::vector<QByteArray> paths;
    for (auto it = study.imagesByUID().cbegin(); it != study.imagesByUID().cend(); ++it) {
        QByteArray suffix;
        it.value()->findAndGetString(kFileSuffix, suffix);
        paths.push_back("/archive/" + study.studyInstanceUID() + '/' + it.key() + '_' + suffix + ".dcm");
    }
    if (isShuffled)
        std::shuffle(paths.begin(), paths.end(), std::mt19937());
    return paths;
}

/// The name of the patient, as a first look into what was answered.
template <typename Dataset>
void readName(Dataset& dataset)
{
    OFString name;
    dataset.findAndGetOFString(DCM_PatientName, name);
    benchmark::DoNotOptimize(name);
}

/// One image after the other, and with `read` one attribute of each.
void loadMetaData(benchmark::State& state)
{
    const std::shared_ptr<TagFile> study = servedStudy();
    Loader loader;
    loader.addTagFile(study->studyInstanceUID(), study);
    const std::vector<QByteArray> paths = servedPaths(*study, state.range(0) != 0);
    const bool isRead = state.range(1) != 0;
    std::size_t next = 0;
    for (auto step : state) {
        const std::shared_ptr<Item> item = loader.loadMetaData(paths[next].constData());
        benchmark::DoNotOptimize(item);
        if (isRead)
            readName(*item);
        next = (next + 1) % paths.size();
    }
    state.SetItemsProcessed(static_cast<int64_t>(state.iterations()));
}

void openDicomFile(benchmark::State& state)
{
    const std::vector<std::string>& files = thousandImages().files();
    std::size_t next = 0;
    for (auto step : state) {
        DcmFileFormat file;
        file.loadFile(files.at(next).c_str());
        readName(*file.getDataset());
        next = (next + 1) % files.size();
    }
    state.SetItemsProcessed(static_cast<int64_t>(state.iterations()));
}

BENCHMARK(loadMetaData)->ArgNames({"shuffled", "read"})->ArgsProduct({{0, 1}, {0, 1}});
BENCHMARK(openDicomFile);

}  // namespace

}  // namespace Kdd
