#include "kddlib/net/cloud/CloudAddress.h"

#include "support/Setting.h"

#include <gtest/gtest.h>

using namespace Kdd;

namespace
{

TEST(CloudAddress, HasItsObjectEscaped)
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
    const Setting host("KDD_CLOUD_API", "http://cloud:90");
    for (const auto& [address, path] : kCases)
        EXPECT_EQ(cloudUrl(address, CloudEndpoint::Api), std::string("http://cloud:90/") + path);
    EXPECT_EQ(cloudApiHost(), "cloud:90");
}

TEST(CloudAddress, OfAnObjectThatIsWrittenOrDeletedIsItsNameAndNothingElse)
{
    for (const char* good : {"gs:b/o", "gs://b.c-d_e/x/y#1 \xc3\xbc.dcm", "gs://b/50%25", "gs://b/..a/.b"})
        EXPECT_TRUE(checkCloudObject(good).good()) << good;
    for (const char* bad :
         {"https://a/b", "gs://b", "gs://b/", "gs:", "gs://b/o?generation=5", "gs://b/50% off", "gs://b/o%2",
          "gs://b#c/o", "gs://b c/o", "gs://../o", "gs://b/..", "gs://b/.", "gs://b/%2e.", "gs://b/a//.."})
        EXPECT_TRUE(checkCloudObject(bad).bad()) << bad;
}

}  // namespace
