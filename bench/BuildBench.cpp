// What taking files in and building a study's tag file from the database costs, beside what it cannot do without:
// loading the headers of the DICOM files and decoding what the previews show.

#include "bench/Workload.h"
#include "kddlib/Limits.h"
#include "kddlib/TagFileGenerator.h"
#include "kddlib/archive/FileScan.h"
#include "kddlib/archive/StudyIntake.h"
#include "kddlib/items/PlainFiles.h"
#include "kddlib/net/dicom/DicomFileReader.h"
#include "kddlib/previews/PreviewGenerator.h"
#include "kddlib/tagmodel/TagMap.h"
#include "platform/database/Catalogue.h"
#include "platform/database/Kxg.h"

#include <benchmark/benchmark.h>
#include <dcmtk/dcmdata/dctk.h>

namespace Kdd
{

namespace
{

constexpr int kPreviewSize = 256;

/// The workload in a database of its own.
class RegisteredStudy
{
public:
    RegisteredStudy()
    {
        Kxg::SetDatabaseServer("sqlite:" + mFolder.path().toLocal8Bit() + "/database");
        TagFile::setMetaFolder((mFolder.path() + QStringLiteral("/meta")).toLocal8Bit().constData());
        Result result;
        const auto database = Kxg::Catalogue::open(Kxg::DatabaseServer(), result);
        QMap<QByteArray, qint64> requests;
        Kxg::FileRecords records;
        for (const std::string& path : thousandImages().files()) {
            records.dicom.emplace_back();
            records.dicom.back().path = QByteArray::fromStdString(path);
            records.dicom.back().studyInstanceUID = "study";
        }
        std::vector<Kxg::StudySummary> studies;
        if (database == nullptr || database->registerFiles(records, requests).bad() ||
            database->listStudies(studies).bad())
            std::abort();
        mStudyId = studies.front().id;
    }

    int id() const { return mStudyId; }

private:
    QTemporaryDir mFolder;
    int mStudyId = 0;
};

void loadHeadersAndOnePreview(benchmark::State& state)
{
    const std::vector<std::string>& files = thousandImages().files();
    for (auto step : state) {
        for (const std::string& path : files) {
            DcmFileFormat file;
            file.loadFile(path.c_str());
            benchmark::DoNotOptimize(file);
        }
        DcmFileFormat middle;
        readDicomFile(files.at(files.size() / 2).c_str(), middle);
        benchmark::DoNotOptimize(
            PreviewGenerator::createPreviewImage(middle.getDataset(), kPreviewSize, kPreviewSize, QString()));
    }
    state.SetItemsProcessed(static_cast<int64_t>(state.iterations()) * static_cast<int64_t>(files.size()));
}

/// The study of one long series has one preview.
void buildStudy(benchmark::State& state)
{
    const RegisteredStudy study;
    for (auto step : state) {
        if (!TagFileGenerator().createTagFile(study.id()))
            state.SkipWithError("The study is not built");
    }
    state.SetItemsProcessed(static_cast<int64_t>(state.iterations()) *
                            static_cast<int64_t>(thousandImages().files().size()));
}

/// What the images say, by DCMTK's parser.
void readByParser(benchmark::State& state)
{
    for (auto step : state) {
        for (const std::string& path : thousandImages().files()) {
            DcmFileFormat file;
            readDicomFile(path.c_str(), file);
            const std::unique_ptr<TagMap> map(TagMap::createTagMap(file.getDataset(), kDefaultValueBound));
            benchmark::DoNotOptimize(map.get());
        }
    }
}

void readPlainly(benchmark::State& state)
{
    QList<QByteArray> paths;
    for (const std::string& path : thousandImages().files())
        paths.append(QByteArray::fromStdString(path));
    for (auto step : state) {
        PlainFiles files(paths, static_cast<int>(state.range(0)), kDefaultValueBound);
        for (int i = 0; i < paths.size(); ++i) {
            if (!files.next().isPlain)
                state.SkipWithError("The parser is needed");
        }
    }
}

/// All that an intake does, into an archive that is empty each time.
void takeIn(benchmark::State& state)
{
    const QByteArray folder = QByteArray::fromStdString(thousandImages().files().front());
    for (auto step : state) {
        const QTemporaryDir archive;
        Kxg::SetDatabaseServer("sqlite:" + archive.path().toLocal8Bit() + "/database");
        TagFile::setMetaFolder((archive.path() + QStringLiteral("/meta")).toLocal8Bit().constData());
        Result result;
        const auto database = Kxg::Catalogue::open(Kxg::DatabaseServer(), result);
        WorkObserver nobody;
        FileScan scan(*database, nobody);
        scan.setReaders(static_cast<int>(state.range(0)));
        StudyIntake intake(*database, nobody);
        const auto take = [&](DicomInput input) { return intake.take(std::move(input)); };
        if (scan.run({folder.left(folder.lastIndexOf('/'))}, take).bad() || intake.finish().bad())
            state.SkipWithError("The files are not taken in");
    }
}

BENCHMARK(readByParser)->Name("readByParser/1000images")->Unit(benchmark::kMillisecond);
BENCHMARK(readPlainly)
    ->Name("readPlainly/1000images/readers")
    ->Arg(1)
    ->Arg(2)
    ->UseRealTime()
    ->Unit(benchmark::kMillisecond);
BENCHMARK(takeIn)
    ->Name("takeIn/1000images/readers")
    ->Arg(1)
    ->Arg(2)
    ->UseRealTime()
    ->Unit(benchmark::kMillisecond);
BENCHMARK(loadHeadersAndOnePreview)
    ->Name("loadHeadersAndOnePreview/1000images")
    ->Unit(benchmark::kMillisecond);
BENCHMARK(buildStudy)->Name("buildStudy/1000images")->Unit(benchmark::kMillisecond);

}  // namespace

}  // namespace Kdd
