#include "kddlib/tagmodel/TagMap.h"
#include "kddlib/tagmodel/TagSequence.h"
#include "support/DatasetBuilder.h"
#include "support/TreeText.h"

#include <gtest/gtest.h>

using namespace Kdd;

namespace
{

const DcmTagKey kSequence = DCM_RequestAttributesSequence;

TagMap* item(const TagMap& node, int i)
{
    return static_cast<TagSequence*>(node.findElement(kSequence))->item(i);
}

/// A study and a series, to which images are attached.
class TreeTest : public testing::Test
{
protected:
    TreeTest()
    {
        series->putAndInsertString(DCM_SeriesInstanceUID, "1.2.3");
        study.addChildMap(series, TagMap::SeriesLevel);
    }

    TagMap* attach(const DatasetBuilder& image)
    {
        TagMap* map = image.map();
        series->addChildMap(map, TagMap::ImageLevel);
        return map;
    }

    TagMap study;
    TagMap* series = new TagMap;
};

TEST_F(TreeTest, ALaterImageHoldsWhatDiffersAndHidesWhatItLacks)
{
    const TagMap* first = attach(anImage("1.2.3.1").with(DCM_InstanceNumber, "1").with(DCM_PatientID, "7"));
    const TagMap* second = attach(anImage("1.2.3.2").with(DCM_InstanceNumber, "2"));
    EXPECT_EQ(ownText(*second), "0008,0018 22 1.2.3.2\n0010,0020 29 \n0020,0013 9 2\n");
    EXPECT_EQ(first->findElement(DCM_InstanceNumber)->value(), "1");
    EXPECT_EQ(second->findElement(DCM_PatientID), nullptr);
    EXPECT_EQ(second->lowerBound(DCM_PatientID).key(), DCM_StudyInstanceUID);
    int number = 5;
    EXPECT_FALSE(second->findAndGetInt(DCM_PatientID, number));
    EXPECT_EQ(number, 0);
    EXPECT_EQ(series->findElement(DCM_InstanceNumber)->numDiffering(), 1U);
    EXPECT_EQ(series->findElement(DCM_InstanceNumber)->numMissing(), 0U);
    EXPECT_EQ(series->findElement(DCM_PatientID)->numMissing(), 1U);
    EXPECT_EQ(series->findElement(DCM_SOPClassUID)->numDiffering(), 0U);
}

DatasetBuilder anImageWithItems(const char* sopUID, const char* description)
{
    const DatasetBuilder nested = anItem().with(DCM_CodeValue, "C").with(DCM_CodeMeaning, description);
    DatasetBuilder first = anItem().with(DCM_RequestedProcedureID, "P");
    return anImage(sopUID)
        .withItem(kSequence, first.withItem(DCM_ScheduledProtocolCodeSequence, nested))
        .withItem(kSequence, anItem().with(DCM_RequestedProcedureID, description));
}

/// Ways in which the item above, from which an item inherits, can go.
using Removal = void (*)(TagMap& series, TagMap& image);

const Removal kRemovals[] = {
    [](TagMap& series, TagMap&) { series.deleteElement(kSequence); },
    [](TagMap& series, TagMap&) { series.markAsMissing(kSequence); },
    [](TagMap& series, TagMap&) { series.putElement(kSequence, new TagElement(VrCode::UN, "x")); },
    [](TagMap& series, TagMap&) { static_cast<TagSequence*>(series.findElement(kSequence))->truncate(0); },
    [](TagMap& series, TagMap&) { series.putElement(kSequence, series.findElement(kSequence)->clone()); },
    [](TagMap&, TagMap& image) { image.detachItems(); },
};

TEST_F(TreeTest, AnItemTakesOverWhatItInheritsWhenTheOneAboveGoes)
{
    const DatasetBuilder built = anImageWithItems("1.2.3.2", "B");
    const std::string alone = shownText(*std::unique_ptr<TagMap>(built.map()));
    attach(anImageWithItems("1.2.3.1", "A"));
    for (const Removal remove : kRemovals) {
        TagMap* image = attach(built);
        EXPECT_EQ(item(*image, 0)->parent(), item(*series, 0));
        EXPECT_EQ(ownText(*item(*image, 0)), "0040,0008 18 \n item\n  0008,0104 10 B\n");
        const std::unique_ptr<TagElement> before(series->findElement(kSequence)->clone());
        remove(*series, *image);
        EXPECT_EQ(item(*image, 0)->parent(), nullptr);
        EXPECT_EQ(shownText(*image), alone);
        series->putElement(kSequence, before->clone());
        study.relinkItems();
        EXPECT_EQ(item(*image, 0)->parent(), item(*series, 0));
        EXPECT_EQ(shownText(*image), alone);
    }
}

/// Sequences made by hand, without a dataset.
class HandMade : public TreeTest
{
protected:
    static TagMap* mapOf(const char* procedure)
    {
        auto* map = new TagMap;
        map->putAndInsertString(DCM_RequestedProcedureID, procedure);
        return map;
    }

    static TagSequence* sequenceIn(TagMap& node)
    {
        auto* sequence = new TagSequence;
        node.putElement(kSequence, sequence);
        return sequence;
    }
};

TEST_F(HandMade, AnItemBelongsToOneSequence)
{
    TagMap* item = mapOf("A");
    auto* image = new TagMap;
    series->addChildMap(image, TagMap::ImageLevel);
    series->putAndInsertString(DCM_PatientID, "7");
    TagSequence& first = *sequenceIn(*series);
    TagSequence second;
    for (TagSequence* sequence : {&first, &second, &second})
        sequence->addItem(item);
    second.addItem(image);
    second.addItem(nullptr);
    EXPECT_EQ(first.item(0), item);
    EXPECT_NE(second.item(0), second.item(1));
    EXPECT_EQ(shownText(*second.item(1)), shownText(*item));
    EXPECT_TRUE(series->children().isEmpty());
    EXPECT_NE(second.item(2)->findElement(DCM_PatientID), nullptr) << "which it inherited";
    EXPECT_FALSE(second.compare(second, false, nullptr)) << "because of the item that is not there";
    const std::unique_ptr<DcmElement> made(second.createDcmElement(kSequence));
    EXPECT_EQ(static_cast<DcmSequenceOfItems&>(*made).card(), 4U);
}

TEST_F(HandMade, ACopyOfASequenceOwnsOnlyWhatIsAddedToIt)
{
    TagSequence source;
    source.addItem(mapOf("A"));
    source.addItem(mapOf("B"));
    {
        TagSequence copy(source);
        copy.addItem(mapOf("C"));
        copy.truncate(1);
        copy.addItem(mapOf("D"));
        source = TagSequence(source);
        copy = source;
        source = copy;
        copy.clear();
        EXPECT_EQ(copy.numItems(), 0);
    }
    EXPECT_EQ(ownText(*source.item(1)), "0040,1001 16 B\n");
    TagMap map;
    DcmSequenceOfItems none(kSequence);
    TagSequence* held = sequenceIn(map);
    EXPECT_EQ(map.setSequence(&none, 1024), held) << "one that is set again stays the same element";
}

TEST_F(HandMade, AssignmentTakesThePlaceOfWhatWasThere)
{
    series->putAndInsertString(DCM_PatientID, "7");
    TagMap copy;
    copy.putAndInsertString(DCM_PatientID, "8");
    copy.putAndInsertString(DCM_Modality, "CT");
    copy = *series;
    EXPECT_EQ(ownText(copy), ownText(*series));
}

TEST_F(HandMade, ACopyThatIsAssignedBackChangesNothing)
{
    TagMap onlyChildren;
    auto* child = new TagMap;
    onlyChildren.addChildMap(child, TagMap::SeriesLevel);
    ASSERT_TRUE(onlyChildren.tagsForLevel().isEmpty());
    TagMap* image = attach(anImage("1").with(DCM_PatientID, "7"));
    const std::string shown = shownText(*image);
    for (TagMap* node : {series, &onlyChildren}) {
        const TagMap copy(*node);
        *node = copy;
    }
    EXPECT_EQ(child->parent(), &onlyChildren);
    EXPECT_EQ(onlyChildren.children(), QList<TagMap*>{child});
    EXPECT_EQ(series->parent(), &study);
    EXPECT_EQ(series->children(), QList<TagMap*>{image});
    EXPECT_EQ(shownText(*image), shown);
}

TEST_F(HandMade, ANodeThatIsAttachedAgainHangsOnceWithAllItShows)
{
    TagMap* image = attach(anImage("1").with(DCM_PatientID, "7"));
    attach(anImage("2"));
    const std::string shown = shownText(*image);
    series->addChildMap(image, TagMap::ImageLevel);
    EXPECT_EQ(series->children().size(), 2);
    auto* other = new TagMap;
    other->addChildMap(image, TagMap::ImageLevel);
    EXPECT_EQ(series->children().size(), 1);
    EXPECT_EQ(shownText(*image), shown);
    EXPECT_TRUE(other->removeChildMap(image));
    EXPECT_EQ(image->parent(), other);
    delete other;
    delete image;
}

}  // namespace
