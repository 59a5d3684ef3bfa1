#include "kddlib/items/kdditem.h"

namespace Kdd
{

SequenceOfItems::~SequenceOfItems() = default;

Item::~Item() = default;

OFCondition Item::findItem(const DcmTagKey& key, Item*& item, int index, const OFCondition& outOfRange)
{
    item = nullptr;
    SequenceOfItems* sequence = nullptr;
    OFCondition condition = findAndGetSequence(key, sequence);
    if (sequence == nullptr)
        return condition;
    if (index >= 0)
        item = sequence->getItem(static_cast<unsigned int>(index));
    return item != nullptr ? condition : outOfRange;
}

}  // namespace Kdd
