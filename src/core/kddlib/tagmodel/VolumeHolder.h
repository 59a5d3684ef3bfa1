#pragma once

#include "platform/base/Export.h"

#include <QList>

#include <memory>

namespace Kdd
{

class Volume;

/// The volumes that hang below a node, as far as the tree has to do with them: they go with the node, and lose their
/// suffixes with what else clients do not need. What a volume is only the room above knows, so it makes the holders.
///
/// A node without volumes has no holder, as nearly all nodes are images. Used by one thread at a time, with the whole
/// tree.
class KDD_EXPORT VolumeHolder
{
public:
    VolumeHolder() = default;
    VolumeHolder(const VolumeHolder&) = delete;
    VolumeHolder& operator=(const VolumeHolder&) = delete;

    /// Deletes the volumes, unless they are shared.
    virtual ~VolumeHolder() = default;

    /// The same volumes for the copy of a node, which does not own them and must not outlive them.
    virtual std::unique_ptr<VolumeHolder> share() const = 0;

    /// Empties the suffix of the file name of every volume.
    virtual void forgetFileSuffixes() = 0;

    /// In their order in the tag file. Who takes one out owns it.
    QList<Volume*>& list() { return mList; }
    const QList<Volume*>& list() const { return mList; }

private:
    QList<Volume*> mList;
};

}  // namespace Kdd
