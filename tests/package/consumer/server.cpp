// What a server does with the library, in a few steps that each check what they did. It is built against the installed
// package alone.

#include <QByteArray>
#include <QDir>
#include <QFile>
#include <QMap>
#include <QString>

#include <dcmtk/config/osconfig.h>

#include <dcmtk/dcmdata/dcdeftag.h>
#include <dcmtk/dcmdata/dcfilefo.h>
#include <dcmtk/dcmdata/dcuid.h>
#include <kddlib/Catalogue.h>
#include <kddlib/DicomInput.h>
#include <kddlib/KxCompressedDataMedia.h>
#include <kddlib/Kxg.h>
#include <kddlib/Loader.h>
#include <kddlib/QAData.h>
#include <kddlib/StudyRecord.h>
#include <kddlib/TagFile.h>
#include <kddlib/TagMap.h>
#include <kddlib/kdditem.h>
#include <kddlib/kddtagfile.h>

#include <algorithm>
#include <cstdio>
#include <memory>
#include <stdexcept>
#include <string>

namespace
{

const QByteArray kStudy = "2.25.1";
const QByteArray kSeries = "2.25.1.1";

/// The SOP Instance UID of an image, counted from 1.
QByteArray imageUID(int number)
{
    return kSeries + '.' + QByteArray::number(number);
}

void expect(bool isSo, const std::string& what)
{
    if (!isSo)
        throw std::runtime_error(what);
    std::printf("%s\n", what.c_str());
}

void expectGood(const Kdd::Result& result, const std::string& what)
{
    expect(result.good(), what + (result.good() ? "" : ": " + result.text().toStdString()));
}

/// A folder of DICOM files, a folder of tag files and a database, below a folder that is there.
class Archive
{
public:
    explicit Archive(const QByteArray& folder)
        : mFiles(folder + '/' + kStudy)
        , mDatabase("sqlite:" + folder + "/database")
    {
        QDir().mkpath(QFile::decodeName(mFiles));
        Kdd::TagFile::setMetaFolder((folder + "/meta/").constData());
        Kxg::SetDatabaseServer(mDatabase);
    }

    /// Named as servers name files, so that the loader finds the study by the path.
    QByteArray path(int number) const { return mFiles + '/' + imageUID(number) + "_0.dcm"; }

    void makeImage(int number) const
    {
        DcmFileFormat file;
        DcmDataset& image = *file.getDataset();
        image.putAndInsertString(DCM_SOPClassUID, UID_SecondaryCaptureImageStorage);
        image.putAndInsertString(DCM_SOPInstanceUID, imageUID(number).constData());
        image.putAndInsertString(DCM_StudyInstanceUID, kStudy.constData());
        image.putAndInsertString(DCM_SeriesInstanceUID, kSeries.constData());
        image.putAndInsertString(DCM_PatientName, "Doe^Jane");
        image.putAndInsertString(DCM_Modality, "OT");
        image.putAndInsertString(DCM_InstanceNumber, QByteArray::number(number).constData());
        expect(file.saveFile(path(number).constData(), EXS_LittleEndianExplicit).good(),
               "image " + std::to_string(number) + " is made");
    }

    std::unique_ptr<Kxg::Catalogue> open() const
    {
        Kdd::Result result;
        std::unique_ptr<Kxg::Catalogue> catalogue = Kxg::Catalogue::open(mDatabase, result);
        expectGood(result, "the database is open");
        return catalogue;
    }

private:
    QByteArray mFiles;
    QByteArray mDatabase;
};

void add(const Archive& archive, int number, Kdd::TagFile& file)
{
    const QByteArray path = archive.path(number);
    expect(file.addDicomFile(path.constData(), path.constData(), false) != nullptr,
           "image " + std::to_string(number) + " is added");
}

/// The first two images make the study, the third arrives later.
void writeAndMerge(const Archive& archive)
{
    Kdd::TagFile file;
    add(archive, 1, file);
    add(archive, 2, file);
    expect(file.writeCacheFile() && QFile::exists(file.cacheFilePath()), "the tag file is written");

    Kdd::TagFile arrivals;
    add(archive, 3, arrivals);
    expect(arrivals.mergeIntoCacheFile(), "the third image is merged");
    expect(arrivals.imagesByUID().size() == 3, "all three are in the tag file");
}

void registerFiles(const Archive& archive, Kxg::Catalogue& catalogue)
{
    Kxg::FileRecords files;
    for (int number = 1; number <= 3; ++number) {
        const Kdd::DicomInput input = Kdd::readDicomInput(archive.path(number), Kdd::Damage::Refused);
        expect(input.kind == Kdd::DicomInput::Kind::Image, "a file is taken for what it is");
        files.dicom.push_back(Kdd::fileRecord(*input.map, input.path, input.stamp));
    }
    QMap<QByteArray, qint64> requests;
    expectGood(catalogue.registerFiles(files, requests), "the files are registered");
    expect(requests.contains(kStudy), "their study waits");
}

std::string nameIn(Kdd::Item* item)
{
    OFString name;
    return item != nullptr && item->findAndGetOFString(DCM_PatientName, name).good() ? name.c_str() : "";
}

void serve(const Archive& archive)
{
    Kdd::QAData job;
    job.studyUID = kStudy;
    job.images = {imageUID(1)};
    job.substitutions = {{DCM_PatientName, QStringLiteral("Roe^Jane")}};
    QString message;
    expect(Kdd::TagFile::applyQA(job, message), "an image is corrected" + message.toStdString());
    Kdd::Loader loader;
    expect(nameIn(loader.loadMetaData(archive.path(1).constData()).get()) == "Roe^Jane",
           "the corrected image is served from the tag file");
    expect(nameIn(Kdd::Loader::loadDcmDataset(archive.path(1).constData(), -1).get()) == "Doe^Jane",
           "the DICOM file stays as it was");
}

/// The video module lies where the library looks for it: what cannot be decoded is refused by the decoders and not before.
void useVideoModule()
{
    class Zeros : public Kdd::MediaSource
    {
    public:
        qint64 size() const override { return 4096; }
        qint64 read(qint64 offset, char* out, qint64 length) override
        {
            const qint64 count = std::max<qint64>(0, std::min(length, size() - offset));
            std::fill_n(out, count, '\0');
            return count;
        }
    };
    Zeros zeros;
    Kdd::TypedData2D frame;
    const QString reason =
        Kdd::KxCompressedDataMedia::decodeRepresentativeFrame(zeros, 64, 64, 0.3, frame).text();
    expect(reason.startsWith(QLatin1String("No frame can be decoded: ")) &&
               !reason.contains(QLatin1String("module")),
           "the video module answers: " + reason.toStdString());
}

/// By the C interface, as a server in another language does.
void removeStudy()
{
    expect(DeleteTagFile(kStudy.constData()), "the tag file is deleted");
    Kdd::TagFile file;
    expect(!file.readWhenFreeForStudy(kStudy.constData(), false), "it is gone");
}

}  // namespace

int main(int argc, char* argv[])
{
    if (argc != 2) {
        std::fprintf(stderr, "usage: server FOLDER\n");
        return 2;
    }
    try {
        const Archive archive(argv[1]);
        for (int number = 1; number <= 3; ++number)
            archive.makeImage(number);
        writeAndMerge(archive);
        const std::unique_ptr<Kxg::Catalogue> catalogue = archive.open();
        registerFiles(archive, *catalogue);
        serve(archive);
        useVideoModule();
        removeStudy();
    } catch (const std::exception& fault) {
        std::fprintf(stderr, "NOT SO: %s\n", fault.what());
        return 1;
    }
    std::printf("all steps done\n");
    return 0;
}
