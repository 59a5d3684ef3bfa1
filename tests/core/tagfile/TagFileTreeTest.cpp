#include "TagFileFixture.h"

#include <array>

using namespace Kdd;

namespace
{

using TagFileTree = TagFileTest;
using Counters = std::array<int, 11>;

/// In their order, without the times.
Counters countersOf(const TagFile& file)
{
    Counters all = {};
    file.getStatistics(all[0], all[1], all[2], all[3], all[4], all[5], all[6], all[7], all[8], all[9],
                       all[10]);
    all[4] = all[5] = all[6] = 0;
    return all;
}

TEST_F(TagFileTree, KeepsTheFirstOfTwoImagesUnlessToldToReplaceIt)
{
    for (const char* seriesUID : {"1.2.3", "1.2.4"}) {
        TagFile file;
        TagMap* first = add(file, anImage("1").with(DCM_PatientID, "first"));
        const DatasetBuilder second = anImage("1").inSeries(seriesUID).with(DCM_ImageComments, "second");
        EXPECT_EQ(file.addTagMap(second.map(), nullptr, false), nullptr);
        EXPECT_EQ(file.findImage("1"), first);
        TagMap* placed = file.addTagMap(second.map(), nullptr, true);
        ASSERT_NE(placed, nullptr);
        EXPECT_EQ(file.findImage("1"), placed);
        EXPECT_EQ(shownText(*placed), shownAlone(second));
        EXPECT_EQ(file.seriesByUID().keys(), Uids{seriesUID}) << "the series that became empty is gone";
        EXPECT_EQ(file.study()->children().size(), 1);
    }
}

TEST_F(TagFileTree, RefusesWhatBelongsNowhere)
{
    TagFile file;
    EXPECT_EQ(add(file, anImage().without(DCM_SOPInstanceUID)), nullptr) << "known by nothing";
    EXPECT_TRUE(file.isEmpty());
    add(file, anImage("1").inStudy("1.2"));
    EXPECT_EQ(add(file, anImage("1").inStudy("1.2.0")), nullptr) << "of another study";
    EXPECT_EQ(file.studyInstanceUID(), "1.2");
    const LogCapture log;
    EXPECT_EQ(file.addDicomFile("/no/such/file", nullptr, false), nullptr);
    EXPECT_EQ(log.count("Could not load /no/such/file: "), 1);
    EXPECT_EQ(file.imagesByUID().keys(), Uids{"1"});
}

TEST_F(TagFileTree, CountsWhatItHoldsAndWrote)
{
    TagFile file;
    EXPECT_EQ(countersOf(file), Counters{});
    for (const char* uid : {"1", "2", "3"})
        add(file, anImage(uid).withLong(DCM_ImageComments, 200));
    EXPECT_EQ(countersOf(file), (Counters{1, 3}));
    file.findImage("1")->putAndInsertValue(kPreview, VrCode::OB, QByteArray(100, 'p'));
    file.findSeries("1.2.3")->addBareVolume(new Volume);
    const int unoptimised = written(file).size();
    TagFile::setDebugOptions(TagFile::kMeasureUnoptimised);
    file.optimizeAll();
    TagFile::setDebugOptions(0);
    const int uncompressed = written(file).size();
    const int stored = written(file, Mode::Zlib).size();
    EXPECT_EQ(countersOf(file), (Counters{1, 3, 1, 1, 0, 0, 0, stored, uncompressed, unoptimised, 100}));
    file.clear();
    EXPECT_EQ(countersOf(file), Counters{});
}

TEST_F(TagFileTree, RemovingTheLastImageEmptiesIt)
{
    TagFile file;
    add(file, anImage("1"));
    add(file, anImage("2"));
    add(file, anImage("3").inSeries("1.2.4"));
    const char* uids[] = {"1", "unknown", "3", "1", "2"};
    EXPECT_EQ(file.removeImages(0, uids), 0);
    EXPECT_EQ(file.removeImages(4, uids), 2);
    EXPECT_EQ(file.seriesByUID().keys(), Uids{"1.2.3"});
    EXPECT_EQ(file.removeImages(1, uids + 4), 1);
    EXPECT_TRUE(file.isEmpty() && file.studyInstanceUID().isEmpty() && file.study() == nullptr);
    EXPECT_EQ(countersOf(file), Counters{});
    EXPECT_NE(add(file, anImage("1").inStudy("another")), nullptr);
}

TEST_F(TagFileTree, TakesUidsAndPathsThatAreItsOwn)
{
    TagFile file;
    add(file, anImage("1"), "/store/1_a.dcm");
    add(file, anImage("2"), "/store/2_a.dcm");
    const char* path = file.findImage("2")->findElement(kFileSuffix)->value().constData();
    EXPECT_EQ(file.addTagMap(file.findImage("2"), nullptr, true), file.findImage("2")) << "held already";
    EXPECT_NE(file.addTagMap(anImage("2").map(), path, true), nullptr);
    const QByteArray& own = file.findImage("1")->findElement(DCM_SOPInstanceUID)->value();
    const char* images[] = {own.constData(), own.constData()};
    EXPECT_EQ(file.removeImages(2, images), 1);
    const char* series[] = {file.findSeries("1.2.3")->findElement(DCM_SeriesInstanceUID)->value().constData(),
                            file.seriesByUID().firstKey().constData()};
    EXPECT_EQ(file.removeSeries(2, series), 1);
    EXPECT_TRUE(file.isEmpty());
}

TEST_F(TagFileTree, RemovingASeriesTakesItsImagesOutOfTheIndex)
{
    TagFile file;
    add(file, anImage("1"));
    add(file, anImage().without(DCM_SOPInstanceUID), "/known/by/its/path.dcm");
    add(file, anImage("3").inSeries("1.2.4"));
    const std::string third = shownText(*file.findImage("3"));
    const char* uids[] = {"1.2.3", "unknown", "1.2.3", "1.2.4"};
    EXPECT_EQ(file.removeSeries(3, uids), 1);
    EXPECT_EQ(file.imagesByUID().keys(), Uids{"3"});
    EXPECT_EQ(shownText(*file.findImage("3")), third);
    EXPECT_EQ(file.removeSeries(1, uids + 3), 1);
    EXPECT_TRUE(file.isEmpty() && file.imagesByUID().isEmpty());
}

TEST_F(TagFileTree, ASuffixPassesOverImagesThatHaveAnother)
{
    TagFile file;
    add(file, anImage("1"), "/store/1_a.dcm");
    add(file, anImage("2"));
    EXPECT_EQ(file.findImage("1", ""), file.findImage("1"));
    EXPECT_EQ(file.findImage("1", "a"), file.findImage("1"));
    EXPECT_EQ(file.findImage("1", "ab"), nullptr);
    EXPECT_EQ(file.findImage("2", "a"), file.findImage("2")) << "it has none";
    EXPECT_EQ(file.findImage("3", "a"), nullptr);
}

TEST_F(TagFileTree, TheMetaFolderEndsInASlash)
{
    const LogCapture log;
    for (const auto& [given, kept] : {std::pair("", "./"), {"C:\\data", "C:/data/"}, {"/meta/", "/meta/"}}) {
        TagFile::setMetaFolder(given);
        EXPECT_STREQ(TagFile::metaFolder(), kept);
    }
    EXPECT_EQ(log.count("Meta folder set to C:/data/"), 1);
}

TEST_F(TagFileTree, ATakenImageLeavesItsSeriesAndOutlivesItsTree)
{
    TagFile file;
    add(file, anImage("1"));
    const std::string shown = shownText(*file.findImage("1"));
    const std::unique_ptr<TagMap> taken(file.takeImage("1"));
    EXPECT_NE(file.findSeries("1.2.3"), nullptr);
    file.deleteEmptyNodes();
    EXPECT_TRUE(file.isEmpty() && file.seriesByUID().isEmpty());
    EXPECT_EQ(shownText(*taken), shown);
}

TEST_F(TagFileTree, AnImageWithoutSopInstanceUidIsKnownByItsPathForGood)
{
    const DatasetBuilder image = anImage().without(DCM_SOPInstanceUID);
    TagFile first;
    add(first, image, "/a.dcm");
    add(first, image, "/b.dcm");
    EXPECT_EQ(first.imagesByUID().keys(), (Uids{"/a.dcm", "/b.dcm"}));
    ASSERT_TRUE(first.mergeIntoCacheFile());
    TagFile second;
    add(second, image, "/b.dcm");
    add(second, image, "/c.dcm");
    ASSERT_TRUE(second.mergeIntoCacheFile());
    TagFile read;
    ASSERT_TRUE(read.readCacheFileForStudy("1.2", false));
    EXPECT_EQ(read.imagesByUID().keys(), (Uids{"/a.dcm", "/b.dcm", "/c.dcm"}));
    EXPECT_EQ(imagesText(read), imagesText(second));
}

}  // namespace
