#include "kddlib/net/KxCurlClient.h"
#include "kddlib/net/http/KxHttpStatus.h"
#include "kddlib/net/http/TlsLocks.h"
#include "support/HttpServer.h"
#include "support/LogCapture.h"
#include "support/Setting.h"
#include "support/Threads.h"

#include <gtest/gtest.h>

using namespace Kdd;

namespace
{

class Verification : public testing::Test
{
protected:
    bool reads(const std::string& url)
    {
        KxHttpStatus status;
        return KxCurlClient::instance().readBytes(url, status) == "ok" && status.ok();
    }

    NginxServer server{NginxServer::Scheme::Https, "location / { return 200 ok; }"};
};

TEST_F(Verification, IsOffUntilTheSiteAsksForItAndThenHoldsForOpenConnectionsToo)
{
    const LogCapture log;
    std::string byAddress = server.url("");
    byAddress.replace(byAddress.find("localhost"), 9, "127.0.0.1");
    EXPECT_TRUE(reads(server.url("")));
    EXPECT_TRUE(reads(byAddress));
    const Setting verification("KDD_TLS_VERIFY", "1");
    EXPECT_FALSE(reads(server.url("")));
    Setting authority("KDD_TLS_CA_FILE", server.certificateFile().constData());
    EXPECT_TRUE(reads(server.url("")));
    EXPECT_FALSE(reads(byAddress));  // a certificate for another name
    authority.set("/absent.pem");
    EXPECT_FALSE(reads(server.url("")));
    EXPECT_EQ(log.count("certificate"), 3);
}

struct OldLibrary : CryptoLibrary
{
    explicit OldLibrary(const char* text)
        : version(text)
    {
    }
    std::string versionText() const override { return version; }
    bool hasLockingCallback() const override { return callback != nullptr; }
    int lockCount() const override { return 2; }
    void setLockingCallback(LockingCallback lock) override { callback = lock; }

    const char* version;
    LockingCallback callback = nullptr;
};

TEST(TlsLocks, AreInstalledInLibrariesThatDoNotLockThemselvesAndKeepThreadsApart)
{
    const LogCapture log;
    OldLibrary modern("OpenSSL 3.0.19");
    installTlsLocks("", modern);
    EXPECT_FALSE(modern.hasLockingCallback());
    OldLibrary library("OpenSSL 1.0.2k");
    installTlsLocks("OpenSSL/1.0.2k", library);
    installTlsLocks("OpenSSL/1.0.2k", library);
    EXPECT_EQ(log.count("callbacks already installed"), 1);
    int count = 0;
    onThreads(2, [&](int) {
        for (int i = 0; i < 2000; ++i) {
            library.callback(1 | 8, 1, nullptr, 0);
            const int before = count;
            std::this_thread::yield();
            count = before + 1;
            library.callback(2 | 8, 1, nullptr, 0);
        }
    });
    EXPECT_EQ(count, 4000);
}

}  // namespace
