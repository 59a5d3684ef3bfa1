#include "sample/Studies.h"

#include "platform/base/Result.h"

#include <QDirIterator>
#include <QMap>
#include <QTemporaryDir>
#include <QTextCodec>

#include <dcmtk/config/osconfig.h>

#include <dcmtk/dcmdata/dctk.h>
#include <gtest/gtest.h>

namespace Kdd
{

namespace
{

QMap<QString, QByteArray> filesBelow(const QTemporaryDir& folder)
{
    QMap<QString, QByteArray> files;
    QDirIterator it(folder.path(), QDir::Files, QDirIterator::Subdirectories);
    while (it.hasNext()) {
        QFile file(it.next());
        EXPECT_TRUE(file.open(QIODevice::ReadOnly)) << qPrintable(file.fileName());
        files.insert(QDir(folder.path()).relativeFilePath(file.fileName()), file.readAll());
    }
    return files;
}

QMap<QString, QByteArray> written(const QTemporaryDir& folder, int images)
{
    SampleSummary summary;
    EXPECT_EQ(writeSampleStudies(folder.path(), {images, 1}, {}, summary).text(), QString());
    return filesBelow(folder);
}

void load(DcmFileFormat& file, const QTemporaryDir& folder, const QString& name)
{
    const OFCondition loaded = file.loadFile(qPrintable(folder.filePath(name)));
    ASSERT_TRUE(loaded.good()) << qPrintable(name) << ": " << loaded.text();
}

std::string textOf(DcmItem& item, const DcmTagKey& key)
{
    OFString text;
    item.findAndGetOFStringArray(key, text);
    return text;
}

TEST(SampleStudies, AreTheSameToTheLastByteForTheSameSeedHoweverManyAreAskedFor)
{
    const QTemporaryDir folders[3];
    const auto files = written(folders[0], 60);
    EXPECT_EQ(written(folders[1], 60), files);
    const auto more = written(folders[2], 90);
    EXPECT_EQ(more.size(), 90);
    for (auto it = files.cbegin(); it != files.cend(); ++it)
        EXPECT_EQ(more.value(it.key()), it.value()) << qPrintable(it.key());
}

TEST(SampleStudies, LoadWithOneStudyUidPerFolderAndOneSeriesUidBelowAndNeverTwoObjectsOfOneUid)
{
    const QTemporaryDir folder;
    QMap<QString, std::string> uidOfFolder;
    QMap<std::string, QString> folderOfUid;
    const auto expectSame = [&](const QString& place, const std::string& uid) {
        EXPECT_EQ(uid.substr(0, 5), "2.25.") << qPrintable(place);
        EXPECT_EQ(uidOfFolder.value(place, uid), uid) << qPrintable(place);
        EXPECT_EQ(folderOfUid.value(uid, place), place) << uid;
        uidOfFolder.insert(place, uid);
        folderOfUid.insert(uid, place);
    };
    for (const QString& name : written(folder, 60).keys()) {
        DcmFileFormat file;
        load(file, folder, name);
        expectSame(name.section(QLatin1Char('/'), 0, 0), textOf(*file.getDataset(), DCM_StudyInstanceUID));
        expectSame(name.section(QLatin1Char('/'), 0, 1), textOf(*file.getDataset(), DCM_SeriesInstanceUID));
        expectSame(name, textOf(*file.getDataset(), DCM_SOPInstanceUID));
    }
}

TEST(SampleStudies, HaveNamesThatConvertToUtf8)
{
    const char* const patients[][2] = {{"CT-1/2/IM0001.dcm", "Müller^Jörg^Günther^Dr."},
                                       {"MR-1/2/IM0001.dcm", "Иванова^Мария^Петровна"},
                                       {"MG-1/1/IM0001.dcm", "Διονυσίου^Ελένη"},
                                       {"DX-1/1/IM0001.dcm", "Nguyễn^Thị Hoa=阮^氏花"},
                                       {"SC-1/1/IM0001.dcm", "Baker^Thomas^James^Mr.^Jr."}};
    const QTemporaryDir folder;
    written(folder, 30);
    for (const auto& [name, patient] : patients) {
        DcmFileFormat file;
        load(file, folder, QLatin1String(name));
        EXPECT_TRUE(file.getDataset()->convertToUTF8().good()) << name;
        EXPECT_EQ(textOf(*file.getDataset(), DCM_PatientName), patient) << name;
    }
    // DCMTK cannot convert this set where it is built on the C library's iconv.
    DcmFileFormat japanese;
    load(japanese, folder, QStringLiteral("US-1/1/IM0001.dcm"));
    const QTextCodec* codec = QTextCodec::codecForName("ISO-2022-JP");
    ASSERT_TRUE(codec);
    EXPECT_EQ(textOf(*japanese.getDataset(), DCM_SpecificCharacterSet), "\\ISO 2022 IR 87");
    EXPECT_EQ(codec->toUnicode(textOf(*japanese.getDataset(), DCM_ReferringPhysicianName).c_str()),
              QString::fromUtf8("Suzuki^Hanako=鈴木^花子"));
}

TEST(SampleStudies, ThatCannotBeWrittenSayWhichFolderAndWhy)
{
    const QTemporaryDir folder;
    QFile file(folder.filePath(QStringLiteral("file")));
    ASSERT_TRUE(file.open(QIODevice::WriteOnly));
    // Below /proc nobody can make a folder, not even who may do anything else.
    for (const QString& place : {file.fileName(), QStringLiteral("/proc/samples")}) {
        SampleSummary summary;
        const Result result = writeSampleStudies(place, {30, 1}, {}, summary);
        const QString start = QLatin1String("Cannot make the folder ") + place + QLatin1String("/CT-1/1: ");
        EXPECT_TRUE(result.text().startsWith(start)) << qPrintable(result.text());
        EXPECT_EQ(summary.images, 0);
    }
    EXPECT_EQ(filesBelow(folder).size(), 1);
}

}  // namespace

}  // namespace Kdd
