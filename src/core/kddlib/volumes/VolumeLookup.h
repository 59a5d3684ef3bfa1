#pragma once

#include <QByteArray>

namespace Kdd
{

class TagMap;
class Volume;

// The volumes of a series are known by their index and by the suffix of their file's name, never by their place in a
// list: files that could not be read leave gaps. All of these are null when there is none.

Volume* volumeOfIndex(const TagMap& series, int index);

/// The volume made from a file of that suffix; of several the one that has the index too, else the first.
Volume* volumeOfSuffix(const TagMap& series, const QByteArray& suffix, int index);

/// The volume that a file of that name stands for: by the suffix, and where no volume has that by the index, unless the
/// volume is known to be another part.
Volume* volumeOfFile(const TagMap& series, const QByteArray& name, int index);

}  // namespace Kdd
