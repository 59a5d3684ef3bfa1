#include "CatalogueFixture.h"
#include "kddlib/capi/kddtagfile.h"
#include "platform/filecache/ExFileCache.h"
#include "platform/os/ExclusiveFile.h"
#include "support/LogCapture.h"
#include "support/Setting.h"

namespace Kdd
{
namespace
{

const char* const kJob = "<Job><Timestamp>20240131120000</Timestamp><Login>anna</Login><Substitutions>"
                         "<Tag Group=\"0010\" Element=\"0010\"><Value>Doe^Jane</Value></Tag>"
                         "</Substitutions></Job>";
const wchar_t* const kWideJob =
    L"<Job><Substitutions><Tag Group=\"0008\" Element=\"103E\"><Value>caf\u00e9</Value>"
    L"</Tag></Substitutions></Job>";

/// A study of two images, and a file cache with three entries.
class UpdateTagFileTest : public CatalogueFixture
{
protected:
    UpdateTagFileTest()
    {
        writeStudy("1.2", {"1", "2"});
        EXPECT_TRUE(cache.init().good());
        for (const char* name : {"1.2/Level0", "1.2/Level1", "other/Level1"})
            EXPECT_TRUE(cache.storeBuffer(name, "x").good());
    }

    static QByteArray textOf(const char* image, const DcmTagKey& key) { return value("1.2", image, key); }

    bool isCached(const char* name) const
    {
        QByteArray bytes;
        return cache.readBuffer(name, bytes);
    }

    const Setting folder{"KDD_FILE_CACHE", mStore.filePath("cache").toStdString()};
    ExFileCache cache;
    const char* images[2] = {"1", "unknown"};
    const char* entries[2] = {"1.2/Level0", "1.2/Level1"};
    const wchar_t* wideImages[2] = {L"2", nullptr};
    const wchar_t* wideEntries[1] = {L"1.2/Level1"};
};

TEST_F(UpdateTagFileTest, CorrectsTheImagesNamedAndDropsWhatWasComputedFromThem)
{
    ASSERT_TRUE(UpdateTagFile(kJob, "1.2", 2, images, entries));
    EXPECT_EQ(textOf("1", DCM_PatientName), "Doe^Jane");
    EXPECT_NE(textOf("2", DCM_PatientName), "Doe^Jane");
    EXPECT_TRUE(isCached("1.2/Level0") && isCached("other/Level1"));
    EXPECT_FALSE(isCached("1.2/Level1"));
    EXPECT_TRUE(UpdateTagFile(kJob, "1.2", 2, images, nullptr)) << "without cache entries";
}

TEST_F(UpdateTagFileTest, TakesWideTextsWhateverEncodingTheyDeclare)
{
    for (const std::wstring declared :
         {L"", L"<?xml version='1.0' encoding='ISO-8859-1'?>", L"<?xml version='1.0' encoding='utf-16'?>",
          L"\ufeff<?xml version='1.0'?>"}) {
        writeStudy("1.2", {"1", "2"});
        EXPECT_TRUE(UpdateTagFileW((declared + kWideJob).c_str(), L"1.2", 1, wideImages, wideEntries));
        EXPECT_EQ(textOf("2", DCM_SeriesDescription), "caf\xe9");
    }
    EXPECT_FALSE(isCached("1.2/Level1"));
    const LogCapture log;
    EXPECT_FALSE(UpdateTagFileW(L"<Login>\xd800</Login>", L"1.2", 1, wideImages, nullptr));
    EXPECT_EQ(log.count("half a character"), 1);
}

TEST_F(UpdateTagFileTest, SaysInALineWhatWentWrong)
{
    QFile held;
    ASSERT_TRUE(openLockedFile(held, TagFile::cacheFilePathForStudy("1.2"), FileLock::Exclusive,
                               IfAbsent::Fail, {1, 0}));
    const LogCapture log;
    EXPECT_FALSE(UpdateTagFile("<Job>", "1.2", 2, images, entries));
    EXPECT_EQ(log.count("Error reading UPQ job XML: "), 1);
    EXPECT_FALSE(UpdateTagFile(kJob, "1.2", 2, images, entries));
    EXPECT_EQ(log.count("Error updating tag file: "), 1);
    EXPECT_TRUE(isCached("1.2/Level1"));
}

TEST_F(UpdateTagFileTest, RefusesNullsAndNegativeCountsWithALineEach)
{
    entries[1] = nullptr;
    const LogCapture log;
    EXPECT_FALSE(UpdateTagFile(kJob, "1.2", 2, images, entries));
    EXPECT_FALSE(UpdateTagFileW(nullptr, L"1.2", 2, wideImages, nullptr));
    EXPECT_FALSE(UpdateTagFileW(kWideJob, nullptr, 2, wideImages, nullptr));
    EXPECT_FALSE(UpdateTagFileW(kWideJob, L"1.2", -1, wideImages, nullptr));
    EXPECT_FALSE(UpdateTagFileW(kWideJob, L"1.2", 2, nullptr, nullptr));
    EXPECT_FALSE(UpdateTagFileW(kWideJob, L"1.2", 2, wideImages, nullptr));
    EXPECT_EQ(log.count(" must not be "), 6);
}

}  // namespace
}  // namespace Kdd
