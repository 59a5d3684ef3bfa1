#include "kddlib/tagfile/NodeAttributes.h"
#include "kddlib/tagfile/TagFile.h"
#include "kddlib/tagmodel/OwnAttributes.h"
#include "kddlib/tagmodel/TagElement.h"
#include "kddlib/tagmodel/TagMap.h"
#include "kddlib/volumes/Volume.h"
#include "kddlib/volumes/VolumeLookup.h"
#include "platform/base/LogFile.h"
#include "platform/database/DirectoryEntry.h"
#include "platform/volumefile/VolumeFileName.h"

#include <QHash>
#include <QSet>

#include <dcmtk/dcmdata/dcdeftag.h>

#include <algorithm>
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

bool showsPixels(const TagMap* image)
{
    return image->findElement(DCM_PixelData) != nullptr ||
           image->findElement(DCM_FloatPixelData) != nullptr ||
           image->findElement(DCM_DoubleFloatPixelData) != nullptr;
}

/// What an image says of its own file. As long as a series holds it for all its images, another one would inherit it.
const DcmTagKey kOfTheFile[] = {kFileSuffix, kTransferSyntax, kVolumeIndex, kPreview};

/// A series as the user knows it: its number and what it shows.
QByteArray labelOf(const TagMap& series)
{
    const bool hasPixels = std::any_of(series.children().begin(), series.children().end(), showsPixels);
    int number = 0;
    QByteArray label;
    if (series.findAndGetInt(DCM_SeriesNumber, number))
        label = QByteArray::number(number);
    for (const DcmTagKey& key :
         {DCM_SeriesDescription, DCM_ProtocolName, DCM_BodyPartExamined, DCM_Modality}) {
        QByteArray text;
        // Of a report or a plan the kind says more than what was written into its description.
        if ((hasPixels || key == DCM_Modality) && series.findAndGetString(key, text) &&
            !text.trimmed().isEmpty())
            return (label + ' ' + text.trimmed()).trimmed();
    }
    return label.isEmpty() ? QByteArrayLiteral("Series") : label;
}

}  // namespace

TagMap* TagFile::findImage(const Kxg::ImageFile& file) const
{
    return findImage(keyOf(file));
}

int TagFile::addDicomFilePaths(TagMap* series, const Kxg::SeriesInfo* info, bool createMissing,
                               bool& complete)
{
    int count = 0;
    for (const Kxg::ImageFile& file : info != nullptr ? info->images : std::vector<Kxg::ImageFile>()) {
        TagMap* image = findImage(file);
        if (image == nullptr && createMissing)
            image = makeImage(series, file);
        if (image == nullptr) {
            LogFile::warnf("Image %s not found in tag map", keyOf(file).constData());
            complete = false;
            continue;
        }
        image->putAndInsertValue(kFilePath, VrCode::LO, forwardSlashes(file.path));
        ++count;
    }
    return count;
}

TagMap* TagFile::makeImage(TagMap* series, const Kxg::ImageFile& file)
{
    for (const DcmTagKey& key : kOfTheFile) {
        if (series->tagsForLevel().contains(key))
            series->storeOptionA(key);
    }
    auto* image = new TagMap;
    if (!file.sopInstanceUID.isEmpty())
        image->putAndInsertString(DCM_SOPInstanceUID, file.sopInstanceUID);
    image->markAsOmitted(DCM_PixelData);
    series->appendChild(image);
    mImages.insert(keyOf(file), image);
    return image;
}

void TagFile::addVolumeFilePath(TagMap* series, const Kxg::DicomDirectoryEntry& entry, bool createMissing)
{
    const bool isVolume = (entry.flags & Kxg::DicomDirectoryEntry::HasVolume) != 0 &&
                          entry.type != Kxg::DicomDirectoryEntry::DicomFile && !entry.name.isEmpty();
    const int index = isVolume ? volumeIndexOf(entry.name) : -1;
    if (index < 0)
        return;
    Volume* volume = volumeOfFile(*series, entry.name, index);
    if (volume == nullptr && createMissing) {
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
void TagFile::copyDatabaseValuesIntoTagMap(const Kxg::DicomDirectoryEntry& entry)
{
    if (!isEmpty() && studyInstanceUID() != entry.studyInstanceUID) {
        LogFile::errorf("What the database says of study %s is no part of study %s",
                        entry.studyInstanceUID.constData(), studyInstanceUID().constData());
        return;
    }
    std::shared_ptr<TagMap>& study = mStudies[entry.studyInstanceUID];
    if (study == nullptr) {
        study = std::make_shared<TagMap>();
        study->putAndInsertString(DCM_StudyInstanceUID, entry.studyInstanceUID);
    }
    study->putAndInsertInt(kFromDatabase, 1);
    for (const Kxg::DicomDirectoryEntry& series : entry.entries) {
        if (isHidden(series.modality) || mSeries.contains(series.seriesInstanceUID))
            continue;
        TagMap* made = makeSeries(series);
        holdInSeries(*study);
        study->appendChild(made);
        mSeries.insert(series.seriesInstanceUID, made);
    }
}

/// Series of the same label are told apart by their place among those, in the order of their UIDs.
void TagFile::createAbstractTags()
{
    QMap<QByteArray, QByteArray> labels;
    QHash<QByteArray, int> sharing;
    for (auto it = mSeries.cbegin(); it != mSeries.cend(); ++it) {
        labels.insert(it.key(), labelOf(*it.value()));
        ++sharing[labels.value(it.key())];
    }
    QSet<QByteArray> taken;
    for (auto it = sharing.cbegin(); it != sharing.cend(); ++it)
        taken.insert(it.key());
    QHash<QByteArray, int> counts;
    for (auto it = mSeries.cbegin(); it != mSeries.cend(); ++it) {
        QByteArray label = labels.value(it.key());
        if (sharing.value(label) > 1) {
            const QByteArray shared = label;
            do
                label = shared + " (" + QByteArray::number(++counts[shared]) + ')';
            while (taken.contains(label));
            taken.insert(label);
        }
        it.value()->putAndInsertValue(kAbstract, VrCode::LO, label);
    }
}

}  // namespace Kdd
