#pragma once

#include <QVector>

#include <vector>

namespace Kdd
{

class StudyTree;
class TagMap;
struct VolumeInfo;

/// Hangs volumes into the tree of a study.
class StudyVolumes
{
public:
    /// Adds the volumes of one series, whose indexes are their places in `infos`. Images that the tree does not hold, or
    /// that belong to another series than the volume's first one, are warned about and passed over; a volume none of
    /// whose images is held is not made.
    static void add(const StudyTree& tree, const std::vector<VolumeInfo*>& infos);

private:
    static QVector<TagMap*> imagesOf(const StudyTree& tree, const VolumeInfo& info, int volumeIndex);
};

}  // namespace Kdd
