#include "kddlib/tagfile/TagFile.h"
#include "kddlib/tagmodel/TagElement.h"
#include "kddlib/tagmodel/TagMap.h"
#include "kddlib/volumes/Volume.h"
#include "support/DatasetBuilder.h"
#include "support/LogCapture.h"
#include "support/TemporaryStore.h"
#include "support/TreeText.h"

#include <QDataStream>

#include <gtest/gtest.h>

#include <array>
#include <memory>

using namespace Kdd;

namespace
{

const DcmTagKey kFilePath(0x0006, 0x7100);
const DcmTagKey kPreview(0x0006, 0x7105);

using Uids = QList<QByteArray>;
using Counters = std::array<int, 11>;

enum Counter {
    Series,
    Images,
    Volumes,
    Blobs,
    OptimiseMs,
    ReadMs,
    WriteMs,
    StoredSize,
    UncompressedSize,
    UnoptimisedSize,
    BlobBytes,
};

Counters countersOf(const TagFile& file)
{
    Counters all = {};
    file.getStatistics(all[Series], all[Images], all[Volumes], all[Blobs], all[OptimiseMs], all[ReadMs],
                       all[WriteMs], all[StoredSize], all[UncompressedSize], all[UnoptimisedSize],
                       all[BlobBytes]);
    return all;
}

TagMap* add(TagFile& file, const DatasetBuilder& image, const char* path = nullptr)
{
    return file.addTagMap(image.map(), path, false);
}

/// What an image shows that is no part of a tree.
std::string shownAlone(const DatasetBuilder& image)
{
    return shownText(*std::unique_ptr<TagMap>(image.map()));
}

QByteArray written(TagFile& file, TagFile::CompressionMode mode)
{
    TagFile::setCompressionMode(mode);
    QByteArray content;
    QDataStream out(&content, QIODevice::WriteOnly);
    EXPECT_TRUE(file.writeCacheFile(out));
    TagFile::setCompressionMode(TagFile::CompressionMode::Zlib);
    return content;
}

TEST(TagFileTree, KeepsTheFirstOfTwoImagesOfOneUid)
{
    TagFile file;
    const DatasetBuilder first = anImage("1").with(DCM_ImageComments, "first");
    TagMap* placed = add(file, first);
    EXPECT_EQ(add(file, anImage("1").with(DCM_ImageComments, "second")), nullptr);
    EXPECT_EQ(file.findImage("1"), placed);
    EXPECT_EQ(shownText(*placed), shownAlone(first));
}

TEST(TagFileTree, ReplacesAnImageAndDropsTheSeriesThatItLeavesEmpty)
{
    for (const char* seriesUID : {"1.2.3", "1.2.4"}) {
        TagFile file;
        add(file, anImage("1").with(DCM_PatientID, "first"));
        const DatasetBuilder second = anImage("1").inSeries(seriesUID).with(DCM_ImageComments, "second");
        TagMap* placed = file.addTagMap(second.map(), nullptr, true);
        ASSERT_NE(placed, nullptr);
        EXPECT_EQ(file.findImage("1"), placed);
        EXPECT_EQ(file.seriesByUID().keys(), Uids{seriesUID});
        EXPECT_EQ(file.study()->children().size(), 1);
        EXPECT_EQ(shownText(*placed), shownAlone(second));
    }
}

TEST(TagFileTree, RefusesWhatBelongsNowhere)
{
    TagFile file;
    EXPECT_EQ(add(file, anImage().without(DCM_SOPInstanceUID)), nullptr) << "known by nothing";
    EXPECT_TRUE(file.isEmpty());
    add(file, anImage("1").inStudy("1.2"));
    EXPECT_EQ(add(file, anImage("2").inStudy("1.2.0")), nullptr) << "of another study";
    EXPECT_EQ(file.addTagMap(anImage("1").inStudy("1.2.0").map(), nullptr, true), nullptr);
    EXPECT_EQ(file.imagesByUID().keys(), Uids{"1"});
    EXPECT_EQ(file.studyInstanceUID(), "1.2");
}

TEST(TagFileTree, AFreshOneCountsNothing)
{
    EXPECT_EQ(countersOf(TagFile()), Counters{});
    TagFile file;
    add(file, anImage());
    Counters expected = {};
    expected[Series] = expected[Images] = 1;
    EXPECT_EQ(countersOf(file), expected);
}

TEST(TagFileTree, CountsWhatItWrote)
{
    TagFile file;
    for (const char* uid : {"1", "2", "3"})
        add(file, anImage(uid).withLong(DCM_ImageComments, 200));
    file.findImage("1")->putAndInsertValue(kPreview, VrCode::OB, QByteArray(100, 'p'));
    file.findSeries("1.2.3")->addBareVolume(new Volume);
    const int unoptimised = written(file, TagFile::CompressionMode::None).size();
    TagFile::setDebugOptions(TagFile::kMeasureUnoptimised);
    file.optimizeAll();
    TagFile::setDebugOptions(0);
    const int uncompressed = written(file, TagFile::CompressionMode::None).size();
    const int stored = written(file, TagFile::CompressionMode::Zlib).size();
    Counters counters = countersOf(file);
    EXPECT_EQ(counters[UnoptimisedSize], unoptimised);
    counters[OptimiseMs] = counters[WriteMs] = 0;
    EXPECT_EQ(counters, (Counters{1, 3, 1, 1, 0, 0, 0, stored, uncompressed, unoptimised, 100}));
    file.clear();
    counters = countersOf(file);
    counters[WriteMs] = 0;
    EXPECT_EQ(counters, Counters{});
}

TEST(TagFileTree, RemovingTheLastImageEmptiesIt)
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
    EXPECT_TRUE(file.isEmpty());
    EXPECT_TRUE(file.studyInstanceUID().isEmpty());
    EXPECT_EQ(file.study(), nullptr);
    EXPECT_EQ(countersOf(file), Counters{});
    EXPECT_NE(add(file, anImage("1").inStudy("another")), nullptr);
}

TEST(TagFileTree, RemovingASeriesTakesItsImagesOutOfTheIndex)
{
    TagFile file;
    add(file, anImage("1"));
    add(file, anImage("2"));
    add(file, anImage("3").inSeries("1.2.4"));
    const std::string third = shownText(*file.findImage("3"));
    const char* uids[] = {"1.2.3", "unknown", "1.2.3", "1.2.4"};
    EXPECT_EQ(file.removeSeries(3, uids), 1);
    EXPECT_EQ(file.imagesByUID().keys(), Uids{"3"});
    EXPECT_EQ(shownText(*file.findImage("3")), third);
    EXPECT_EQ(file.removeSeries(1, uids + 3), 1);
    EXPECT_TRUE(file.isEmpty());
    EXPECT_TRUE(file.imagesByUID().isEmpty());
}

TEST(TagFileTree, ASuffixPassesOverImagesThatHaveAnother)
{
    TagFile file;
    add(file, anImage("1"), "/store/1_a.dcm");
    add(file, anImage("2"));
    EXPECT_EQ(file.findImage("1", ""), file.findImage("1"));
    EXPECT_EQ(file.findImage("1", "a"), file.findImage("1"));
    EXPECT_EQ(file.findImage("1", "ab"), nullptr);
    EXPECT_EQ(file.findImage("2", "a"), file.findImage("2"));
    EXPECT_EQ(file.findImage("3", "a"), nullptr);
}

TEST(TagFileTree, TheMetaFolderEndsInASlash)
{
    const LogCapture log;
    const char* const rows[][2] = {
        {"", "./"}, {"C:\\data", "C:/data/"}, {"/meta/", "/meta/"}, {"meta", "meta/"}};
    for (const auto& row : rows) {
        TagFile::setMetaFolder(row[0]);
        EXPECT_STREQ(TagFile::metaFolder(), row[1]);
    }
    EXPECT_EQ(log.count("Meta folder set to C:/data/"), 1);
}

TEST(TagFileTree, ATakenImageShowsAllThatItShowedAndLeavesItsSeries)
{
    TagFile file;
    add(file, anImage("1").withItem(DCM_RequestAttributesSequence, anItem().with(DCM_CodeValue, "c")));
    const DatasetBuilder second =
        anImage("2").withItem(DCM_RequestAttributesSequence, anItem().with(DCM_CodeValue, "d"));
    add(file, second);
    const std::unique_ptr<TagMap> taken(file.takeImage("2"));
    ASSERT_NE(taken, nullptr);
    EXPECT_EQ(shownText(*taken), shownAlone(second));
    EXPECT_EQ(file.takeImage("2"), nullptr);
    const std::unique_ptr<TagMap> last(file.takeImage("1"));
    EXPECT_NE(file.findSeries("1.2.3"), nullptr);
    EXPECT_TRUE(file.imagesByUID().isEmpty());
    file.deleteEmptyNodes();
    EXPECT_TRUE(file.isEmpty());
    EXPECT_EQ(file.findSeries("1.2.3"), nullptr);
    EXPECT_EQ(shownText(*taken), shownAlone(second)) << "also without its tree";
}

TEST(TagFileTree, OnlyAFilePathOfItsOwnKeepsAnImage)
{
    TagFile file;
    for (const char* uid : {"1", "2", "3"})
        add(file, anImage(uid));
    file.findSeries("1.2.3")->putAndInsertValue(kFilePath, VrCode::LO, "/of/the/series");
    file.findImage("2")->putAndInsertValue(kFilePath, VrCode::LO, "/of/the/image");
    file.removeImagesWithoutFilename(file.findSeries("1.2.3"));
    EXPECT_EQ(file.imagesByUID().keys(), Uids{"2"});
    EXPECT_EQ(file.findSeries("1.2.3")->children(), QList<TagMap*>{file.findImage("2")});
}

TEST(TagFileTree, AFileThatCannotBeLoadedIsLogged)
{
    const LogCapture log;
    TagFile file;
    EXPECT_EQ(file.addDicomFile("/no/such/file", nullptr, false), nullptr);
    EXPECT_EQ(log.count("Could not load /no/such/file: "), 1);
    EXPECT_TRUE(file.isEmpty());
}

DatasetBuilder anImageWithoutUid(const char* comment)
{
    return anImage().without(DCM_SOPInstanceUID).with(DCM_ImageComments, comment);
}

TEST(TagFileTree, AnImageWithoutSopInstanceUidIsKnownByItsPathForGood)
{
    const TemporaryStore store;
    TagFile first;
    add(first, anImageWithoutUid("a"), "/a.dcm");
    add(first, anImageWithoutUid("b"), "/b.dcm");
    EXPECT_EQ(first.imagesByUID().keys(), (Uids{"/a.dcm", "/b.dcm"}));
    ASSERT_TRUE(first.mergeIntoCacheFile());
    TagFile second;
    add(second, anImageWithoutUid("b again"), "/b.dcm");
    add(second, anImageWithoutUid("c"), "/c.dcm");
    ASSERT_TRUE(second.mergeIntoCacheFile());
    TagFile read;
    ASSERT_TRUE(read.readCacheFileForStudy("1.2", false));
    EXPECT_EQ(read.imagesByUID().keys(), (Uids{"/a.dcm", "/b.dcm", "/c.dcm"}));
    EXPECT_EQ(imagesText(read), imagesText(second));
}

TEST(TagFileTree, AnImageWithoutSopInstanceUidLeavesNoTraceWhenItGoes)
{
    TagFile file;
    add(file, anImageWithoutUid("a"), "/a.dcm");
    const char* seriesUID = "1.2.3";
    EXPECT_EQ(file.removeSeries(1, &seriesUID), 1);
    EXPECT_TRUE(file.imagesByUID().isEmpty());
}

/// A volume of the images that a builder of volumes has found.
class BuiltVolume : public Volume
{
public:
    explicit BuiltVolume(const QVector<TagMap*>& images)
    {
        setImages(images, nullptr);
        setMultiFrameInfo({});
    }
};

TEST(TagFileTree, VolumesForgetTheImagesThatGo)
{
    TagFile file;
    for (const char* uid : {"1", "2", "3", "4"})
        add(file, anImage(uid));
    auto* volume = new Volume(BuiltVolume(file.imagesByUID().values().toVector()));
    file.findSeries("1.2.3")->addBareVolume(volume);
    const char* uid = "1";
    EXPECT_EQ(file.removeImages(1, &uid), 1);
    delete file.takeImage("2");
    file.addTagMap(anImage("3").map(), nullptr, true);
    ASSERT_EQ(volume->numImages(), 1);
    EXPECT_EQ(volume->image(0), file.findImage("4"));
}

}  // namespace
