#include "kddlib/items/FileNaming.h"

#include <gtest/gtest.h>

#include <array>

using namespace Kdd;

namespace
{

/// A path; the image and the study that it names, if it does; its suffix.
const std::array<const char*, 4> kFiles[] = {
    {{"/data/1.2.3/1.2.3.4_0.dcm", "1.2.3.4", "1.2.3", "0"}},
    {{"C:\\data\\1.2.3\\1.2.3.4_0.dcm", "1.2.3.4", "1.2.3", "0"}},
    {{"http://host/1.2.3/1.2.3.4_a_b.dcm", "1.2.3.4_a", "1.2.3", "b"}},
    {{"1.2.3/1.2.3.4_0.dcm", "1.2.3.4", "1.2.3", "0"}},
    {{"/data/1.2.3/1.2.3.4_.dcm", "1.2.3.4", "1.2.3", ""}},
    {{"/data/1.2.3/_7.dcm", "", "1.2.3", "7"}},
    {{"/data/1.2.3/of_4/5.dcm", "of", "1.2.3", "5"}},
    {{"/data/1.2.3/1.2.3.4.dcm", "", "", "1.2.3.4"}},
    {{"1.2.3.4_0.dcm", "", "", "0"}},
    {{"/data/1.2.3/1.2.3.4_0.DCM", "", "", ""}},
    {{"a.dcm", "", "", ""}},
    {{"ab.dcm", "", "", "ab"}},
    {{"", "", "", ""}},
    {{nullptr, "", "", ""}},
};

TEST(FileNaming, GivesTheIdentifiersAndTheSuffixThatAPathHolds)
{
    QByteArray sopUID("before");
    QByteArray studyUID("before");
    QByteArray suffix("before");
    for (const auto& [path, namedImage, namedStudy, namedSuffix] : kFiles) {
        EXPECT_EQ(extractUIDs(path, sopUID, studyUID), *namedStudy != 0) << path;
        EXPECT_EQ(sopUID, namedImage) << path;
        EXPECT_EQ(studyUID, namedStudy) << path;
        extractSuffix(path, suffix);
        EXPECT_EQ(suffix, namedSuffix) << path;
        EXPECT_EQ(extractSuffix(path), namedSuffix) << path;
    }
}

}  // namespace
