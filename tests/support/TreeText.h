#pragma once

#include <string>

namespace Kdd
{

class TagFile;
class TagMap;

/// What a node shows, one line an attribute ("0010,0010 PN Doe^J"), items indented below their sequence.
std::string shownText(const TagMap& node, int indent = 0);

/// What a node holds itself, missing markers included.
std::string ownText(const TagMap& node, int indent = 0);

/// Every node of a tag file with what it holds itself, so that two trees compare as one readable text.
std::string treeText(const TagFile& file);

/// Every image of a tag file by UID with what it shows: what must never change.
std::string imagesText(const TagFile& file);

}  // namespace Kdd
