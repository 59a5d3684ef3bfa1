#include "platform/base/CreateUIDs.h"
#include "platform/resources/ExResource.h"

#include <QFile>
#include <QTemporaryDir>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <algorithm>
#include <cstdlib>
#include <iostream>
#include <thread>
#include <vector>

using namespace Kdd;

namespace
{

/// In a process of its own, which has not read its settings yet.
[[noreturn]] void showSettings(const char* fileContent)
{
    QTemporaryDir folder;
    QFile file(folder.filePath(QStringLiteral("site.ini")));
    if (file.open(QIODevice::WriteOnly))
        file.write(fileContent);
    file.close();
    qputenv("KDD_CONFIG", file.fileName().toLocal8Bit());
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
    std::vector<std::vector<QByteArray>> uids(4, std::vector<QByteArray>(500));
    std::vector<std::thread> threads;
    threads.reserve(uids.size());
    for (auto& part : uids)
        threads.emplace_back([&part] {
            std::generate(part.begin(), part.end(),
                          [] { return CreateUIDs::createUID(CreateUIDs::Instance); });
        });
    std::vector<QByteArray> all;
    for (size_t i = 0; i < uids.size(); ++i) {
        threads[i].join();
        all.insert(all.end(), uids[i].begin(), uids[i].end());
    }
    std::sort(all.begin(), all.end());
    EXPECT_EQ(std::unique(all.begin(), all.end()), all.end());
    for (const QByteArray& uid : all)
        EXPECT_THAT(uid.toStdString(), testing::MatchesRegex("2\\.25\\.[1-9][0-9]{30,38}"));
}

}  // namespace
