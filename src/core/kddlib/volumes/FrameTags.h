#pragma once

#include "platform/base/Export.h"

#include <QByteArray>

#include <dcmtk/config/osconfig.h>

#include <dcmtk/dcmdata/dctagkey.h>

namespace Kdd
{

class TagMap;

/// The attributes of one frame of an image, wherever the image keeps them: enhanced images have functional groups, one
/// set for each frame and one that all frames share; any other image has the attributes itself.
///
/// Points into the image, which must outlive it and stay unchanged. Used by one thread at a time, with the whole tree.
class KDD_EXPORT FrameTags
{
public:
    /// `frame` is 0-based.
    FrameTags(const TagMap& image, int frame);

    /// The text of an attribute in a functional group: of the frame, else of the shared ones, else of the image itself.
    /// Empty when absent.
    QByteArray text(const DcmTagKey& group, const DcmTagKey& key) const;

    /// An attribute that only the image itself can have.
    QByteArray text(const DcmTagKey& key) const;

    const TagMap& image() const { return *mImage; }

    /// How many frames have functional groups of their own.
    static int numFrameGroups(const TagMap& image);

private:
    const TagMap* mImage;
    const TagMap* mOwnGroups;
    const TagMap* mSharedGroups;
};

}  // namespace Kdd
