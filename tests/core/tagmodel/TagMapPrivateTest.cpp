#include "kddlib/tagmodel/TagElement.h"
#include "kddlib/tagmodel/TagMap.h"
#include "support/DatasetBuilder.h"
#include "support/TreeText.h"

#include <dcmtk/config/osconfig.h>

#include <dcmtk/dcmdata/dcdeftag.h>
#include <dcmtk/dcmdata/dctag.h>
#include <gtest/gtest.h>

using namespace Kdd;

namespace
{

const char* const kSiemens = "SIEMENS CSA HEADER";

DcmTagKey privateKey(int element)
{
    return {0x0029, static_cast<Uint16>(element)};
}

void take(TagMap& map, int block, const QByteArray& creator)
{
    map.putAndInsertValue(privateKey(block), VrCode::LO, creator);
}

/// What is found under the creator at (0029,xx10).
std::string found(const TagMap& map, const char* creator)
{
    DcmTag tag(0x0029, 0x0010);
    tag.setPrivateCreator(creator);
    const TagElement* element = map.findElement(tag);
    return element != nullptr ? element->value().toStdString() : "nothing";
}

TEST(PrivateAttributes, AreFoundByTheExactTextOfTheirCreator)
{
    TagMap map;
    take(map, 0x10, "ABC ");
    take(map, 0x11, "ABC");
    take(map, 0x12, "AB");
    map.putAndInsertValue(privateKey(0x1010), VrCode::LO, "padded");
    map.putAndInsertValue(privateKey(0x1110), VrCode::LO, "exact");
    EXPECT_EQ(found(map, "ABC "), "padded");
    EXPECT_EQ(found(map, "ABC"), "exact");
    EXPECT_EQ(found(map, "abc"), "nothing");
    EXPECT_EQ(found(map, "AB"), "nothing");  // a block without the element
}

TEST(PrivateAttributes, OfANewCreatorGoToTheFirstFreeBlock)
{
    TagMap map;
    for (const int block : {0x10, 0x11, 0x13})
        take(map, block, "taken");
    EXPECT_TRUE(map.putAndInsertValue(privateKey(0x0010), "ABC", VrCode::SH, "one"));
    EXPECT_TRUE(map.putAndInsertValue(privateKey(0xff10), "ABC", VrCode::SH, "two"));
    EXPECT_EQ(ownText(map), "0029,0010 10 taken\n0029,0011 10 taken\n0029,0012 10 ABC\n0029,0013 10 taken\n"
                            "0029,1210 16 two\n");
    for (int block = 0x14; block <= 0xff; ++block)
        take(map, block, block == 0xff ? "last" : "taken");
    EXPECT_FALSE(map.putAndInsertValue(privateKey(0x0010), "XYZ", VrCode::SH, "none"));
    EXPECT_FALSE(map.putAndInsertValue(DCM_Rows, "ABC", VrCode::SH, "even"));
    EXPECT_TRUE(map.putAndInsertValue(privateKey(0x0010), "last", VrCode::SH, "three"));
    EXPECT_EQ(found(map, "last"), "three");
    EXPECT_EQ(map.tagsForLevel().size(), 240 + 2);
}

TEST(PrivateAttributes, ShareAnInheritedCreatorUnlessItIsMissing)
{
    auto* first = new TagMap;
    auto* second = new TagMap;
    TagMap series;
    take(*first, 0x10, "ABC");
    series.addChildMap(first, TagMap::ImageLevel);
    series.addChildMap(second, TagMap::ImageLevel);
    EXPECT_TRUE(first->putAndInsertValue(privateKey(0x0010), "ABC", VrCode::SH, "one"));
    EXPECT_TRUE(second->putAndInsertValue(privateKey(0x0010), "XYZ", VrCode::SH, "two"));
    EXPECT_EQ(ownText(*first), "0029,1010 16 one\n");
    EXPECT_EQ(ownText(*second), "0029,0010 10 XYZ\n0029,1010 16 two\n");
}

TEST(PrivateAttributes, OfUnknownRepresentationAreWrittenByTheDictionary)
{
    TagMap map;
    take(map, 0x10, kSiemens);
    const std::pair<DcmTagKey, const char*> texts[] = {
        {privateKey(0x1009), "3.1"}, {privateKey(0x1109), "33\\2e\\31"}, {DCM_PatientName, "33\\2e\\31"}};
    QByteArray text;
    for (const auto& [key, expected] : texts) {
        map.putAndInsertValue(key, VrCode::UN, "3.1");
        EXPECT_TRUE(map.findAndGetString(key, text));
        EXPECT_EQ(text, expected);
    }
    EXPECT_TRUE(map.findAndGetString(privateKey(0x0009), kSiemens, text));
    EXPECT_EQ(text, "3.1");
    EXPECT_FALSE(map.findAndGetString(privateKey(0x0009), "Nobody", text));
}

TEST(PutAndInsertString, TakesTheRepresentationOfTheDictionaryForANewElement)
{
    TagMap map;
    map.putAndInsertString(DCM_Rows, "512");
    map.putAndInsertString(privateKey(0x1009), kSiemens, "3.1");
    map.putAndInsertString(privateKey(0x1109), "in no encoding");
    map.markAsOmitted(DCM_Columns);
    map.putAndInsertString(DCM_Columns, "256");
    map.putAndInsertValue(DCM_PatientID, VrCode::SH, "7");
    map.putAndInsertString(DCM_PatientID, "8");
    EXPECT_EQ(ownText(map), "0010,0020 16 8\n0028,0010 24 0002\n0028,0011 24 0001\n"
                            "0029,1009 10 3.1\n0029,1109 40 \n");
}

TEST(PutAndInsert, LoseNoSequence)
{
    const std::unique_ptr<TagMap> map(
        anImage().withItem(DCM_RequestAttributesSequence, anItem().with(DCM_PatientID, "1")).map());
    const TagElement* held = map->findElement(DCM_RequestAttributesSequence);
    map->putElement(privateKey(0x1010), held->clone());
    const std::string shown = shownText(*map);
    EXPECT_TRUE(map->putAndInsertString(DCM_RequestAttributesSequence, "text"));
    EXPECT_FALSE(map->putAndInsertInt(DCM_RequestAttributesSequence, 1));
    EXPECT_FALSE(map->putAndInsertValue(DCM_RequestAttributesSequence, VrCode::UN, held->value()));
    EXPECT_FALSE(map->putAndInsertValue(privateKey(0x0010), "ABC", VrCode::SH, "in its place"));
    EXPECT_EQ(shownText(*map), shown);
}

TEST(PutAndInsert, TakeWhatTheMapItselfHolds)
{
    TagMap map;
    map.markAsMissing(DCM_PatientID)->value() = "hidden";
    map.putAndInsertString(DCM_PatientID, map.tagsForLevel().first()->value());
    EXPECT_EQ(ownText(map), "0010,0020 10 hidden\n");
    map.putElement(DCM_PatientID, map.findElement(DCM_PatientID));
    EXPECT_EQ(ownText(map), "0010,0020 10 hidden\n");
    map.markAsMissing(privateKey(0x1109))->value() = "hidden";
    map.putAndInsertString(privateKey(0x1109), "in no encoding");
    EXPECT_EQ(map.findElement(privateKey(0x1109))->value(), "") << "what a marker hides stays hidden";
}

}  // namespace
