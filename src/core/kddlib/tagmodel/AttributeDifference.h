#pragma once

#include "platform/base/Export.h"

#include <QByteArray>

#include <dcmtk/dcmdata/dctagkey.h>

#include <functional>

namespace Kdd
{

class TagMap;

/// One attribute in which two nodes differ. A value, made on the thread that compares.
struct AttributeDifference
{
    QByteArray path;     ///< the items that lead to it: "(0008,1140)[0].", or empty
    DcmTagKey key;       ///< of the attribute
    const TagMap* left;  ///< the node, or the item of its sequence, that shows it; null where it is absent
    const TagMap* right;
};

/// Hands every attribute in which the merged views of two nodes differ, VRs included, to `report`, in the order of their
/// keys; of sequences with the same number of items the attributes that differ inside. The system's own group 0006 is
/// left out. Returns early when `report` says false. Both nodes are only read.
KDD_EXPORT void compareNodes(const TagMap& left, const TagMap& right,
                             const std::function<bool(const AttributeDifference&)>& report);

}  // namespace Kdd
