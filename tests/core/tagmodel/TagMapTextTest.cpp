#include "kddlib/tagmodel/AttributeNames.h"
#include "kddlib/tagmodel/TagMap.h"
#include "kddlib/tagmodel/TagSequence.h"
#include "support/DatasetBuilder.h"

#include <QTextStream>

#include <gtest/gtest.h>

using namespace Kdd;

namespace
{

const DcmTagKey kNone(0, 0);

const std::pair<const char*, DcmTagKey> kNames[] = {
    {"PatientName", DCM_PatientName},
    {"PatientsName", DCM_PatientName},
    {"(0010,0010)", DCM_PatientName},
    {"3DRenderingType", DCM_ThreeDRenderingType},
    {"StudyComments", {0x0032, 0x4000}},  // retired, and the name of a private attribute
    {"RETIRED_LookupTableNumber", {0x0020, 0x0026}},
    {"CSAImageHeaderType", kNone},
    {"RETIRED_Attribute00280020UsedInadvertentlyInAProduct", kNone},
    {"(10,10)", kNone},
    {"(0010,001g)", kNone},
    {"(0029,1008)", kNone},
};

TEST(AttributeNames, AreResolvedThroughAllDictionariesEveryTime)
{
    for (int i = 0; i < 2; ++i) {
        for (const auto& [name, expected] : kNames) {
            DcmTagKey key = kNone;
            EXPECT_EQ(resolveAttributeName(QLatin1String(name), key), expected != kNone) << name;
            EXPECT_EQ(key, expected) << name;
        }
    }
}

const std::pair<const char*, const char*> kPaths[] = {
    {"", "top"},
    {"(0008,1115)[1]", "second"},
    {"ReferencedSeriesSequence[1", "second"},
    {"..ReferencedSeriesSequence[1]..ReferencedImageSequence[0].", "nested"},
    {"ReferencedSeriesSequence[0].ReferencedImageSequence[0]", "nothing"},  // marked missing there
    {"ReferencedSeriesSequence[5]", "nothing"},
    {"ReferencedSeriesSequence[-1]", "nothing"},
    {"ReferencedSeriesSequence", "nothing"},
    {"[1]", "nothing"},
    {"PatientID[0]", "nothing"},
    {"NoSuchSequence[0]", "nothing"},
};

TEST(TagMapPath, LeadsToTheItemThatItNames)
{
    const DatasetBuilder nested = anItem().with(DCM_PatientID, "nested");
    DatasetBuilder second = anItem().with(DCM_PatientID, "second");
    DatasetBuilder image = anImage().with(DCM_PatientID, "top");
    image.withItem(DCM_ReferencedSeriesSequence, anItem().with(DCM_PatientID, "first"));
    image.withItem(DCM_ReferencedSeriesSequence, second.withItem(DCM_ReferencedImageSequence, nested));
    const std::unique_ptr<TagMap> map(image.map());
    const auto* sequence = static_cast<TagSequence*>(map->findElement(DCM_ReferencedSeriesSequence));
    sequence->item(0)->markAsMissing(DCM_ReferencedImageSequence);
    for (const auto& [path, expected] : kPaths) {
        const TagElement* element = map->findElement(QLatin1String(path), DCM_PatientID);
        EXPECT_STREQ(element != nullptr ? element->value().constData() : "nothing", expected) << path;
    }
}

struct Entry
{
    DcmTagKey key;
    VrCode vr;
    const char* value;
};

struct Comparison
{
    std::vector<Entry> mine;
    std::vector<Entry> theirs;
    std::string diffs;   // empty when they are equal
    std::string strict;  // the same when everything counts
};

const Entry kId{DCM_PatientID, VrCode::LO, "1"};
const Entry kRows{DCM_Rows, VrCode::US, "ab"};
const Entry kPrivate{{0x0029, 0x1001}, VrCode::LO, "a"};
const Entry kAudit{{0x0071, 0x1001}, VrCode::LO, "a"};

const Comparison kComparisons[] = {
    {{kId, {DCM_PatientSex, VrCode::Missing, ""}}, {kId}, "", ""},
    {{kId}, {{DCM_PatientID, VrCode::SH, "1"}}, "", "(0010,0020) LO [1] <> [1]\n"},
    {{{{0x0006, 0x7100}, VrCode::LO, "a"}, kId}, {kId}, "", "(0006,7100) LO <> (0010,0020) LO\n"},
    {{kId, kAudit}, {kId}, "", "(0071,1001) LO Missing tag\n"},
    {{kId, kPrivate}, {kId, {{0x0029, 0x1001}, VrCode::OB, "b"}}, "", "(0029,1001) LO [a] <> [62]\n"},
    {{kPrivate}, {}, "(0029,1001) LO Missing tag\n", "(0029,1001) LO Missing tag\n"},
    {{kId},
     {{DCM_PatientID, VrCode::LO, "2"}, kRows},
     "(0010,0020) LO [1] <> [2]\n",
     "(0010,0020) LO [1] <> [2]\n"},
    {{kRows}, {kId, kRows}, "(0028,0010) US <> (0010,0020) LO\n", "(0028,0010) US <> (0010,0020) LO\n"},
    {{}, {}, "", ""},
};

TEST(TagMapCompare, EndsAtTheFirstDifferenceThatCounts)
{
    for (const Comparison& row : kComparisons) {
        TagMap mine;
        TagMap theirs;
        for (const Entry& entry : row.mine)
            mine.putAndInsertValue(entry.key, entry.vr, entry.value);
        for (const Entry& entry : row.theirs)
            theirs.putAndInsertValue(entry.key, entry.vr, entry.value);
        std::string diffs;
        std::string strict;
        EXPECT_EQ(mine.compare(theirs, false, &diffs), row.diffs.empty());
        EXPECT_EQ(mine.compare(theirs, true, &strict), row.strict.empty());
        EXPECT_EQ(theirs.compare(mine, false, nullptr), row.diffs.empty());
        EXPECT_EQ(diffs, row.diffs);
        EXPECT_EQ(strict, row.strict);
    }
}

TEST(TagMapCompare, GoesIntoTheItems)
{
    TagMap maps[2];
    for (int i = 0; i < 2; ++i) {
        auto* sequence = new TagSequence;
        for (const char* id : {"A", i == 0 ? "B" : "C"})
            sequence->addItem(anItem().with(DCM_PatientID, id).map());
        maps[i].putElement(DCM_ReferencedImageSequence, sequence);
    }
    std::string diffs;
    EXPECT_TRUE(maps[0].compare(maps[0], true, &diffs));
    EXPECT_FALSE(maps[0].compare(maps[1], false, &diffs));
    EXPECT_EQ(diffs, "(0008,1140) (0010,0020) LO [B] <> [C]\n");
}

const char* const kListed =
    R"((0008,1140) --                                           # 0 ReferencedImageSequence
(0010,0010) PN [Müller]                                  # 6 PatientName
(0010,0020) LO [xxxxxxxxxxxxxxxxxxxxxxxxxxxxxxxxxxxxxxxxxxxxxxxxxxxxxxxxxx...]# 61 PatientID
(0010,0040) --                                           # 0 PatientSex
(0028,0010) US 512                                       # 2 Rows
(0029,0010) LO [SIEMENS CSA HEADER]                      # 18 PrivateCreator
(0029,1008) UN IMAGE                                     # 5 CSAImageHeaderType
(0040,0275) SQ                                           # 0 RequestAttributesSequence
  (fffe,e000)
    (0010,0020) LO [7]                                       # 1 PatientID
  (fffe,e00d)
(fffe,e0dd)
(7fe0,0010) ..                                           # 0 PixelData
)";

TEST(TagMapListing, ShowsOwnEntriesAndDumpsWhatANodeShows)
{
    const DatasetBuilder item = anItem().with(DCM_PatientID, "7");
    DatasetBuilder first = anItem().with(DCM_PatientSex, "F");
    DatasetBuilder second = anItem().with(DCM_PatientName, "M\xfcller").withLong(DCM_PatientID, 61);
    TagMap* image = second.with(DCM_Rows, "512").withItem(DCM_RequestAttributesSequence, item).map();
    image->markAsOmitted(DCM_PixelData);
    image->putAndInsertValue(DcmTagKey(0x0029, 0x1008), "SIEMENS CSA HEADER", VrCode::UN, "IMAGE");
    TagMap series;
    series.addChildMap(first.withItem(DCM_ReferencedImageSequence, item).map(), TagMap::ImageLevel);
    series.addChildMap(image, TagMap::ImageLevel);
    QString listed;
    QString dumped;
    QTextStream list(&listed);
    QTextStream dump(&dumped);
    image->listContent(list, 0);
    image->dump(dump, 0);
    EXPECT_EQ(listed.toStdString(), kListed);
    EXPECT_TRUE(dumped.startsWith(QLatin1String("(0010,0010) PN ["))) << dumped.toStdString();
    EXPECT_TRUE(dumped.contains(QLatin1String("\n    (0010,0020) LO [7] "))) << dumped.toStdString();
}

}  // namespace
