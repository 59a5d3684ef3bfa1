#pragma once

namespace Kdd
{

class TagMap;

/// Names a volume in one of its images: the index as one byte, further volumes appended as one byte each.
void addVolumeIndex(TagMap& image, int index);

}  // namespace Kdd
