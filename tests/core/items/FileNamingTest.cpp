#include "kddlib/items/FileNaming.h"

#include <gtest/gtest.h>

using namespace Kdd;

namespace
{

struct NamedFile
{
    const char* path;
    bool isNamed;
    const char* sopUID;
    const char* studyUID;
    const char* suffix;
};

const NamedFile kFiles[] = {
    {"/data/1.2.3/1.2.3.4_0.dcm", true, "1.2.3.4", "1.2.3", "0"},
    {"C:\\data\\1.2.3\\1.2.3.4_0.dcm", true, "1.2.3.4", "1.2.3", "0"},
    {"http://host/1.2.3/1.2.3.4_a_b.dcm", true, "1.2.3.4_a", "1.2.3", "b"},
    {"1.2.3/1.2.3.4_0.dcm", true, "1.2.3.4", "1.2.3", "0"},
    {"/data/1.2.3/1.2.3.4_.dcm", true, "1.2.3.4", "1.2.3", ""},
    {"/data/1.2.3/_7.dcm", true, "", "1.2.3", "7"},
    {"/data/1.2.3/of_4/5.dcm", true, "of", "1.2.3", "5"},
    {"/data/1.2.3/1.2.3.4.dcm", false, "", "", "1.2.3.4"},
    {"1.2.3.4_0.dcm", false, "", "", "0"},
    {"/data/1.2.3/1.2.3.4_0.DCM", false, "", "", ""},
    {"a.dcm", false, "", "", ""},
    {"ab.dcm", false, "", "", "ab"},
    {"", false, "", "", ""},
    {nullptr, false, "", "", ""},
};

TEST(FileNaming, GivesTheIdentifiersAndTheSuffixThatAPathHolds)
{
    QByteArray sopUID("before");
    QByteArray studyUID("before");
    QByteArray suffix("before");
    for (const NamedFile& row : kFiles) {
        EXPECT_EQ(extractUIDs(row.path, sopUID, studyUID), row.isNamed) << row.path;
        EXPECT_EQ(sopUID, row.sopUID) << row.path;
        EXPECT_EQ(studyUID, row.studyUID) << row.path;
        extractSuffix(row.path, suffix);
        EXPECT_EQ(suffix, row.suffix) << row.path;
        EXPECT_EQ(extractSuffix(row.path), row.suffix) << row.path;
    }
}

}  // namespace
