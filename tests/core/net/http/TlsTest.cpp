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

TEST(Tls, WithoutACommonCipherNamesTheCure)
{
    const LogCapture log;
    const NginxServer server(NginxServer::Scheme::Https,
                             "ssl_protocols TLSv1.2; ssl_ciphers ECDHE-ECDSA-AES256-GCM-SHA384;");
    KxHttpStatus status;
    KxCurlClient::instance().readBytes(server.url(""), status);
    EXPECT_TRUE(status.failed);
    EXPECT_EQ(log.count("SSL_CIPHER_LIST"), 1);
}

struct OldLibrary : CryptoLibrary
{
    std::string versionText() const override { return version; }
    bool hasLockingCallback() const override { return callback != nullptr; }
    int lockCount() const override { return 2; }
    void setLockingCallback(LockingCallback lock) override { callback = lock; }

    std::string version = "OpenSSL 1.0.2k";
    LockingCallback callback = nullptr;
};

TEST(TlsLocks, AreInstalledOnceInLibrariesThatDoNotLockThemselves)
{
    struct
    {
        const char* curl;
        const char* library;
        bool installs;
        int mismatches;
    } const kCases[] = {{"OpenSSL/1.1.1n", "OpenSSL 1.1.1n", false, 0},
                        {"", "OpenSSL 3.0.19", false, 0},
                        {"OpenSSL/1.0.2k", "OpenSSL 1.0.2k  26 Jan 2017", true, 0},
                        {"OpenSSL/1.0.2k", "OpenSSL 1.0.1g  7 Apr 2014", true, 1},
                        {"LibreSSL/2.8.3", "LibreSSL 2.6.5", true, 0}};
    for (const auto& [curl, text, installs, mismatches] : kCases) {
        const LogCapture log;
        OldLibrary library;
        library.version = text;
        installTlsLocks(curl, library);
        EXPECT_EQ(library.callback != nullptr, installs) << curl;
        EXPECT_EQ(log.count("does not need them"), installs ? 0 : 1);
        EXPECT_EQ(log.count("Mismatched versions of OpenSSL"), mismatches) << text;
        if (installs)
            installTlsLocks(curl, library);
        EXPECT_EQ(log.count("callbacks already installed"), installs ? 1 : 0);
    }
}

TEST(TlsLocks, KeepThreadsApart)
{
    const LogCapture log;
    OldLibrary library;
    installTlsLocks("OpenSSL/1.0.2k", library);
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
