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

TEST_F(TagFileTree, TakesNoImageThatBelongsNowhereOrThatItHas)
{
    TagFile file;
    EXPECT_EQ(add(file, anImage().without(DCM_SOPInstanceUID)), nullptr) << "known by nothing";
    EXPECT_TRUE(file.isEmpty());
    TagMap* first = add(file, anImage("1"));
    EXPECT_EQ(add(file, anImage("1").inStudy("1.2.0")), nullptr) << "of another study";
    EXPECT_EQ(file.addTagMap(anImage("1").inSeries("1.2.4").map(), nullptr, false), nullptr);
    EXPECT_EQ(file.addTagMap(first, nullptr, true), first) << "held already";
    EXPECT_EQ(file.findImage("1"), first);
    EXPECT_NE(add(file, anImage("1").inSeries("1.2.4")), nullptr) << "in its place";
    EXPECT_EQ(file.seriesByUID().keys(), Uids{"1.2.4"}) << "the series that became empty is gone";
    const LogCapture log;
    EXPECT_EQ(file.addDicomFile("/no/such/file", nullptr, false), nullptr);
    EXPECT_EQ(log.count("Could not load /no/such/file: "), 1);
}

TEST_F(TagFileTree, CountsWhatItHoldsAndWrote)
{
    TagFile file;
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

TEST_F(TagFileTree, RemovesByUidsThatMayBeItsOwn)
{
    TagFile file;
    add(file, anImage("1"), "/store/1_a.dcm");
    add(file, anImage("2"), "/store/2_a.dcm");
    add(file, anImage().without(DCM_SOPInstanceUID), "/known/by/its/path.dcm");
    add(file, anImage("3").inSeries("1.2.4"));
    const char* path = file.findImage("2")->findElement(kFileSuffix)->value().constData();
    EXPECT_NE(file.addTagMap(anImage("2").map(), path, true), nullptr);
    const QByteArray& own = file.findImage("1")->findElement(DCM_SOPInstanceUID)->value();
    const char* images[] = {own.constData(), "unknown", own.constData()};
    EXPECT_EQ(file.removeImages(3, images), 1);
    const char* series[] = {file.findSeries("1.2.3")->findElement(DCM_SeriesInstanceUID)->value().constData(),
                            file.seriesByUID().firstKey().constData(), "unknown"};
    EXPECT_EQ(file.removeSeries(3, series), 1);
    EXPECT_EQ(file.imagesByUID().keys(), Uids{"3"});
    const char* last[] = {"3"};
    EXPECT_EQ(file.removeImages(1, last), 1);
    EXPECT_TRUE(file.isEmpty() && file.seriesByUID().isEmpty() && file.study() == nullptr);
    EXPECT_NE(add(file, anImage("1").inStudy("another")), nullptr);
}

TEST_F(TagFileTree, TheMetaFolderEndsInASlash)
{
    for (const auto& [given, kept] : {std::pair("", "./"), {"C:\\data", "C:/data/"}, {"/meta/", "/meta/"}}) {
        TagFile::setMetaFolder(given);
        EXPECT_STREQ(TagFile::metaFolder(), kept);
    }
}

}  // namespace
