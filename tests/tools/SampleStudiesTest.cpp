#include "tools/kdd/sample/SampleStudies.h"

#include <QDirIterator>
#include <QMap>
#include <QSet>
#include <QTemporaryDir>
#include <QTextCodec>

#include <dcmtk/config/osconfig.h>

#include <dcmtk/dcmdata/dctk.h>
#include <gtest/gtest.h>
#include <sys/resource.h>

#include <algorithm>
#include <csignal>
#include <cstdlib>
#include <iostream>
#include <limits>
#include <memory>
#include <set>
#include <string>

namespace Kdd
{

namespace
{

constexpr int kFixedFiles = 23;  // of one set of studies

SampleSummary write(const QTemporaryDir& folder, int images, unsigned seed = 1)
{
    return writeSampleStudies(folder.path(), {images, seed}, {});
}

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

// The samples of one call, which the tests only read.
class SampleStudies : public testing::Test
{
protected:
    static void SetUpTestSuite()
    {
        sFolder = std::make_unique<QTemporaryDir>();
        ASSERT_EQ(write(*sFolder, 60).failure, QString());
        sFiles = filesBelow(*sFolder);
    }
    static void TearDownTestSuite() { sFolder.reset(); }

    static std::unique_ptr<QTemporaryDir> sFolder;
    static QMap<QString, QByteArray> sFiles;
};

std::unique_ptr<QTemporaryDir> SampleStudies::sFolder;
QMap<QString, QByteArray> SampleStudies::sFiles;

TEST_F(SampleStudies, AreTheSameToTheLastByteForTheSameSeed)
{
    const QTemporaryDir again;
    write(again, 60);
    EXPECT_EQ(filesBelow(again), sFiles);
}

TEST_F(SampleStudies, KeepTheirFilesWhenMoreImagesAreAskedFor)
{
    const QTemporaryDir larger;
    write(larger, 90);
    const auto more = filesBelow(larger);
    EXPECT_EQ(more.size(), 90);
    for (auto it = sFiles.cbegin(); it != sFiles.cend(); ++it)
        EXPECT_EQ(more.value(it.key()), it.value()) << qPrintable(it.key());
}

TEST_F(SampleStudies, HaveOtherUidsAndPatientsForAnotherSeed)
{
    const QTemporaryDir other;
    write(other, 60, 2);
    EXPECT_EQ(filesBelow(other).keys(), sFiles.keys());
    for (const QString& name : sFiles.keys()) {
        DcmFileFormat one;
        DcmFileFormat two;
        load(one, *sFolder, name);
        load(two, other, name);
        for (const DcmTagKey& key :
             {DCM_SOPInstanceUID, DCM_SeriesInstanceUID, DCM_StudyInstanceUID, DCM_PatientID})
            EXPECT_NE(textOf(*one.getDataset(), key), textOf(*two.getDataset(), key)) << qPrintable(name);
    }
}

TEST_F(SampleStudies, HaveOneStudyUidPerFolderAndOneSeriesUidBelowAndNeverTwoObjectsOfOneUid)
{
    QMap<QString, std::string> uidOfFolder;
    QMap<std::string, QString> folderOfUid;
    const auto expectSame = [&](const QString& folder, const std::string& uid) {
        EXPECT_EQ(uid.substr(0, 5), "2.25.") << qPrintable(folder);
        EXPECT_LE(uid.size(), 44U) << qPrintable(folder);
        EXPECT_EQ(uidOfFolder.value(folder, uid), uid) << qPrintable(folder);
        EXPECT_EQ(folderOfUid.value(uid, folder), folder) << uid;
        uidOfFolder.insert(folder, uid);
        folderOfUid.insert(uid, folder);
    };
    for (const QString& name : sFiles.keys()) {
        DcmFileFormat file;
        load(file, *sFolder, name);
        expectSame(name.section(QLatin1Char('/'), 0, 0), textOf(*file.getDataset(), DCM_StudyInstanceUID));
        expectSame(name.section(QLatin1Char('/'), 0, 1), textOf(*file.getDataset(), DCM_SeriesInstanceUID));
        expectSame(name, textOf(*file.getDataset(), DCM_SOPInstanceUID));
        EXPECT_EQ(textOf(*file.getMetaInfo(), DCM_MediaStorageSOPInstanceUID),
                  textOf(*file.getDataset(), DCM_SOPInstanceUID));
    }
}

TEST_F(SampleStudies, ReferOnlyToObjectsOfTheirOwn)
{
    QSet<QByteArray> uids;
    QSet<QByteArray> references;
    for (const QString& name : sFiles.keys()) {
        DcmFileFormat file;
        load(file, *sFolder, name);
        uids.insert(textOf(*file.getDataset(), DCM_SOPInstanceUID).c_str());
        DcmStack stack;
        while (
            file.getDataset()->search(DCM_ReferencedSOPInstanceUID, stack, ESM_afterStackTop, OFTrue).good())
            if (stack.elem(2)->getTag() != DCM_ReferencedStudySequence) {
                OFString uid;
                OFstatic_cast(DcmElement*, stack.top())->getOFString(uid, 0);
                references.insert(uid.c_str());
            }
    }
    EXPECT_GE(references.size(), 7);
    EXPECT_TRUE(uids.contains(references)) << "of " << references.size() << " references some lead nowhere";
}

// Calls `visit` for every element at every depth that is no sequence.
template <typename Visit>
void forEachValue(DcmItem& item, const Visit& visit)
{
    for (DcmObject* object = item.nextInContainer(nullptr); object; object = item.nextInContainer(object)) {
        auto* sequence = dynamic_cast<DcmSequenceOfItems*>(object);
        if (!sequence) {
            visit(*dynamic_cast<DcmElement*>(object));
            continue;
        }
        for (unsigned long i = 0; i < sequence->card(); ++i)
            forEachValue(*sequence->getItem(i), visit);
    }
}

bool hasAllowedMultiplicity(DcmElement& element)
{
    const auto count = static_cast<int>(element.getVM());
    const DcmDictEntry* entry = dcmDataDict.rdlock().findEntry(element.getTag(), nullptr);
    const bool allowed =
        count == 0 || element.getTag().isPrivate() || !entry ||
        (count >= entry->getVMMin() && (entry->getVMMax() == DcmVariableVM || count <= entry->getVMMax()));
    dcmDataDict.rdunlock();
    return allowed;
}

TEST_F(SampleStudies, HaveValuesThatTheirAttributesAllow)
{
    for (const QString& name : sFiles.keys()) {
        DcmFileFormat file;
        load(file, *sFolder, name);
        forEachValue(*file.getDataset(), [&name](DcmElement& element) {
            const DcmTag tag(element.getTag());
            EXPECT_TRUE(element.checkValue().good() && hasAllowedMultiplicity(element))
                << qPrintable(name) << " " << tag.toString() << " " << DcmTag(tag).getTagName();
        });
    }
}

TEST_F(SampleStudies, BringEveryRepresentationAndAPrivateValueOf2000Bytes)
{
    std::set<std::string> representations;
    Uint32 longestPrivate = 0;
    for (const QString& name : sFiles.keys()) {
        DcmFileFormat file;
        load(file, *sFolder, name);
        forEachValue(*file.getDataset(), [&](DcmElement& element) {
            representations.insert(DcmVR(element.getVR()).getVRName());
            if (element.getTag().isPrivate())
                longestPrivate = std::max(longestPrivate, element.getLength());
        });
    }
    for (const char* vr : {"AS", "AT", "CS", "DA", "DS", "DT", "FD", "FL", "IS", "LO", "LT", "OB", "OF", "OW",
                           "PN", "SH", "SL", "SS", "ST", "TM", "UC", "UI", "UL", "UN", "UR", "US", "UT"})
        EXPECT_EQ(representations.count(vr), 1U) << vr;
    EXPECT_EQ(longestPrivate, 2000U);
}

TEST_F(SampleStudies, HaveSlicesOfOverAHundredAttributesOfWhichFewDiffer)
{
    for (const char* series : {"CT-1/2", "CT-1/3", "MR-1/2"}) {
        DcmFileFormat one;
        DcmFileFormat two;
        load(one, *sFolder, QLatin1String(series) + QLatin1String("/IM0001.dcm"));
        load(two, *sFolder, QLatin1String(series) + QLatin1String("/IM0002.dcm"));
        unsigned long same = 0;
        for (DcmObject* object = nullptr; (object = one.getDataset()->nextInContainer(object));) {
            DcmElement* other = nullptr;
            two.getDataset()->findAndGetElement(object->getTag(), other);
            same += other && dynamic_cast<DcmElement*>(object)->compare(*other) == 0 ? 1U : 0U;
        }
        const unsigned long all = one.getDataset()->card();
        EXPECT_GE(all, 110U) << series;
        EXPECT_GE(all - same, 10U) << series;
        EXPECT_LE(all - same, all / 5) << series;
    }
}

TEST_F(SampleStudies, AreMostlyExplicitAndSometimesImplicit)
{
    QMap<int, int> files;
    for (const QString& name : sFiles.keys()) {
        DcmFileFormat file;
        load(file, *sFolder, name);
        ++files[file.getDataset()->getOriginalXfer()];
    }
    EXPECT_EQ(files.value(EXS_LittleEndianImplicit), 4);
    EXPECT_EQ(files.value(EXS_LittleEndianExplicit), 56);
}

struct NamedPatient
{
    const char* file;
    const char* charset;
    const char* name;  // in UTF-8
};

const NamedPatient kPatients[] = {
    {"CT-1/2/IM0001.dcm", "ISO_IR 100", "Müller^Jörg^Günther^Dr."},
    {"MR-1/2/IM0001.dcm", "ISO_IR 144", "Иванова^Мария^Петровна"},
    {"MG-1/1/IM0001.dcm", "ISO_IR 126", "Διονυσίου^Ελένη"},
    {"DX-1/1/IM0001.dcm", "ISO_IR 192", "Nguyễn^Thị Hoa=阮^氏花"},
    {"DX-2/1/IM0001.dcm", "ISO_IR 100", "Müller^Jörg^Günther^Dr."},
    {"SC-1/1/IM0001.dcm", "", "Baker^Thomas^James^Mr.^Jr."},
};

TEST_F(SampleStudies, HaveNamesThatConvertToUtf8)
{
    for (const NamedPatient& patient : kPatients) {
        DcmFileFormat file;
        load(file, *sFolder, QLatin1String(patient.file));
        EXPECT_EQ(textOf(*file.getDataset(), DCM_SpecificCharacterSet), patient.charset);
        const OFCondition converted = file.getDataset()->convertToUTF8();
        EXPECT_TRUE(converted.good()) << patient.file << ": " << converted.text();
        EXPECT_EQ(textOf(*file.getDataset(), DCM_PatientName), patient.name) << patient.file;
    }
}

// DCMTK cannot convert this set where it is built on the C library's iconv; so the bytes are held against
// those that the standard prints for this very name, and the other texts against Qt's codec.
TEST_F(SampleStudies, HaveAJapaneseNameInThreeWritings)
{
    DcmFileFormat file;
    load(file, *sFolder, QStringLiteral("US-1/1/IM0001.dcm"));
    DcmDataset& dataset = *file.getDataset();
    EXPECT_EQ(textOf(dataset, DCM_SpecificCharacterSet), "\\ISO 2022 IR 87");
    EXPECT_EQ(textOf(dataset, DCM_PatientName), "Yamada^Tarou=\033$B;3ED\033(B^\033$BB@O:\033(B="
                                                "\033$B$d$^$@\033(B^\033$B$?$m$&\033(B");
    const QTextCodec* codec = QTextCodec::codecForName("ISO-2022-JP");
    ASSERT_TRUE(codec);
    EXPECT_EQ(codec->toUnicode(textOf(dataset, DCM_ReferringPhysicianName).c_str()),
              QString::fromUtf8("Suzuki^Hanako=鈴木^花子"));
    EXPECT_EQ(codec->toUnicode(textOf(dataset, DCM_PatientComments).c_str()),
              QString::fromUtf8("おなか の いたみ"));
}

TEST_F(SampleStudies, GiveACharacterSetAgainInsideASequenceItem)
{
    for (const char* name : {"CT-1/2/IM0007.dcm", "DX-1/1/IM0002.dcm"}) {
        DcmFileFormat file;
        load(file, *sFolder, QLatin1String(name));
        DcmItem* correction = nullptr;
        DcmItem* before = nullptr;
        file.getDataset()->findAndGetSequenceItem(DCM_OriginalAttributesSequence, correction);
        ASSERT_TRUE(correction) << name;
        correction->findAndGetSequenceItem(DCM_ModifiedAttributesSequence, before);
        ASSERT_TRUE(before) << name;
        const std::string charset = textOf(*before, DCM_SpecificCharacterSet);
        EXPECT_NE(charset, textOf(*file.getDataset(), DCM_SpecificCharacterSet)) << name;
        EXPECT_TRUE(before->convertCharacterSet(charset, "ISO_IR 192").good()) << name;
        EXPECT_EQ(textOf(*before, DCM_PatientName), "Unbekannt^Männlich") << name;
    }
}

struct Amount
{
    int asked;
    int written;
    int studies;
    int series;
};

class SampleStudiesOfAnyNumber : public testing::TestWithParam<Amount>
{
};

TEST_P(SampleStudiesOfAnyNumber, AreCountedAsTheyLieOnTheDisk)
{
    const QTemporaryDir folder;
    const SampleSummary summary = write(folder, GetParam().asked);
    qint64 bytes = 0;
    const auto files = filesBelow(folder);
    for (const QByteArray& file : files)
        bytes += file.size();
    EXPECT_EQ(summary.failure, QString());
    EXPECT_EQ(summary.studies, GetParam().studies);
    EXPECT_EQ(summary.series, GetParam().series);
    EXPECT_EQ(summary.images, GetParam().written);
    EXPECT_EQ(files.size(), GetParam().written);
    EXPECT_EQ(summary.bytes, bytes);
}

// The last one takes every patient of the tables.
INSTANTIATE_TEST_SUITE_P(Rows, SampleStudiesOfAnyNumber,
                         testing::Values(Amount{1, kFixedFiles, 7, 15}, Amount{24, 24, 7, 15},
                                         Amount{401, 401, 7, 15}, Amount{2001, 2001, 21, 45}));

TEST_F(SampleStudies, ReportTheirProgressFileByFile)
{
    QVector<QPair<int, int>> expected;
    for (int done = 1; done <= 60; ++done)
        expected.append({done, 60});
    const QTemporaryDir folder;
    QVector<QPair<int, int>> steps;
    writeSampleStudies(folder.path(), {60, 1}, [&](int done, int total) { steps.append({done, total}); });
    EXPECT_EQ(steps, expected);
}

TEST(SampleStudiesThatCannotBeWritten, SayWhichFolderAndWhy)
{
    const QTemporaryDir folder;
    QFile file(folder.filePath(QStringLiteral("file")));
    ASSERT_TRUE(file.open(QIODevice::WriteOnly));
    // Below /proc nobody can make a folder, not even who may do anything else.
    const QString places[] = {file.fileName(), file.fileName() + QLatin1String("/below"),
                              QStringLiteral("/proc/samples")};
    for (const QString& place : places) {
        const SampleSummary summary = writeSampleStudies(place, {30, 1}, {});
        const QString start = QLatin1String("Cannot make the folder ") + place + QLatin1String("/CT-1/1: ");
        EXPECT_TRUE(summary.failure.startsWith(start)) << qPrintable(summary.failure);
        EXPECT_GT(summary.failure.size(), start.size());
        EXPECT_EQ(summary.images, 0);
    }
    EXPECT_EQ(filesBelow(folder).size(), 1);
}

TEST(SampleStudiesThatCannotBeWritten, RefuseANumberBelowOne)
{
    for (const int images : {0, -1, std::numeric_limits<int>::min()}) {
        const QTemporaryDir folder;
        const QString expected =
            QStringLiteral("The number of images must be at least 1, not %1").arg(images);
        EXPECT_EQ(write(folder, images).failure, expected);
        EXPECT_TRUE(filesBelow(folder).isEmpty());
    }
}

TEST(SampleStudiesThatCannotBeWritten, LeaveAFolderAloneThatHasTheNameOfAFile)
{
    const QTemporaryDir folder;
    ASSERT_TRUE(QDir(folder.path()).mkpath(QStringLiteral("MR-1/1/IM0002.dcm/inside")));
    const SampleSummary summary = write(folder, 30);
    EXPECT_TRUE(summary.failure.contains(QLatin1String("MR-1/1/IM0002.dcm: ")))
        << qPrintable(summary.failure);
    EXPECT_EQ(filesBelow(folder).size(), summary.images);
    EXPECT_TRUE(QDir(folder.filePath(QStringLiteral("MR-1/1/IM0002.dcm/inside"))).exists());
}

// In a process of its own: no file of it can grow beyond `bytes`, as if the disk were full there.
[[noreturn]] void writeWithinLimit(const QString& folder, qint64 bytes)
{
    std::signal(SIGXFSZ, SIG_IGN);
    const rlimit limit = {static_cast<rlim_t>(bytes), RLIM_INFINITY};
    setrlimit(RLIMIT_FSIZE, &limit);
    const SampleSummary summary = writeSampleStudies(folder, {30, 1}, {});
    std::cerr << summary.images << " files, then: " << qPrintable(summary.failure) << std::endl;
    std::_Exit(summary.failure.isEmpty() ? 0 : 3);
}

TEST(SampleStudiesOnAFullDisk, AreCompleteOrNotThere)
{
    const QTemporaryDir whole;
    ASSERT_EQ(write(whole, 30).failure, QString());
    const auto expected = filesBelow(whole);
    const QString clip = QStringLiteral("US-1/1/IM0001.dcm");
    const qint64 size = expected.value(clip).size();

    // A few bytes short: all but what the last buffer holds reaches the disk.
    for (const qint64 limit : {size / 2, size - 1}) {
        const QTemporaryDir folder;
        EXPECT_EXIT(writeWithinLimit(folder.path(), limit), testing::ExitedWithCode(3),
                    "files, then: Cannot write the file .*/US-1/1/IM0001.dcm: not all of it could be stored");
        const auto files = filesBelow(folder);
        EXPECT_GT(files.size(), 10);
        EXPECT_FALSE(files.contains(clip));
        for (auto it = files.cbegin(); it != files.cend(); ++it)
            EXPECT_EQ(it.value(), expected.value(it.key())) << qPrintable(it.key());
    }
}

}  // namespace

}  // namespace Kdd
