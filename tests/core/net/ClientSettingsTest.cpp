#include "kddlib/net/ClientSettings.h"

#include "support/Setting.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

using namespace Kdd;
using testing::ElementsAre;

namespace
{

TEST(ClientSettings, SendTheSessionEverywhereButToTheCloud)
{
    ClientSettings settings;
    const auto urlOf = [&](const char* address) {
        return prepareRequest(address, {}, RequestBody::None, settings).url;
    };
    EXPECT_EQ(urlOf("https://a/b"), "https://a/b");
    settings.sessionId = "7&";
    EXPECT_EQ(urlOf("https://a/b"), "https://a/b?s=7&");
    EXPECT_EQ(urlOf("https://a/b?c"), "https://a/b?c&s=7&");
    EXPECT_EQ(urlOf("https://a/b#c?d"), "https://a/b?s=7&#c?d");
    EXPECT_EQ(urlOf("gs://a/b"), "https://storage-download.googleapis.com/a/b");
}

TEST(ClientSettings, SendTheSessionOnlyToHostsThatMayKnowIt)
{
    ClientSettings settings;
    settings.sessionId = "7";
    const Setting hosts("KDD_SESSION_HOSTS", "Pacs, viewer:8443 [::1]");
    for (const char* known :
         {"https://pacs/b", "http://PACS:90/b", "https://viewer:8443/b", "http://[::1]:9/b"})
        EXPECT_EQ(prepareRequest(known, {}, RequestBody::None, settings).url, std::string(known) + "?s=7");
    for (const char* other : {"https://viewer/b", "https://a/b", "https://pacs@a/b", "https://pacs.a/b"})
        EXPECT_EQ(prepareRequest(other, {}, RequestBody::None, settings).url, other);
}

TEST(ClientSettings, SendTheHeadersOfTheCloudOnlyWithAuthorization)
{
    ClientSettings settings;
    EXPECT_THAT(prepareRequest("gs:a/b", {"X: 1"}, RequestBody::None, settings).headers, ElementsAre("X: 1"));
    settings.authorization = [] { return "Authorization: Bearer t"; };
    const PreparedRequest post = prepareRequest("gs:a/b", {"X: 1"}, RequestBody::Sent, settings);
    EXPECT_EQ(post.url, "https://storage-upload.googleapis.com/a/b");
    EXPECT_THAT(post.headers, ElementsAre("X: 1", "Expect: ", "Authorization: Bearer t",
                                          "Host: storage.googleapis.com", "Cache-Control: no-transform"));
}

}  // namespace
