#pragma once

#include "kddlib/tagmodel/OwnAttributes.h"
#include "kddlib/tagmodel/TagElement.h"
#include "kddlib/tagmodel/TagMap.h"
#include "support/DatasetBuilder.h"

#include <random>

namespace Kdd
{

// Graphic Data has a larger bound, the preview a table of its own, and a value may come where a sequence stood.
inline const DcmTagKey kValueKeys[] = {
    DCM_StudyDescription, DCM_SmallestImagePixelValue, DCM_GraphicData, {0x0009, 0x1001}};
inline const DcmTagKey kSequenceKeys[] = {
    DCM_ReferencedImageSequence, DCM_RequestAttributesSequence, {0x0009, 0x1002}};

/// Images of one study that share much and differ in all that can differ: each is made from the one before.
class RandomImages
{
public:
    explicit RandomImages(unsigned int seed)
        : mRandom(seed)
    {
    }

    int below(int count) { return static_cast<int>(mRandom() % static_cast<unsigned int>(count)); }
    bool oneIn(int count) { return below(count) == 0; }
    DcmTagKey key() { return oneIn(3) ? kSequenceKeys[below(3)] : kValueKeys[below(4)]; }

    TagMap* next(const QByteArray& sopUID)
    {
        change(mLast.dataset(), 0);
        mLast.with(DCM_SOPInstanceUID, sopUID).inSeries(oneIn(2) ? "1.2.3" : "1.2.4");
        TagMap* map = mLast.map(kBound);
        if (oneIn(3))
            map->putAndInsertValue(kPreview, VrCode::OB, QByteArray(below(3), 'j'));
        return map;
    }

    /// What the image made last was made from.
    const DatasetBuilder& last() const { return mLast; }

    /// Changes any of the attributes and items, in as many steps.
    void change(int steps)
    {
        for (int i = 0; i < steps; ++i)
            change(mLast.dataset(), 0);
    }

private:
    static constexpr unsigned int kBound = 64;
    static constexpr int kDepth = 3;

    DcmElement* value(const DcmTagKey& key)
    {
        const VrCode vrs[] = {VrCode::LO, VrCode::LT, VrCode::US, VrCode::SS, VrCode::OB, VrCode::UN};
        const QByteArray values[] = {"", "AB", "AC", "ABCD", QByteArray(70, 'o')};
        const VrCode vr = vrs[below(6)];
        const QByteArray bytes = oneIn(30) ? QByteArray(65536, 'l') : values[below(5)];
        return TagElement(vr, bytes).newDcmElement(DcmTag(key, evrOf(vr))).release();
    }

    void change(DcmItem& item, int depth)
    {
        for (const DcmTagKey& key : kValueKeys)
            changeValue(item, key);
        for (const DcmTagKey& key : kSequenceKeys)
            changeSequence(item, key, depth);
    }

    void changeValue(DcmItem& item, const DcmTagKey& key)
    {
        const int choice = below(8);
        if (choice == 0)
            delete item.remove(key);
        else if (choice == 1)
            item.insert(value(key), OFTrue);
    }

    void changeSequence(DcmItem& item, const DcmTagKey& key, int depth)
    {
        const int choice = below(10);
        DcmSequenceOfItems* sequence = nullptr;
        item.findAndGetSequence(key, sequence);
        if (choice == 0)
            changeValue(item, key);
        else if (sequence == nullptr && choice < 4)
            item.insert(new DcmSequenceOfItems(DcmTag(key, EVR_SQ)), OFTrue);
        else if (sequence != nullptr && choice < 7 && depth < kDepth)
            changeItems(*sequence, depth);
    }

    void changeItems(DcmSequenceOfItems& sequence, int depth)
    {
        if (sequence.card() > 2 || (sequence.card() > 0 && oneIn(6)))
            delete sequence.remove(sequence.card() - 1);
        else if (sequence.card() == 0 || oneIn(3))
            sequence.append(new DcmItem);
        for (unsigned long i = 0; i < sequence.card(); ++i) {
            if (oneIn(2))
                change(*sequence.getItem(i), depth + 1);
        }
    }

    std::mt19937 mRandom;
    DatasetBuilder mLast = anImage();
};

}  // namespace Kdd
