#include "DatabaseFixture.h"
#include "platform/database/HeldFiles.h"
#include "platform/database/StorageManager.h"

#include <limits>
#include <set>

using namespace Kxg;

namespace
{

class CatalogueTest : public DatabaseTest
{
protected:
    /// What the tag file side is told of a study.
    std::string told(const QByteArray& studyUID)
    {
        QByteArray text;
        std::shared_ptr<DicomDirectoryEntry> study;
        EXPECT_EQ(GetStudy(studyUID, study).text().toStdString(), "");
        if (!study)
            return "none";
        for (const auto& series : study->entries) {
            text += series.seriesInstanceUID + ' ' + series.modality + ':';
            for (const auto& file : series.entries)
                text += ' ' + file.name;
            text += '\n';
        }
        QMap<QByteArray, std::shared_ptr<SeriesInfo>> images;
        EXPECT_EQ(GetSeries(studyUID, images).text().toStdString(), "");
        for (const auto& series : qAsConst(images))
            for (const ImageFile& image : series->images)
                text += series->seriesInstanceUID + ' ' + image.sopInstanceUID + ' ' + image.path + '\n';
        return text.toStdString();
    }

    QVector<QByteArray> findStudies(const QByteArray& prefix, int limit = 10)
    {
        QVector<QByteArray> found;
        EXPECT_TRUE(catalogue().findStudies(prefix, limit, found).good());
        return found;
    }

    /// Registers files; the conflicts that this makes.
    std::string conflictsOf(const std::vector<DicomFileRecord>& files)
    {
        const char* const kinds[] = {" replaces ", " also in other study ", " follows correction "};
        RegistrationOutcome outcome;
        QByteArray text;
        EXPECT_EQ(catalogue().registerFiles({files, {}, {}}, outcome).text().toStdString(), "");
        for (const FileConflict& each : outcome.conflicts)
            text += each.path + kinds[static_cast<int>(each.kind)] + each.otherPath + " of " +
                    each.otherStudyUID + '\n';
        return text.toStdString();
    }

    std::set<std::string> known(const QByteArray& path)
    {
        QHash<QByteArray, FileStamp> stamps;
        EXPECT_EQ(catalogue().knownFiles(path, stamps).text().toStdString(), "");
        std::set<std::string> paths;
        for (const QByteArray& found : stamps.keys())
            paths.insert(found.toStdString());
        return paths;
    }
};

INSTANTIATE_TEST_SUITE_P(Engines, CatalogueTest, kBothEngines, engineName);

using Paths = std::vector<std::string>;
using PathSet = std::set<std::string>;

TEST_P(CatalogueTest, AFileThatMovesTouchesBothStudiesAndAnEmptyOneWaitsToBeForgotten)
{
    add({dicom("/d/a", "1.1", "1.1.1"), dicom("/d/b", "1.1", "1.1.1", "2")});
    EXPECT_EQ(add({dicom("/d/a", "1.2", "1.2.1")}).keys(), (QList<QByteArray>{"1.1", "1.2"}));
    EXPECT_EQ(studies(), "1.1   1/1/0*\n1.2   1/1/0*\n");
    EXPECT_EQ(add(FileRecords{{}, {}, {{"/d/b", {}}}}).keys(), QList<QByteArray>{"1.1"});
    EXPECT_EQ(studies(), "1.2   1/1/0*\n");
    EXPECT_EQ(told("1.1"), "none");
    auto claim = claimNext();
    ASSERT_TRUE(claim);
    EXPECT_EQ(claim->studyInstanceUID(), "1.1");
    add({dicom("/d/c", "1.1", "1.1.1", "3")});
    EXPECT_TRUE(claim->finishRemoved().good());
    EXPECT_EQ(studies(), "1.1   1/1/0*\n1.2   1/1/0*\n");
    EXPECT_TRUE(catalogue().removeStudy("1.1").good());
    ASSERT_TRUE(catalogue().claim("1.1", 0, claim).good() && claim != nullptr);
    EXPECT_TRUE(claim->finishRemoved().good());
    EXPECT_EQ(findStudies("1.1"), QVector<QByteArray>());
}

TEST_P(CatalogueTest, UnknownFilesAreThoseThatWereNeverThere)
{
    std::vector<DicomFileRecord> files;
    QSet<QByteArray> paths{"/d/new", "/d/n%"};
    for (int i = 0; i < 450; ++i) {
        const QByteArray path = "/d/" + QByteArray::number(i);
        files.push_back(dicom(path, "1", "1.1", path));
        paths.insert(path);
    }
    add(files);
    ASSERT_TRUE(catalogue().removeImage("1", "/d/7").good());
    ASSERT_TRUE(catalogue().dropKnown(paths).good());
    EXPECT_EQ(paths, (QSet<QByteArray>{"/d/new", "/d/n%"}));
}

TEST_P(CatalogueTest, ConflictsOfFilesAreTold)
{
    EXPECT_EQ(conflictsOf({dicom("/d/z", "1", "1.1", "x"), dicom("/d/y", "2", "2.1", "x")}),
              "/d/z also in other study /d/y of 2\n");
    EXPECT_EQ(conflictsOf({dicom("/d/a", "1", "1.2", "x")}),
              "/d/a also in other study /d/y of 2\n/d/a replaces /d/z of 1\n");
    // A UID that cannot be stored as it is counts as what is stored.
    EXPECT_EQ(conflictsOf({dicom("/d/u", "3", "3.1", "x\xff")}), "");
    EXPECT_EQ(conflictsOf({dicom("/d/v", "3", "3.1", "x\xff")}), "/d/v replaces /d/u of 3\n");
}

TEST_P(CatalogueTest, ImagesAreListedWhereACorrectionPutThemAndFilesFollow)
{
    add(FileRecords{
        {dicom("/d/a", "1", "1.1", "x"), dicom("/d/b", "1", "1.1", "y")}, {{"/d/v", {}, "1", "1.1"}}, {}});
    EXPECT_EQ(correct({{"1", "x", "2", "2.1", "x2", "changes"}}).keys(), (QList<QByteArray>{"1", "2"}));
    QByteArray study;
    Paths foreign;
    std::vector<ImageCorrection> known;
    ASSERT_TRUE(GetCorrections(2, study, known, foreign).good());
    EXPECT_TRUE(study == "2" && known.size() == 1 && foreign == Paths{"/d/v"});
    EXPECT_EQ(told("2"), "2.1 : v\n2.1 x2 /d/a\n");
    EXPECT_EQ(told("1"), "1.1 : v\n1.1 y /d/b\n");
    EXPECT_EQ(conflictsOf({dicom("/e/a", "1", "1.1", "x")}),
              "/e/a follows correction  of 2\n/e/a replaces /d/a of 2\n");
    EXPECT_EQ(told("2"), "2.1 : v\n2.1 x2 /e/a\n");
    // On to a third study, and then back as if nothing had been.
    correct({{"1", "x", "3", "3.1", "x", "more"}});
    EXPECT_EQ(told("2"), "none");
    EXPECT_EQ(told("3"), "3.1 : v\n3.1 x /e/a\n");
    correct({{"1", "x", "1", "1.1", "x", ""}});
    EXPECT_EQ(told("1"), "1.1 : v\n1.1 y /d/b\n1.1 x /e/a\n");
    EXPECT_EQ(told("3"), "none");
}

TEST_P(CatalogueTest, AMoveTakenBackLeavesTheFileThatItHadHidden)
{
    add({dicom("/d/moved", "1", "1.1", "x"), dicom("/d/native", "2", "2.1", "x")});
    correct({{"1", "x", "2", "2.1", "x", "changes"}});
    EXPECT_EQ(told("1") + told("2"), "none2.1 :\n2.1 x /d/moved\n");
    add({dicom("/d/later", "1", "1.1", "x")});
    correct({{"1", "x", "1", "1.1", "x", ""}});
    EXPECT_EQ(told("1") + told("2"), "1.1 :\n1.1 x /d/later\n2.1 :\n2.1 x /d/native\n");
}

TEST_P(CatalogueTest, ListsAreInTheOrderOfBytesWhateverTheOrderOfRegistering)
{
    std::vector<DicomFileRecord> files = {
        dicom("/d/B", "1", "1.10", "a"),        dicom("/d/a'\\b", "1", "1.10", "b"),
        dicom("/d/\xC3\xA9", "1", "1.10", "c"), dicom("/d/\xFF\x01", "1", "1.10", "d"),
        dicom("/d/0", "1", "1.9", "e"),         dicom("/d/?", "1", "1.10", "f")};
    const std::vector<VolumeFileRecord> volumes = {{"/w/\xFEv_part002", {}, "1", "1.9"},
                                                   {"/x/\xFEv", {}, "1", "1.9"}};
    add(FileRecords{{}, {volumes[1]}, {}});
    add(FileRecords{{files.rbegin(), files.rend()}, {volumes[0]}, {}});
    EXPECT_EQ(
        told("1"),
        "1.10 :\n1.9 : \xFEv \xFEv_part002\n"
        "1.10 f /d/?\n1.10 a /d/B\n1.10 b /d/a'\\b\n1.10 c /d/\xC3\xA9\n1.10 d /d/\xFF\x01\n1.9 e /d/0\n");
    Paths dicomPaths, volumePaths, series;
    ASSERT_TRUE(GetAllFilesOfStudy("user", 1, dicomPaths, volumePaths, series).good());
    EXPECT_EQ(dicomPaths, (Paths{"/d/0", "/d/?", "/d/B", "/d/a'\\b", "/d/\xC3\xA9", "/d/\xFF\x01"}));
    EXPECT_EQ(volumePaths, (Paths{"/x/\xFEv", "/w/\xFEv_part002"})) << "parts by their numbers";
    EXPECT_EQ(series, Paths{"1.9"});
    EXPECT_TRUE(GetAllFilesOfStudy("user", 2, dicomPaths, volumePaths, series).bad());
    EXPECT_EQ(told("2"), "none");
}

TEST_P(CatalogueTest, KnowsWhatLiesBelowAFolderAndNothingBesideIt)
{
    add(FileRecords{{dicom("/d/a", "1", "1.1"), dicom("/d.x", "1", "1.1"), dicom("/d0", "1", "1.1")},
                    {},
                    {{"/d/b/\xFF", {}}}});
    const PathSet below = {"/d/a", "/d/b/\xFF"};
    EXPECT_EQ(known("/d"), below);
    EXPECT_EQ(known("/d//"), below);
    EXPECT_EQ(known("/d/a"), PathSet{"/d/a"});
    EXPECT_EQ(known("/").size(), 4U);
    EXPECT_EQ(known("/e"), PathSet());
}

TEST_P(CatalogueTest, TheFirstDicomFileThatIsKeptDescribesItsStudy)
{
    Requests none;
    const FileRecords bad = {
        {dicom("/d/a", "1", "1.1"), dicom("/d/bad", QByteArray(300, '1'), "1.1")}, {}, {}};
    EXPECT_NE(catalogue().registerFiles(bad, none).text().indexOf(QLatin1String("/d/bad")), -1);
    EXPECT_EQ(studies(), "");
    add(FileRecords{{}, {{"/d/0.volume", {}, "1", "1.1"}}, {}});
    DicomFileRecord first = dicom("/d/a", "1", "1.1"), later = dicom("/d/b", "1", "1.2", "2");
    first.patientName = QByteArray("Zo\xEB\0^\xE5\xB1\xB1", 8);  // neither UTF-8 nor free of NUL
    first.modality = "MR";
    later.patientName = "Other";
    later.modality = "CT";
    add({later, first});
    EXPECT_EQ(studies(), "1 Zo\xEF\xBF\xBD^\xE5\xB1\xB1 CT MR 2/2/1*\n");
    EXPECT_EQ(told("1").substr(0, 28), "1.1 MR: 0.volume\n1.2 CT:\n1.1");
}

TEST_P(CatalogueTest, KeepsEveryFileOfALargeSetOnceWithItsLastStampAndListsTheLastByPathOfAnImage)
{
    std::vector<DicomFileRecord> files(157, dicom("", "1", "1.1", "x"));
    for (size_t i = 0; i < files.size(); ++i)
        files[i].path = "/d/" + QByteArray::number(static_cast<int>(1000 + i % 154));
    add(files);
    for (DicomFileRecord& file : files)
        file.stamp = {5, 7};
    add(files);
    QHash<QByteArray, FileStamp> stamps;
    ASSERT_TRUE(catalogue().knownFiles("/", stamps).good());
    EXPECT_EQ(stamps.size(), 154);
    EXPECT_EQ(stamps.values().count({5, 7}), 154);
    EXPECT_EQ(told("1"), "1.1 :\n1.1 x /d/1153\n");
    EXPECT_EQ(studies(), "1   1/1/0*\n");
}

TEST_P(CatalogueTest, FindsStudiesByTheBeginningOfTheirUID)
{
    add({dicom("/d/a", "1.2", "1"), dicom("/d/b", "1.25", "1"), dicom("/d/c", "1.3", "1"),
         dicom("/d/d", "1_2", "1")});
    EXPECT_EQ(findStudies("1.2"), (QVector<QByteArray>{"1.2", "1.25"}));
    EXPECT_EQ(findStudies("1", 3).size(), 3);
}

TEST_P(CatalogueTest, FilesAreFoundByWhatTheySayThemselvesAlsoWhereTheyAreShownElsewhere)
{
    add({dicom("/d/a", "1", "1.1", "x"), dicom("/d/b", "1", "1.1", "y"), dicom("/e/a", "9", "9.1", "x")});
    add({dicom("/d/c", "1", "1.1", "x")});
    // Of an image of study 1.
    const auto files = [&](const char* image) {
        QVector<KeptFile> found;
        EXPECT_TRUE(catalogue().imageFiles("1", image, found).good());
        QByteArray text;
        for (const KeptFile& file : found)
            text += file.path + (file.isShown ? " shown " : " ") + file.shownStudyUID + ' ' +
                    file.shownSeriesUID + ' ' + file.shownImage + '\n';
        return text.toStdString();
    };
    // In every study, those that count.
    const auto held = [](const QList<QByteArray>& images) {
        std::vector<HeldFile> found;
        EXPECT_TRUE(heldFiles(images, found).good());
        QStringList lines;
        for (const HeldFile& file : found)
            lines << QString::fromUtf8(file.sopInstanceUID + ' ' + file.path + ' ' + file.shownStudyUID +
                                       ' ' + file.shownImage);
        lines.sort();
        return lines.join(QLatin1String(", ")).toStdString();
    };
    EXPECT_EQ(files("x"), "/d/c shown 1 1.1 x\n/d/a 1 1.1 x\n");
    EXPECT_EQ(held({"x"}), "x /d/c 1 x, x /e/a 9 x");
    correct({{"1", "x", "2", "2.1", "x2", "changes"}, {"1", "y", "1", "1.1", "x", "changes"}});
    EXPECT_EQ(files("x"), "/d/c shown 2 2.1 x2\n/d/a 2 2.1 x2\n") << "not what is shown as x now";
    EXPECT_EQ(held({"x"}), "x /d/c 2 x2, x /e/a 9 x") << "not what is shown as x now";
    EXPECT_EQ(files("y"), "/d/b shown 1 1.1 x\n");
    EXPECT_EQ(files("z") + held({"x2", "z"}) + held({}), "");
    QList<QByteArray> many;
    for (int i = 0; i < 250; ++i)
        many.append(QByteArray::number(i));
    EXPECT_EQ(held(many << "y"), "y /d/b 1 x");
}

TEST_P(CatalogueTest, ConfigurationIsReadBack)
{
    catalogue();
    EXPECT_EQ(StorageManager::getMetaFolder(), "");
    const char* const values[][2] = {
        {"MetaFolder", "/meta/\xFF"}, {"Volume10", "/j"}, {"Volume2", "/b"}, {"Volume2", "/c"}};
    for (const auto& value : values)
        EXPECT_TRUE(catalogue().setConfig("Storage", value[0], value[1]).good());
    EXPECT_EQ(StorageManager::getMetaFolder(), "/meta/\xFF");
    EXPECT_TRUE(StorageManager::retrieveStorageVolumes().good());
    EXPECT_EQ(StorageManager::storageVolumes(), (QVector<QByteArray>{"/c", "/j"}));
    EXPECT_EQ(GetGlobalConfig("Other", "MetaFolder", "fallback"), "fallback");
}

}  // namespace
