#include "kddlib/Loader.h"

#include "kddlib/items/kdditem.h"
#include "kddlib/tagfile/TagFile.h"
#include "kddlib/tagmodel/OwnAttributes.h"
#include "kddlib/tagmodel/TagElement.h"
#include "kddlib/tagmodel/TagMap.h"
#include "kddlib/volumes/Volume.h"
#include "platform/os/ExclusiveFile.h"
#include "support/DatasetBuilder.h"
#include "support/LogCapture.h"
#include "support/TemporaryStore.h"

#include <QDir>
#include <QFile>
#include <QFileInfo>

#include <gtest/gtest.h>

namespace Kdd
{
namespace
{

/// A study "1.2" whose images lie where a server keeps them, in a folder of its own.
class LoaderTest : public testing::Test
{
protected:
    LoaderTest()
    {
        QDir().mkpath(mStore.filePath("1.2"));
        qputenv("KDD_READ_PATIENCE", "0");
    }
    ~LoaderTest() override { qunsetenv("KDD_READ_PATIENCE"); }

    QByteArray path(const char* name) const { return mStore.filePath("1.2").toLocal8Bit() + '/' + name; }

    /// The image's file, as `path` names it, and the image in the tag file with another patient's name.
    void add(const char* sopUID, const char* name)
    {
        save(anImage(sopUID).with(DCM_PatientName, "of^file"), name);
        file->addTagMap(anImage(sopUID).with(DCM_PatientName, "of^cache").map(), path(name).constData(),
                        true);
    }

    void save(const DatasetBuilder& image, const char* name) const
    {
        image.save(QFile::decodeName(path(name)));
    }

    int sizeOf(const char* name) const
    {
        return static_cast<int>(QFile(QString::fromLocal8Bit(path(name))).size());
    }

    std::shared_ptr<Item> load(const char* name) { return loader.loadMetaData(path(name).constData()); }

    static std::string nameIn(const std::shared_ptr<Item>& item)
    {
        OFString name;
        return item != nullptr && item->findAndGetOFString(DCM_PatientName, name).good() ? name.c_str()
                                                                                         : "nothing";
    }

    TemporaryStore mStore;
    std::shared_ptr<TagFile> file = std::make_shared<TagFile>();
    Loader loader;
};

TEST_F(LoaderTest, TheTagFileAnswersAndTheFileIsReadForAllElse)
{
    add("1", "1_0.dcm");
    ASSERT_TRUE(file->writeCacheFile());
    save(anImage("2").with(DCM_PatientName, "of^file"), "2_0.dcm");
    const std::shared_ptr<Item> cached = load("1_0.dcm");
    EXPECT_EQ(nameIn(cached), "of^cache");
    EXPECT_EQ(nameIn(load("1_7.dcm")), "nothing") << "another file of the image";
    EXPECT_EQ(nameIn(load("2_0.dcm")), "of^file");
    loader.clear();
    ASSERT_NE(cached->obtainDcmDataset(), nullptr) << "the item outlives what the loader kept";
    OFString name;
    cached->obtainDcmDataset()->findAndGetOFString(DCM_PatientName, name);
    EXPECT_EQ(name, "of^file");
}

TEST_F(LoaderTest, AnImageLiesWhereItWasLastAskedFor)
{
    add("1", "1_0.dcm");
    loader.addTagFile("1.2", file);
    TagMap* const image = file->findImage("1");
    image->putAndInsertValue(kFilePath, VrCode::UT, "/a/1.2/1_0.dcm");
    for (const char* asked : {"/a/1.2/1_0.dcm", "/b/1.2/1_0.dcm", "/b/1.2/1_.dcm", "/b/1.2/1_0.dcm"}) {
        EXPECT_EQ(nameIn(loader.loadMetaData(asked)), "of^cache");
        EXPECT_EQ(filePathOf(*image), asked);
        EXPECT_EQ(image->findElement(kFilePath)->vr(), VrCode::LO);
    }
}

TEST_F(LoaderTest, AMissingTagFileIsLookedForOnce)
{
    save(anImage("1"), "1_0.dcm");
    const LogCapture log;
    for (int i = 0; i < 3; ++i)
        EXPECT_NE(load("1_0.dcm"), nullptr);
    EXPECT_EQ(log.count("No tag file found for study 1.2"), 1);
    loader.clear();
    load("1_0.dcm");
    EXPECT_EQ(log.count("No tag file found for study 1.2"), 2);
}

TEST_F(LoaderTest, ATagFileThatIsBeingMadeOrHeldIsNotTakenForAbsent)
{
    add("1", "1_0.dcm");
    const QString name = TagFile::cacheFilePathForStudy("1.2");
    QDir().mkpath(QFileInfo(name).path());
    ASSERT_TRUE(QFile(name).open(QIODevice::WriteOnly));
    EXPECT_EQ(nameIn(load("1_0.dcm")), "of^file");
    ASSERT_TRUE(file->writeCacheFile());
    QFile held;
    ASSERT_TRUE(openLockedFile(held, name, FileLock::Exclusive, IfAbsent::Fail, {1, 0}));
    const LogCapture log;
    EXPECT_EQ(nameIn(load("1_0.dcm")), "of^file");
    EXPECT_EQ(log.count("held by others"), 1);
    held.close();
    EXPECT_EQ(nameIn(load("1_0.dcm")), "of^cache");
}

TEST_F(LoaderTest, TheLastVersionAnswersUntilThereIsANewOne)
{
    add("1", "1_0.dcm");
    ASSERT_TRUE(file->writeCacheFile());
    ASSERT_EQ(nameIn(load("1_0.dcm")), "of^cache");
    file->findImage("1")->putAndInsertString(DCM_PatientName, "of^next");
    ASSERT_TRUE(file->writeCacheFile());
    QFile held;
    ASSERT_TRUE(openLockedFile(held, file->cacheFilePath(), FileLock::Exclusive, IfAbsent::Fail, {1, 0}));
    EXPECT_FALSE(loader.refresh("1.2"));
    EXPECT_EQ(nameIn(load("1_0.dcm")), "of^cache");
    held.close();
    EXPECT_TRUE(loader.refresh("1.2"));
    EXPECT_EQ(nameIn(load("1_0.dcm")), "of^next");
    QFile::remove(file->cacheFilePath());
    EXPECT_TRUE(loader.refresh("1.2"));
    EXPECT_EQ(nameIn(load("1_0.dcm")), "of^file") << "the study is gone";
}

TEST_F(LoaderTest, TheBeginningOfAFileIsRead)
{
    save(anImage("1").with(DCM_PatientName, "of^file").withLong(DCM_TextValue, 2000), "1");
    const int size = sizeOf("1");
    const LogCapture log;
    EXPECT_EQ(nameIn(loader.loadDcmDataset(path("1").constData(), size)), "of^file");
    EXPECT_EQ(loader.loadDcmDataset(path("1").constData(), size + 1), nullptr);
    EXPECT_EQ(log.count(path("1").toStdString() + ": Could only read " + std::to_string(size) + " of " +
                        std::to_string(size + 1) + " bytes"),
              1);
    EXPECT_EQ(loader.loadDcmDataset(path("gone").constData(), 10), nullptr);
    EXPECT_EQ(log.count("Could not open " + path("gone").toStdString()), 1);
    for (int cut = 0; cut < size; cut += 97)
        loader.loadDcmDataset(path("1").constData(), cut);
}

TEST_F(LoaderTest, ABeginningThatNestsTooDeepIsRefused)
{
    DatasetBuilder image = anImage("1");
    DatasetBuilder item = anItem();
    for (int depth = 0; depth < 300; ++depth)
        item = anItem().withItem(DCM_ContentSequence, item);
    save(image.withItem(DCM_ContentSequence, item), "deep");
    const LogCapture log;
    EXPECT_EQ(loader.loadDcmDataset(path("deep").constData(), sizeOf("deep")), nullptr);
    EXPECT_EQ(log.count("nested too deep"), 1);
}

TEST_F(LoaderTest, VolumesAreFoundByTheNamesOfTheirFiles)
{
    const std::tuple<const char*, int, const char*> cases[] = {
        {"/a_part7/1.2.3-volume.vol", 0, "-"},
        {"1.2.3-volume_part002.vol", 1, "-"},
        {"vol_part0.dcm", -1, "Illegal volume index. Cannot load volume from tag file."},
        {"1-volume_part004.vol", -1, "Filename suffix does not match."},
        {"1-volume_part003.vol", -1, "No filename suffix. Cannot load volume from tag file."},
        {"1-other.vol", -1, "Filename suffix does not match."},
        {"1-volume_part005.vol", 3, "-"},
        {"1-volume_part008.vol", -1, "Illegal volume index."},
    };
    add("1", "1_0.dcm");
    TagMap* series = file->findSeries("1.2.3");
    for (const char* suffix : {"volume", "volume_2", "", "volume_5"}) {
        series->addBareVolume(new Volume(series->volumes().size()));
        series->volumes().last()->setFileNameSuffix(suffix);
    }
    loader.addTagFile("1.2", file);
    for (const auto& [name, index, message] : cases) {
        const LogCapture log;
        EXPECT_EQ(loader.loadVolume(name, "1.2.3", "1.2"), index < 0 ? nullptr : series->volumes().at(index));
        EXPECT_EQ(log.count(message), index < 0 ? 1 : 0) << name;
        EXPECT_EQ(loader.loadVolume(name, "9", "1.2"), nullptr);
        EXPECT_EQ(loader.loadVolume(name, "1.2.3", ""), nullptr);
    }
}

TEST_F(LoaderTest, AVolumeOutlivesItsTagFileUntilTheLoaderIsCleared)
{
    add("1", "1_0.dcm");
    TagMap* series = file->findSeries("1.2.3");
    series->addBareVolume(new Volume(0));
    series->volumes().last()->setFileNameSuffix("volume");
    loader.addTagFile("1.2", file);
    const Volume* volume = loader.loadVolume("1-volume.vol", "1.2.3", "1.2");
    ASSERT_NE(volume, nullptr);
    const std::weak_ptr<TagMap> study = file->study();
    file->clear();
    file.reset();
    loader.addTagFile("1.2", std::make_shared<TagFile>());
    ASSERT_FALSE(study.expired());
    EXPECT_EQ(volume->fileNameSuffix(), "volume");
    loader.clear();
    EXPECT_TRUE(study.expired());
}

}  // namespace
}  // namespace Kdd
