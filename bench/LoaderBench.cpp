// What a request for an image's metadata costs once its study's tag file is read, beside opening the DICOM file.

#include "bench/Workload.h"
#include "kddlib/Loader.h"
#include "kddlib/items/kdditem.h"
#include "kddlib/tagmodel/OwnAttributes.h"
#include "kddlib/tagmodel/TagMap.h"

#include <benchmark/benchmark.h>
#include <dcmtk/dcmdata/dctk.h>

#include <utility>
#include <vector>

namespace Kdd
{

namespace
{

/// One image after the other, as a viewer asks for them, and one attribute of each.
void loadMetaData(benchmark::State& state)
{
    const std::shared_ptr<TagFile> study =
        thousandImages().study(static_cast<int>(thousandImages().files().size()));
    Loader loader;
    loader.addTagFile("study", study);
    std::vector<std::pair<QByteArray, QByteArray>> images;  // SOP Instance UID and path
    for (auto it = study->imagesByUID().cbegin(); it != study->imagesByUID().cend(); ++it) {
        QByteArray suffix;
        it.value()->findAndGetString(kFileSuffix, suffix);
        images.emplace_back(it.key(), "/archive/study/" + it.key() + '_' + suffix + ".dcm");
    }
    std::size_t next = 0;
    for (auto step : state) {
        const auto& image = images.at(next);
        const std::shared_ptr<Item> item =
            loader.loadMetaData(image.second.constData(), image.first, "study");
        OFString name;
        item->findAndGetOFString(DCM_PatientName, name);
        benchmark::DoNotOptimize(name);
        next = (next + 1) % images.size();
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
        OFString name;
        file.getDataset()->findAndGetOFString(DCM_PatientName, name);
        benchmark::DoNotOptimize(name);
        next = (next + 1) % files.size();
    }
    state.SetItemsProcessed(static_cast<int64_t>(state.iterations()));
}

BENCHMARK(loadMetaData);
BENCHMARK(openDicomFile);

}  // namespace

}  // namespace Kdd
