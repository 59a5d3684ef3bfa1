#include "kddlib/tagfile/DatabaseValues.h"

#include "kddlib/tagfile/NodeAttributes.h"
#include "kddlib/tagfile/StudyTree.h"
#include "kddlib/tagmodel/OwnAttributes.h"
#include "kddlib/tagmodel/TagElement.h"
#include "kddlib/tagmodel/TagMap.h"
#include "kddlib/volumes/Volume.h"
#include "kddlib/volumes/VolumeLookup.h"
#include "platform/base/LogFile.h"
#include "platform/database/DirectoryEntry.h"
#include "platform/volumefile/VolumeFileName.h"

#include <dcmtk/dcmdata/dcdeftag.h>

#include <utility>

namespace Kdd
{

namespace
{

/// Which volume of its series the file of that name is. -1 for names of first parts: the first volume's file has no
/// part in its name.
int volumeIndexOf(const QByteArray& name)
{
    const int part = partNumberOf(name);
    if (part < 0)
        return 0;
    return part >= 2 ? part - 1 : -1;
}

/// Reports and documents that no viewer lists among the images.
bool isHidden(const QByteArray& modality)
{
    return modality == "SR" || modality == "PR" || modality == "SEG";
}

TagMap* makeSeries(const Kxg::DicomDirectoryEntry& entry)
{
    auto* series = new TagMap;
    const std::pair<DcmTagKey, QByteArray> values[] = {
        {DCM_SeriesInstanceUID, entry.seriesInstanceUID},
        {DCM_SeriesNumber, entry.seriesNumber},
        {DCM_SeriesDescription, entry.seriesDescription},
        {DCM_Modality, entry.modality},
        {DCM_SeriesDate, entry.seriesDate},
        // Times of the database may be written with colons, which DICOM's are not.
        {DCM_SeriesTime, QByteArray(entry.seriesTime).replace(":", "")},
        {DCM_StationName, entry.stationName},
    };
    for (const auto& value : values)
        series->putAndInsertString(value.first, value.second);
    return series;
}

/// An image without SOP Instance UID is known by its path.
QByteArray keyOf(const Kxg::ImageFile& file)
{
    return file.sopInstanceUID.isEmpty() ? forwardSlashes(file.path) : file.sopInstanceUID;
}

/// What an image says of its own file. As long as a series holds it for all its images, another one would inherit it.
const DcmTagKey kOfTheFile[] = {kFileSuffix, kTransferSyntax, kVolumeIndex, kPreview};

}  // namespace

TagMap* DatabaseValues::findImage(const StudyTree& tree, const Kxg::ImageFile& file)
{
    return tree.findImage(keyOf(file));
}

int DatabaseValues::addFilePaths(TagMap* series, const Kxg::SeriesInfo* info, bool createMissing,
                                 bool& complete)
{
    int count = 0;
    for (const Kxg::ImageFile& file : info != nullptr ? info->images : std::vector<Kxg::ImageFile>()) {
        TagMap* image = findImage(mTree, file);
        if (image == nullptr && createMissing)
            image = makeImage(series, file);
        if (image == nullptr) {
            LogFile::warnf("Image %s not found in tag map", keyOf(file).constData());
            complete = false;
            continue;
        }
        setFilePath(*image, file);
        ++count;
    }
    return count;
}

void DatabaseValues::setFilePath(TagMap& image, const Kxg::ImageFile& file)
{
    image.putAndInsertValue(kFilePath, VrCode::LO, forwardSlashes(file.path));
}

TagMap* DatabaseValues::makeImage(TagMap* series, const Kxg::ImageFile& file)
{
    for (const DcmTagKey& key : kOfTheFile) {
        if (series->tagsForLevel().contains(key))
            series->storeOptionA(key);
    }
    auto* image = new TagMap;
    if (!file.sopInstanceUID.isEmpty())
        image->putAndInsertString(DCM_SOPInstanceUID, file.sopInstanceUID);
    // Its pixels are in the file alone, as those of nearly every image.
    image->markAsOmitted(DCM_PixelData);
    // Appended and not attached: a first child would replace what the series says by what it has, which is nothing.
    series->appendChild(image);
    mTree.enterImage(keyOf(file), image);
    return image;
}

void DatabaseValues::addVolumeFilePath(TagMap* series, const Kxg::DicomDirectoryEntry& entry,
                                       bool createMissing)
{
    const bool isVolume = (entry.flags & Kxg::DicomDirectoryEntry::HasVolume) != 0 &&
                          entry.type != Kxg::DicomDirectoryEntry::DicomFile && !entry.name.isEmpty();
    const int index = isVolume ? volumeIndexOf(entry.name) : -1;
    if (index < 0)
        return;
    Volume* volume = volumeOfFile(*series, entry.name, index);
    if (volume == nullptr && createMissing) {
        // Volumes that other files should have given are missing. The
        // index is what counts, so this one keeps it.
        if (index != series->volumes().size())
            LogFile::warnf("Invalid volume index %d (expected %d) for %s", index, series->volumes().size(),
                           entry.name.constData());
        volume = new Volume(index);
        series->addBareVolume(volume);
    }
    if (volume != nullptr)
        volume->setVolumeFileName(entry.name);
    else
        LogFile::warnf("Volume %s not found in tag map", entry.name.constData());
}

/// The study's map stays, and with it every value that its images inherit: a map made from the database alone knows
/// only a few of them.
void DatabaseValues::copyStudy(const Kxg::DicomDirectoryEntry& entry)
{
    if (!mTree.isEmpty() && mTree.studyInstanceUID() != entry.studyInstanceUID) {
        LogFile::errorf("What the database says of study %s is no part of study %s",
                        entry.studyInstanceUID.constData(), mTree.studyInstanceUID().constData());
        return;
    }
    std::shared_ptr<TagMap> study = mTree.study();
    if (study == nullptr) {
        study = std::make_shared<TagMap>();
        study->putAndInsertString(DCM_StudyInstanceUID, entry.studyInstanceUID);
        mTree.enterStudy(entry.studyInstanceUID, study);
    }
    study->putAndInsertInt(kFromDatabase, 1);
    for (const Kxg::DicomDirectoryEntry& series : entry.entries) {
        if (isHidden(series.modality) || mTree.series().contains(series.seriesInstanceUID))
            continue;
        TagMap* made = makeSeries(series);
        // The new series is not to inherit what the study says for all those that were there.
        holdInSeries(*study);
        study->appendChild(made);
        mTree.enterSeries(series.seriesInstanceUID, made);
    }
}

}  // namespace Kdd
