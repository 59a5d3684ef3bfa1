#pragma once

#include <QByteArray>

namespace Kxg
{
struct DicomDirectoryEntry;
struct ImageFile;
struct SeriesInfo;
}  // namespace Kxg

namespace Kdd
{

class StudyTree;
class TagMap;

/// Writes what the image database knows of a study into its tree.
class DatabaseValues
{
public:
    /// The tree must outlive the object.
    explicit DatabaseValues(StudyTree& tree)
        : mTree(tree)
    {
    }

    /// Null when the tree does not hold it.
    static TagMap* findImage(const StudyTree& tree, const Kxg::ImageFile& file);

    /// Gives an image the path that the database has of its file.
    static void setFilePath(TagMap& image, const Kxg::ImageFile& file);

    /// Gives every image that `info` names its file path. Images not held are warned about, and `complete` becomes
    /// false, or are made with `createMissing`. How many images received a path.
    int addFilePaths(TagMap* series, const Kxg::SeriesInfo* info, bool createMissing, bool& complete);

    /// Gives the volume that a volume file's name stands for that name: the one of its suffix, else of its part number.
    /// `createMissing` makes a volume that is not there. Other entries change nothing.
    static void addVolumeFilePath(TagMap* series, const Kxg::DicomDirectoryEntry& entry, bool createMissing);

    /// Marks the study as known to the database, and adds an empty series for each one that only the database has but
    /// for reports, presentation states and segmentations. What the tree knows already stays as it is.
    void copyStudy(const Kxg::DicomDirectoryEntry& entry);

private:
    TagMap* makeImage(TagMap* series, const Kxg::ImageFile& file);

    StudyTree& mTree;
};

}  // namespace Kdd
