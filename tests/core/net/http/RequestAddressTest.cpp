#include "kddlib/net/http/RequestAddress.h"

#include "kddlib/net/ClientSettings.h"
#include "kddlib/net/KxCurlClient.h"
#include "kddlib/net/cloud/CloudAddress.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

using namespace Kdd;
using testing::ElementsAre;

namespace
{

TEST(RequestAddress, IsToldFromAFileNameByItsFirstLetters)
{
    EXPECT_FALSE(KxCurlClient::isUrl(nullptr));
    EXPECT_FALSE(KxCurlClient::isUrl("h"));
    EXPECT_FALSE(KxCurlClient::isUrl("ftp://a"));
    EXPECT_TRUE(KxCurlClient::isUrl("gsx"));
    EXPECT_TRUE(KxCurlClient::isUrl("https://a"));
}

TEST(RequestAddress, OfTheWebServiceIsMadeOfHostAndPath)
{
    qputenv("KDD_WEB_HOST", "pacs:8443");
    EXPECT_EQ(KxCurlClient::url("GetStudy?x=1"), "https://pacs:8443/quil/Browser.svc/GetStudy?x=1");
    qunsetenv("KDD_WEB_HOST");
}

TEST(RequestAddress, OfTheCloudHasItsObjectEscaped)
{
    const std::pair<const char*, const char*> kCases[] = {
        {"gs://scans/2020/study1.dcm", "scans/2020%2Fstudy1.dcm"},
        {"gs:bucket", "bucket"},
        {"gs:///b/x/y", "b/x%2Fy"},
        {"gs:b/a//b ?", "b/a%2F/b%20?"},
        {"gs://b/scan#1.dcm", "b/scan%231.dcm"},
        {"gs://b/a\t/\x7f/\xc3\xbc", "b/a%09%2F%7F%2F%C3%BC"},
        {"gs://b/a%20b?generation=5#x", "b/a%20b?generation=5%23x"},
        {"gs://b#k/x", "b%23k/x"},
        {"gs:b/x/", "b/x%2F"},
        {"gs://", ""}};
    qputenv("KDD_CLOUD_API", "http://cloud:90");
    for (const auto& [address, path] : kCases)
        EXPECT_EQ(cloudUrl(address, CloudEndpoint::Api), std::string("http://cloud:90/") + path);
    EXPECT_EQ(cloudApiHost(), "cloud:90");
    qunsetenv("KDD_CLOUD_API");
}

TEST(RequestAddress, OfAnObjectThatIsWrittenOrDeletedIsItsNameAndNothingElse)
{
    for (const char* good : {"gs:b/o", "gs://b.c-d_e/x/y#1 \xc3\xbc.dcm", "gs://b/50%25", "gs://b/..a/.b"})
        EXPECT_TRUE(checkCloudObject(good).good()) << good;
    for (const char* bad :
         {"https://a/b", "gs://b", "gs://b/", "gs:", "gs://b/o?generation=5", "gs://b/50% off", "gs://b/o%2",
          "gs://b#c/o", "gs://b c/o", "gs://../o", "gs://b/..", "gs://b/.", "gs://b/%2e.", "gs://b/a//.."})
        EXPECT_TRUE(checkCloudObject(bad).bad()) << bad;
}

TEST(PreparedRequest, CarriesTheSessionEverywhereButToTheCloud)
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

TEST(PreparedRequest, CarriesTheSessionOnlyToHostsThatMayKnowIt)
{
    ClientSettings settings;
    settings.sessionId = "7";
    qputenv("KDD_SESSION_HOSTS", "Pacs, viewer:8443 [::1]");
    for (const char* known :
         {"https://pacs/b", "http://PACS:90/b", "https://viewer:8443/b", "http://[::1]:9/b"})
        EXPECT_EQ(prepareRequest(known, {}, RequestBody::None, settings).url, std::string(known) + "?s=7");
    for (const char* other : {"https://viewer/b", "https://a/b", "https://pacs@a/b", "https://pacs.a/b"})
        EXPECT_EQ(prepareRequest(other, {}, RequestBody::None, settings).url, other);
    qunsetenv("KDD_SESSION_HOSTS");
}

TEST(PreparedRequest, CarriesTheHeadersOfTheCloudOnlyWithAuthorization)
{
    ClientSettings settings;
    EXPECT_THAT(prepareRequest("gs:a/b", {"X: 1"}, RequestBody::None, settings).headers, ElementsAre("X: 1"));
    settings.authorization = [] { return "Authorization: Bearer t"; };
    const PreparedRequest post = prepareRequest("gs:a/b", {"X: 1"}, RequestBody::Sent, settings);
    EXPECT_EQ(post.url, "https://storage-upload.googleapis.com/a/b");
    EXPECT_THAT(post.headers, ElementsAre("X: 1", "Expect: ", "Authorization: Bearer t",
                                          "Host: storage.googleapis.com", "Cache-Control: no-transform"));
}

TEST(PreparedRequest, FirstRangeHasAtLeast1025Bytes)
{
    ClientSettings settings;
    settings.chunkSizeForPartialRequests = 100;
    EXPECT_FALSE(firstRange(settings));
    settings.numConcurrentRequestsPerFile = 2;
    EXPECT_EQ(firstRange(settings)->last, 1024);
    settings.chunkSizeForPartialRequests = 2000;
    EXPECT_EQ(firstRange(settings, 5)->text(), "bytes=5-2004");
}

}  // namespace
