#pragma once

#include <QByteArray>

#include <functional>

namespace Kdd
{

class TagMap;

/// One attribute in which two nodes differ.
struct AttributeDifference
{
    QByteArray path;  ///< "(0008,1140)[0].(0008,1150)"
    QByteArray name;  ///< the dictionary's keyword; empty when it has none
    QByteArray left;  ///< "UI [1.2.3]", or "-" where the node has no such attribute
    QByteArray right;
};

/// Hands every attribute in which the merged views of two nodes differ, VRs included, to `report`. The system's own
/// group 0006 is left out.
void compareNodes(const TagMap& left, const TagMap& right,
                  const std::function<void(const AttributeDifference&)>& report);

}  // namespace Kdd
