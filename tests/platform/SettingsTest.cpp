#include "platform/base/CreateUIDs.h"
#include "platform/resources/ExResource.h"
#include "support/FileContent.h"
#include "support/Threads.h"

#include <gmock/gmock.h>

#include <iostream>
#include <mutex>
#include <set>

using namespace Kdd;

namespace
{

/// In a process of its own, which has not read its settings yet.
[[noreturn]] void showSettings(const char* fileContent)
{
    QTemporaryDir folder;
    const QString path = folder.filePath(QStringLiteral("site.ini"));
    putFile(path, fileContent);
    qputenv("KDD_CONFIG", path.toLocal8Bit());
    qputenv("KDD_META_FOLDER", "/from/environment");
    qputenv("KDD_CLOUD_API", "");
    std::cerr << ExResource::metaFolder().constData() << ' ' << ExResource::databaseAddress().constData()
              << ' ' << ExResource::cloudDownloadEndpoint().constData() << ' '
              << ExResource::getWebServiceHostExternal().constData() << ' '
              << ExResource::cloudApiEndpoint().constData();
    folder.remove();
    std::exit(0);
}

TEST(Settings, ComeFromTheEnvironmentThenFromTheFileThenFromTheProgram)
{
    testing::GTEST_FLAG(death_test_style) = "threadsafe";
    EXPECT_EXIT(showSettings("[folders]\nmeta=/from/file\n[database]\naddress=postgresql://a,b/k\xc3\xbc\n"
                             "[cloud]\ndownload=http://[::1]:90\n"),
                testing::ExitedWithCode(0),
                "^/from/environment postgresql://a,b/k\xc3\xbc http://\\[::1\\]:90/ localhost "
                "https://storage.googleapis.com/$");
}

TEST(Settings, FileThatCannotBeReadIsWarnedAbout)
{
    testing::GTEST_FLAG(death_test_style) = "threadsafe";
    EXPECT_EXIT(showSettings("no settings\n"), testing::ExitedWithCode(0), "site.ini cannot be read");
}

TEST(CreateUIDs, AreDecimalShortAndNeverTheSameOnAnyThread)
{
    std::set<QByteArray> uids;
    std::mutex mutex;
    onThreads(4, [&](int) {
        for (int i = 0; i < 500; ++i) {
            const QByteArray uid = CreateUIDs::createUID(CreateUIDs::Instance);
            const std::lock_guard lock(mutex);
            uids.insert(uid);
        }
    });
    EXPECT_EQ(uids.size(), 2000U);
    for (const QByteArray& uid : uids)
        EXPECT_THAT(uid.toStdString(), testing::MatchesRegex("2\\.25\\.[1-9][0-9]{30,38}"));
}

}  // namespace
