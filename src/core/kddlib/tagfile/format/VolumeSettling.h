#pragma once

#include "platform/base/Result.h"

namespace Kdd
{

class TagMap;

/// Makes sure that a reader will rebuild the same images for each slice of every volume of a series. The list of volumes
/// in a tag file names no images: on reading, they are found by what each image says of its volumes. So before a series
/// is written, what its images say is held against the volumes that they are in.
class VolumeSettling
{
public:
    /// A volume that lost its last image goes. On failure the images of every volume are as they were.
    static Result settle(TagMap& series);

private:
    static void releaseImagesOfOthers(const TagMap& series);
    static void renumber(TagMap& series);
};

}  // namespace Kdd
