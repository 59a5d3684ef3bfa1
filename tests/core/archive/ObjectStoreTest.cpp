#include "kddlib/archive/ObjectStore.h"

#include "kddlib/archive/ArchiveDatabase.h"
#include "kddlib/archive/ArrivedStudies.h"
#include "kddlib/tagfile/TagFile.h"
#include "platform/database/Kxg.h"
#include "support/DatasetBuilder.h"
#include "support/FileContent.h"
#include "support/LogCapture.h"
#include "support/Process.h"
#include "support/TemporaryStore.h"
#include "support/Threads.h"

#include <QDir>

#include <gtest/gtest.h>
#include <libdeflate.h>

using namespace Kdd;

namespace
{

class ObjectStoreTest : public testing::Test
{
protected:
    ObjectStoreTest()
    {
        Kxg::SetDatabaseServer(mAddress);
        mRules.folder = mFolder.filePath("objects").toUtf8();
        mRules.freeBytes = 0;
    }

    std::unique_ptr<ObjectStore> open(ArrivedStudies& studies) const
    {
        Result result;
        auto store = ObjectStore::open(mRules, studies, result);
        EXPECT_TRUE(result.good()) << result.text().toStdString();
        return store;
    }

    static ArrivedObject store(ObjectStore& store, Kxg::Catalogue& catalogue, const DatasetBuilder& image)
    {
        std::vector<std::unique_ptr<ObjectArrival>> arrivals;
        arrivals.push_back(store.begin());
        const QByteArray bytes = image.file();
        arrivals[0]->take(bytes.constData(), bytes.size());
        arrivals[0]->end();
        return store.commit(arrivals, catalogue).at(0);
    }

    QStringList namesBelow(const char* folder) const
    {
        return filesBelow(mFolder.filePath(folder))
            .replaceInStrings(mFolder.filePath(folder) + QLatin1Char('/'), QString());
    }

    std::string waiting() const
    {
        QVector<QByteArray> studies;
        EXPECT_TRUE(openCatalogue()->waitingStudies(mRules.folder, studies).good());
        return studies.toList().join(' ').toStdString();
    }

    /// Of the study "1.2", as its tag file has them.
    static QList<QByteArray> images()
    {
        TagFile file;
        EXPECT_TRUE(file.readCacheFileForStudy("1.2", false));
        return file.imagesByUID().keys();
    }

    LogCapture mLog;
    TemporaryStore mFolder;
    QByteArray mAddress = "sqlite:" + mFolder.filePath("kdd.sqlite").toUtf8();
    ObjectRules mRules;
};

TEST_F(ObjectStoreTest, TakesInOrRemovesWhatAServerLeftThatDied)
{
    // One is half received, one is registered.
    EXPECT_EQ(inChild([&] {
                  ArrivedStudies studies;
                  const auto objects = open(studies);
                  const auto half = objects->begin();
                  half->take("half", 4);
                  const auto database = openCatalogue();
                  store(*objects, *database, anImage("1.2.3.1"));
                  ::raise(SIGKILL);
                  return false;
              }),
              -SIGKILL);
    const QString staging = namesBelow("objects/.incoming").filter(QStringLiteral("/life")).value(0).left(32);
    const QString left = mFolder.filePath("objects/.incoming/") + staging;
    const QString series = mFolder.filePath("objects/1.2/1.2.3/");
    // The others have a place, and were registered or not.
    int number = 70;
    const auto leave = [&](const char* image, const char* place, const QByteArray& bytes,
                           const QByteArray& whole) {
        const auto checksum = libdeflate_crc32(0, whole.constData(), static_cast<std::size_t>(whole.size()));
        const QString name = left + QStringLiteral("/%1=%2=1.2=1.2.3=%3")
                                        .arg(++number)
                                        .arg(checksum, 0, 16)
                                        .arg(QLatin1String(image));
        const QByteArray staged = name.toUtf8();
        const QByteArray placed = (series + QLatin1String(place)).toUtf8();
        if (!bytes.isNull())
            putFile(name, bytes);
        EXPECT_EQ(bytes.isNull() ? ::link(placed.constData(), staged.constData())
                                 : ::link(staged.constData(), placed.constData()),
                  0);
    };
    const QByteArray whole = anImage("1.2.3.2").file();
    leave("1.2.3.1", "1.2.3.1.dcm", {}, whole);
    leave("1.2.3.2", "1.2.3.2.dcm", whole, whole);
    // Something newer of its UID came while it lay there.
    const QByteArray older = anImage("1.2.3.1").with(DCM_PatientName, "Older").file();
    leave("1.2.3.1", "1.2.3.1_0002.dcm", older, older);
    // The power went before its bytes were on the disk: it has its length, and none of them, or not all.
    leave("1.2.3.3", "1.2.3.3.dcm", QByteArray(whole.size(), '\0'), whole);
    leave("1.2.3.4", "1.2.3.4.dcm", QByteArray(whole).replace(whole.size() - 8, 8, QByteArray(8, '\0')),
          whole);

    ArrivedStudies studies;
    const auto database = openCatalogue();
    const auto objects = open(studies);
    const auto arriving = objects->begin();
    ASSERT_TRUE(objects->recover(*database).good());
    EXPECT_FALSE(QDir(left).exists());
    EXPECT_EQ(namesBelow("objects/1.2").join(QLatin1Char(' ')).toStdString(),
              "1.2.3/1.2.3.1.dcm 1.2.3/1.2.3.2.dcm");
    Kxg::StudyContents contents;
    ASSERT_TRUE(database->studyContents("1.2", contents).good());
    EXPECT_EQ(contents.images.size(), 2U);
    EXPECT_TRUE(arriving->take("more", 4)) << "what still lives is left alone";
}

/// With a store that is open.
class StoredObjects : public ObjectStoreTest
{
protected:
    using ObjectStoreTest::store;
    ArrivedObject store(const char* uid) { return store(*objects, *database, anImage(uid)); }

    bool completes(ArrivedStudies& by, int patience = 0)
    {
        return by.complete("1.2", *database, patience).good();
    }

    const std::unique_ptr<Kxg::Catalogue> database = openCatalogue();
    ArrivedStudies studies{{std::chrono::milliseconds(0), std::chrono::milliseconds(0)}};
    const std::unique_ptr<ObjectStore> objects = open(studies);
};

TEST_F(StoredObjects, LeaveAStudyThatWaitsAndCompleteIt)
{
    for (const char* uid : {"1.2.3.1", "1.2.3.2"})
        EXPECT_EQ(store(uid).reason.toStdString(), "");
    EXPECT_EQ(waiting(), "1.2");
    QByteArray due;
    ASSERT_TRUE(studies.awaitDue(due));
    EXPECT_EQ(due, "1.2");
    ASSERT_TRUE(completes(studies));
    EXPECT_FALSE(studies.isWaiting("1.2"));
    EXPECT_EQ(waiting(), "");
    EXPECT_EQ(images(), (QList<QByteArray>{"1.2.3.1", "1.2.3.2"}));
    EXPECT_EQ(namesBelow("objects/1.2").join(QLatin1Char(' ')).toStdString(),
              "1.2.3/1.2.3.1.dcm 1.2.3/1.2.3.2.dcm");
}

TEST_F(StoredObjects, AreMergedWithoutTheirFilesBeingOpenedAgain)
{
    store("1.2.3.1");
    ASSERT_TRUE(completes(studies));
    store("1.2.3.2");
    store("1.2.3.3");
    // A build would miss them.
    QDir(mFolder.filePath("objects/1.2")).removeRecursively();
    ASSERT_TRUE(completes(studies));
    EXPECT_EQ(images().size(), 3);
}

TEST_F(StoredObjects, OfAnotherServerAreMergedAlongAndThatOneHasNothingLeft)
{
    ArrivedStudies other;
    const auto objectsOfOther = open(other);
    for (const char* uid : {"1.2.3.1", "1.2.3.2", "1.2.3.3"})
        store(uid);
    ASSERT_TRUE(completes(studies));
    // A build would not be whole any more.
    QFile::remove(mFolder.filePath("objects/1.2/1.2.3/1.2.3.1.dcm"));
    store("1.2.3.4");
    store(*objectsOfOther, *database, anImage("1.2.3.5"));
    EXPECT_TRUE(completes(studies));
    EXPECT_EQ(images().size(), 5);
    store("1.2.3.6");
    EXPECT_TRUE(completes(other));
    EXPECT_EQ(images().size(), 6);
    EXPECT_FALSE(other.isWaiting("1.2"));
    const QByteArray written = fileContent(TagFile::cacheFilePathForStudy("1.2"));
    EXPECT_TRUE(completes(studies));
    EXPECT_EQ(fileContent(TagFile::cacheFilePathForStudy("1.2")), written);
    EXPECT_EQ(waiting(), "");
}

TEST_F(StoredObjects, ThatTwoSendInOppositeOrderAreTakenOnce)
{
    onThreads(2, [&](int thread) {
        std::vector<std::unique_ptr<ObjectArrival>> arrivals;
        for (int i = 0; i < 40; ++i) {
            // Each twice, too.
            const int number = (thread == 1 ? 39 - i : i) / 2;
            const QByteArray bytes = anImage("1.2.3." + QByteArray::number(number)).file();
            arrivals.push_back(objects->begin());
            arrivals.back()->take(bytes.constData(), bytes.size());
        }
        for (const ArrivedObject& object : objects->commit(arrivals, *openCatalogue()))
            EXPECT_TRUE(object.isStored()) << object.reason.toStdString();
    });
    EXPECT_EQ(namesBelow("objects/1.2").size(), 20);
}

TEST_F(StoredObjects, AreLeftAloneWhileAnotherProcessCompletesThem)
{
    store("1.2.3.1");
    {
        const auto other = openCatalogue();
        std::unique_ptr<Kxg::StudyClaim> claim;
        ASSERT_TRUE(other->claim("1.2", 0, claim).good());
        // However long it takes.
        for (int i = 0; i < 10; ++i)
            EXPECT_FALSE(completes(studies, 1));
        EXPECT_TRUE(studies.isWaiting("1.2") && studies.waiting().isEmpty());
    }
    EXPECT_TRUE(completes(studies));
    EXPECT_FALSE(studies.isWaiting("1.2"));
}

TEST_F(StoredObjects, ThatCannotBeReadAnyMoreAreReplaced)
{
    store("1.2.3.1");
    putFile(mFolder.filePath("objects/1.2/1.2.3/1.2.3.1.dcm"), "spoilt");
    EXPECT_TRUE(store("1.2.3.1").isStored());
    QVector<Kxg::KeptFile> files;
    ASSERT_TRUE(database->imageFiles("1.2", "1.2.3.1", files).good());
    EXPECT_TRUE(files.value(0).path.endsWith("/1.2.3.1_0002.dcm") && files.value(0).isShown);
}

}  // namespace
