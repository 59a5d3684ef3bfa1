#include "fuzz/ServedStudy.h"

#include "fuzz/Property.h"
#include "fuzz/RandomFile.h"
#include "server/browser/BrowserService.h"
#include "server/dicomweb/DicomWebService.h"
#include "server/dicomweb/change/CorrectionsResource.h"
#include "server/dicomweb/metadata/MetadataResource.h"
#include "server/dicomweb/retrieve/BodyBlocks.h"
#include "server/dicomweb/retrieve/BulkDataResource.h"
#include "server/dicomweb/retrieve/InstancesResource.h"
#include "server/dicomweb/search/ChangeFeed.h"
#include "server/dicomweb/search/SearchResource.h"

#include <QDir>
#include <QFile>

#include <fcntl.h>
#include <kddlib/ArchiveDatabase.h>
#include <kddlib/DicomInput.h>
#include <kddlib/FileScan.h>
#include <kddlib/Kxg.h>
#include <kddlib/OwnAttributes.h>
#include <kddlib/StudyIntake.h>
#include <sys/stat.h>

namespace Kdd
{
namespace
{

const QByteArray kStudy = "1.2";

QString folderInMemory()
{
    const QString memory = QStringLiteral("/dev/shm");
    return (QFileInfo(memory).isWritable() ? memory : QDir::tempPath()) + QStringLiteral("/kdd-fuzz-XXXXXX");
}

void put(const QByteArray& path, const QByteArray& bytes)
{
    QFile file(QString::fromLocal8Bit(path));
    require(file.open(QIODevice::WriteOnly) && file.write(bytes) == bytes.size(), "a file can be written");
}

}  // namespace

ServedStudy::ServedStudy(Database database)
    : mFolder(folderInMemory())
    // What is younger than nothing is settled.
    , mStudies(std::make_shared<DicomWeb::StudyShelf>(1 << 24, std::chrono::hours(-1)))
    , mObjects(std::make_shared<DicomWeb::ObjectShelf>(1 << 20))
{
    TagFile::setMetaFolder((mFolder.path() + QStringLiteral("/meta")).toLocal8Bit().constData());
    if (database == Database::Sqlite)
        addSearches();
    addResources();
    mBrowser = std::make_unique<Browser::BrowserService>(*mStudies, Browser::BrowserSettings());
}

ServedStudy::~ServedStudy() = default;

void ServedStudy::addSearches()
{
    const QByteArray address = "sqlite:" + mFolder.filePath(QStringLiteral("kdd.sqlite")).toUtf8();
    Kxg::SetDatabaseServer(address);
    put(filePath(0), RandomFile().bytes("1.2.3", "1.2.3.0"));
    const std::unique_ptr<Kxg::Catalogue> catalogue = openCatalogue();
    WorkObserver observer;
    FileScan scan(*catalogue, observer);
    StudyIntake intake(*catalogue, observer);
    const Result taken =
        scan.run({filePath(0)}, [&](DicomInput input) { return intake.take(std::move(input)); });
    require(taken.good() && intake.finish().good() && intake.studies().size() == 1, "the study is taken in");
    mDatabase = std::make_unique<DicomWeb::ThreadSearch>(address);
}

void ServedStudy::addResources()
{
    std::vector<std::unique_ptr<DicomWeb::Resource>> resources;
    resources.push_back(std::make_unique<DicomWeb::MetadataResource>(*mStudies, QString(), 0));
    resources.push_back(std::make_unique<DicomWeb::InstancesResource>(mStudies, mObjects));
    resources.push_back(std::make_unique<DicomWeb::BulkDataResource>(mStudies, mObjects));
    if (mDatabase != nullptr) {
        resources.push_back(std::make_unique<DicomWeb::SearchResource>(*mDatabase, *mStudies));
        resources.push_back(std::make_unique<DicomWeb::ChangeFeed>(*mDatabase));
    }
    mDicomWeb = std::make_unique<DicomWeb::DicomWebService>(0, std::move(resources));
}

QByteArray ServedStudy::filePath(int number) const
{
    return mFolder.filePath(QString::number(number) + QStringLiteral(".dcm")).toLocal8Bit();
}

/// Runs follow each other faster than clocks of file systems tick.
void ServedStudy::setTime(const QByteArray& path)
{
    timespec times[2] = {};
    times[0].tv_sec = times[1].tv_sec = ++mTime;
    require(::utimensat(AT_FDCWD, path.constData(), times, 0) == 0, "a file's time can be set");
}

void ServedStudy::touch()
{
    setTime(TagFile::cacheFilePathForStudy(kStudy.constData()).toLocal8Bit());
}

bool ServedStudy::replace(const std::vector<QByteArray>& files)
{
    TagFile study;
    for (std::size_t i = 0; i < files.size(); ++i) {
        const QByteArray path = filePath(static_cast<int>(i));
        put(path, files[i]);
        setTime(path);
        DicomInput input = readDicomInput(path, Damage::Refused);
        if (input.kind != DicomInput::Kind::Image || input.studyUID != kStudy)
            return false;
        input.map->putAndInsertValue(kFilePath, VrCode::LO, path);
        if (study.addTagMap(input.map.release(), nullptr, true) == nullptr)
            return false;
    }
    study.optimizeAll();
    require(study.writeCacheFile(), "the tag file can be written");
    touch();
    return true;
}

Http::Response ServedStudy::get(const QByteArray& path, const QVector<Http::Field>& query,
                                const QByteArray& accept)
{
    Http::Request request;
    request.base = "http://host";
    request.query = query;
    request.headers.append({"accept", accept});
    for (const QByteArray& segment : path.split('/'))
        request.path.append(segment);
    return path.startsWith("browser/") ? mBrowser->answer(request) : mDicomWeb->answer(request);
}

QByteArray ServedStudy::bodyOf(Http::Response& response)
{
    DicomWeb::BodyBlocks blocks(std::move(response.body));
    QByteArray body;
    QByteArray block;
    do {
        require(blocks.next(block).good(), "an answer comes to its end");
        body += block;
    } while (!block.isEmpty());
    return body;
}

QByteArray ServedStudy::headerOf(const Http::Response& response, const char* name)
{
    for (const Http::Field& each : response.headers)
        if (each.name == name)
            return each.value;
    return {};
}

}  // namespace Kdd
