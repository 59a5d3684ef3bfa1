#include "kddlib/tagmodel/TagMap.h"
#include "kddlib/tagmodel/TagSequence.h"
#include "support/DatasetBuilder.h"
#include "support/TreeText.h"

#include <gtest/gtest.h>

using namespace Kdd;

namespace
{

const DcmTagKey kKey = DCM_InstanceNumber;

/// A value of so many letters, or what a node holds instead: "-" nothing, "?" a missing marker, "..." an omitted one.
void put(TagMap& node, const QByteArray& value)
{
    if (value == "?")
        node.markAsMissing(kKey);
    else if (value == "...")
        node.markAsOmitted(kKey);
    else if (value != "-")
        node.putAndInsertValue(kKey, VrCode::LO, value);
}

std::string own(const TagMap& node)
{
    const TagElement* element = node.tagsForLevel().value(kKey, nullptr);
    if (element == nullptr)
        return "-";
    if (element->markedAsMissing())
        return "?";
    return element->markedAsOmitted() ? "..." : element->value().toStdString();
}

/// A study with one series, every node holding no more than one value.
struct Tree
{
    Tree(const QByteArray& ofStudy, const QByteArray& ofSeries, const QByteArray& ofImages)
    {
        study.addChildMap(series, TagMap::SeriesLevel);
        for (const QByteArray& value : ofImages.split(' ')) {
            auto* image = new TagMap;
            series->addChildMap(image, TagMap::ImageLevel);
            put(*image, value);
        }
        put(study, ofStudy);
        put(*series, ofSeries);
    }

    TagMap& image(int i) const { return *series->children().at(i); }

    /// What each node holds: study / series / images.
    std::string held() const
    {
        std::string text = own(study) + " / " + own(*series) + " /";
        for (const TagMap* child : series->children())
            text += ' ' + own(*child);
        return text;
    }

    TagMap study;
    TagMap* series = new TagMap;
};

struct Placement
{
    QByteArray study, series, images;
    std::string held;
};

const Placement kPlacements[] = {
    {"-", "-", "XXXXXXXXXX XXXXXXXXXX XXXXXXXXXX", "- / XXXXXXXXXX / - - -"},
    {"-", "XXXXXXXXXX", "ZZZZZZZZZZ YYYYYYYYYY", "- / YYYYYYYYYY / ZZZZZZZZZZ -"},
    {"-", "-", "YYYYYYYYY Z Z", "- / Z / YYYYYYYYY - -"},  // of equal cost the shorter
    {"-", "-", "X Y", "- / - / X Y"},                      // nothing is gained
    {"-", "XXXXXXXXXX", "- - ?", "- / XXXXXXXXXX / - - ?"},
    {"XXXXXXXXXX", "-", "? ? ? ? -", "XXXXXXXXXX / ? / - - - - XXXXXXXXXX"},  // markers cost more
    {"X", "-", "- -", "X / - / - -"},
    {"X", "?", "Y Y Y -", "X / Y / - - - ?"},
    {"-", "X", "? ?", "- / X / ? ?"},  // nobody sees it, but only a study may forget it
    {"-", "-", "...  ...", "- / ... / -  -"},
};

TEST(Optimize, EveryValueStandsWhereItIsCheapest)
{
    for (const Placement& row : kPlacements) {
        const Tree tree(row.study, row.series, row.images);
        tree.series->optimize(kKey);
        EXPECT_EQ(tree.held(), row.held);
    }
    Tree tree("X", "?", "-");
    tree.study.optimize(kKey);
    EXPECT_EQ(tree.held(), "- / - / -") << "a study forgets what no series shows";
}

TEST(Optimize, OfThousandsOfValuesTheMostFrequentIsShared)
{
    QByteArray values;
    QByteArray left;
    for (int i = 0; i < 3000; ++i) {
        // Every value comes twice but one, which comes a third time.
        values += (i > 0 ? " value" : "value") + QByteArray::number(i == 2999 ? 700 : i / 2);
        left += ' ' + (i / 2 == 700 || i == 2999 ? "-" : "value" + QByteArray::number(i / 2));
    }
    const Tree tree("-", "-", values);
    tree.series->optimizeAll();
    EXPECT_EQ(tree.held(), "- / value700 /" + left.toStdString());
}

TEST(Optimize, ASeriesHidesAStudysValueAndKeepsItsOwnBytesButNoItems)
{
    const Tree tree("X", "YY", "- Z ?");
    tree.series->storeOptionA(kKey);
    EXPECT_EQ(tree.held(), "X / ? / YY Z -");
    EXPECT_EQ(tree.series->tagsForLevel().value(kKey)->value(), "YY");
    tree.series->putElement(kKey, new TagSequence);
    tree.series->storeOptionA(kKey);
    // Records of markers end before the items.
    EXPECT_FALSE(tree.series->tagsForLevel().value(kKey)->isSequence());
}

TEST(Optimize, AGivenValueReplacesThoseOfEqualBytes)
{
    const Tree tree("-", "V", "X W ? - ...");
    tree.series->storeOptionB(kKey, VrCode::SH, "X");
    EXPECT_EQ(tree.held(), "- / X / - W ? V ...");
    tree.series->storeOptionB(kKey, VrCode::SH, {});
    EXPECT_EQ(tree.held(), "- /  / X W ? V ...");
    tree.series->storeOptionB(kKey, VrCode::Omitted, {});
    EXPECT_EQ(tree.held(), "- / ... / X W ? V -");
    const Tree absent("-", "-", "- X");
    absent.series->storeOptionB(kKey, VrCode::LO, "X");
    EXPECT_EQ(absent.held(), "- / X / ? -");
}

TEST(Optimize, AGivenValueMayBeThatOfAChildThatLosesIt)
{
    const Tree tree("-", "-", "XXX XXX Y XXX");
    // Value and key of an entry that goes: both are used until the last child is done.
    const TagMap::Tags& of = tree.image(0).tagsForLevel();
    tree.series->storeOptionB(of.firstKey(), VrCode::LO, of.first()->value());
    EXPECT_EQ(tree.held(), "- / XXX / - - Y -");
    const Tree marked("X", "-", "? ? Y");
    marked.series->storeOptionA(marked.image(0).tagsForLevel().firstKey());
    EXPECT_EQ(marked.held(), "X / ? / - - Y");
}

TEST(RemoveTagsNotNeededByClient, LeavesWhatClientsShow)
{
    DatasetBuilder image = anItem();
    for (const DcmTagKey& sequence :
         {DCM_VOILUTSequence, DCM_PresentationLUTSequence, DCM_ModalityLUTSequence})
        image.withItem(sequence, anItem());
    for (const char* number : {"1", "2", "3", "4", "5", "6"})
        image.withItem(DCM_OriginalAttributesSequence, anItem().with(DCM_PatientID, number));
    TagMap series;
    series.addChildMap(image.map(), TagMap::ImageLevel);
    TagMap& child = *series.children().first();
    for (TagMap* node : {&series, &child}) {
        node->putAndInsertValue(DcmTagKey(0x0009, 0x1001), VrCode::UN, "ab");
        for (const int group : {0x6000, 0x601e, 0x6020})
            node->putAndInsertValue(DcmTagKey(static_cast<Uint16>(group), 0x3000), VrCode::OW, "ab");
    }
    series.removeTagsNotNeededByClient();
    EXPECT_EQ(ownText(child), "6020,3000 14 6162\n");
    EXPECT_EQ(ownText(series), "0400,0561 18 \n item\n  0010,0020 10 1\n item\n  0010,0020 10 2\n"
                               " item\n  0010,0020 10 3\n item\n  0010,0020 10 4\n6020,3000 14 6162\n");
}

}  // namespace
