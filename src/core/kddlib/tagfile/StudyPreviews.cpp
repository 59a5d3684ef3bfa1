#include "kddlib/tagfile/StudyPreviews.h"

#include "kddlib/net/dicom/RemoteDicom.h"
#include "kddlib/net/http/ObjectAddress.h"
#include "kddlib/previews/PreviewGenerator.h"
#include "kddlib/previews/QuadrantNavigation.h"
#include "kddlib/tagfile/StudyTree.h"
#include "kddlib/tagfile/TagFileSettings.h"
#include "kddlib/tagmodel/OwnAttributes.h"
#include "kddlib/tagmodel/TagElement.h"
#include "kddlib/tagmodel/TagMap.h"
#include "kddlib/volumes/Volume.h"
#include "platform/base/LogFile.h"
#include "platform/late/LateLibrary.h"
#include "platform/os/PathName.h"
#include "platform/volume/KxVolumeInfo.h"

#include <QCryptographicHash>
#include <QDir>
#include <QFile>
#include <QHash>
#include <QImage>

#include <dcmtk/dcmdata/dcdeftag.h>
#include <dcmtk/dcmdata/dcfilefo.h>

#include <algorithm>

namespace Kdd
{

namespace
{

// Of more images a user sees nothing in a row of small pictures, and the pictures outweigh all the rest of a tag file.
constexpr int kLongSeries = 20;
// Enough to tell the studies of one folder apart; the names stay short.
constexpr int kHashBytes = 4;

const char* const kNotCreated = "Could not create preview image for DICOM file: %s (%s)";

using Images = QVector<const TagMap*>;

/// The images of a series that no volume shows, by kind.
struct ImageKinds
{
    Images multiFrame;
    Images ultrasound;
    Images secondaryCapture;
    Images localizer;
    Images ordinary;
};

QByteArray textOf(const TagMap& node, const DcmTagKey& key)
{
    QByteArray text;
    node.findAndGetString(key, text);
    return text;
}

int numberOf(const TagMap& node, const DcmTagKey& key)
{
    int number = 0;
    node.findAndGetInt(key, number);
    return number;
}

/// Pixel data that is too long to be kept counts too: its marker is found.
bool hasPixelData(const TagMap& image)
{
    const DcmTagKey keys[] = {DCM_PixelData, DCM_FloatPixelData, DCM_DoubleFloatPixelData};
    return std::any_of(std::begin(keys), std::end(keys),
                       [&](const DcmTagKey& key) { return image.findElement(key) != nullptr; });
}

bool isLocalizer(const TagMap& image)
{
    if (textOf(image, DCM_ImageType).contains("LOCALIZER"))
        return true;
    if (textOf(image, DCM_Modality) != "MR")
        return false;
    // Localizers of MR may say so in the description alone.
    const QByteArray description = textOf(image, DCM_SeriesDescription).toUpper();
    return description.contains("LOC") || description.contains("SCOUT");
}

/// Storage classes are told apart by how their UIDs begin, so that retired and multi-frame ones are among them.
Images& kindOf(const TagMap& image, ImageKinds& kinds)
{
    if (numberOf(image, DCM_NumberOfFrames) > 1)
        return kinds.multiFrame;
    const QByteArray sopClass = textOf(image, DCM_SOPClassUID);
    if (sopClass.startsWith("1.2.840.10008.5.1.4.1.1.6"))
        return kinds.ultrasound;
    if (sopClass.startsWith("1.2.840.10008.5.1.4.1.1.7"))
        return kinds.secondaryCapture;
    return isLocalizer(image) ? kinds.localizer : kinds.ordinary;
}

ImageKinds kindsIn(const TagMap& series)
{
    ImageKinds kinds;
    for (const TagMap* image : series.children()) {
        // An image of a volume is shown by that one's preview.
        if (image->findElement(kVolumeIndex) == nullptr && hasPixelData(*image))
            kindOf(*image, kinds).append(image);
    }
    return kinds;
}

/// The one in the middle by Instance Number; none of none.
Images middleOf(Images images)
{
    if (images.isEmpty())
        return {};
    // Read once: the search asks for each many times.
    QHash<const TagMap*, int> numbers;
    for (const TagMap* image : qAsConst(images))
        numbers.insert(image, numberOf(*image, DCM_InstanceNumber));
    const auto middle = images.begin() + images.size() / 2;
    std::nth_element(images.begin(), middle, images.end(),
                     [&](const TagMap* a, const TagMap* b) { return numbers.value(a) < numbers.value(b); });
    return {*middle};
}

Images selectedOf(const ImageKinds& kinds)
{
    return kinds.multiFrame + middleOf(kinds.ultrasound) + middleOf(kinds.secondaryCapture) +
           middleOf(kinds.localizer) +
           (kinds.ordinary.size() < kLongSeries ? kinds.ordinary : middleOf(kinds.ordinary));
}

/// Gives every file a name of its own: a number that comes again is followed by how often it came.
class NameNumbers
{
public:
    QString take(int number)
    {
        const int count = ++mCounts[number];
        const QString name = QString::number(number);
        return count == 1 ? name : name + QLatin1Char('_') + QString::number(count);
    }

private:
    QHash<int, int> mCounts;
};

bool saveJpeg(const QByteArray& jpeg, const QString& path)
{
    if (QImage::fromData(jpeg).save(path))
        return true;
    LogFile::warnf("Error exporting preview %s", qUtf8Printable(path));
    return false;
}

int exportSeries(TagMap& series, const QString& seriesName)
{
    int count = 0;
    NameNumbers numbers;
    for (TagMap* image : series.children()) {
        const QByteArray preview = image->findPreviewData(nullptr);
        if (preview.isEmpty())
            continue;
        const QString number = numbers.take(numberOf(*image, DCM_InstanceNumber));
        count += saveJpeg(preview, seriesName + QStringLiteral("_Image_%1.jpg").arg(number));
    }
    for (int i = 0; i < series.volumes().size(); ++i) {
        const Volume* volume = series.volumes().at(i);
        if (volume->hasPreview())
            count +=
                saveJpeg(volume->previewData(), seriesName + QStringLiteral("_Volume_%1.jpg").arg(i + 1));
    }
    return count;
}

/// Of the hash that gives the study's tag file its place.
QString studyPrefix(const QByteArray& studyUID)
{
    const QByteArray hash = QCryptographicHash::hash(studyUID + '\n', QCryptographicHash::Md5);
    return QString::fromLatin1(hash.left(kHashBytes).toHex());
}

}  // namespace

// Here, because the configured size is the tag file's and previews know nothing of tag files.
QImage PreviewGenerator::createPreviewImage(OrlanMesh* mesh, const TypedData2D& frame)
{
    if (frame.isEmpty())
        return {};
    const Vec2i size = TagFileSettings::previewSize();
    return convertToQImage(KxVolumeInfo::fromFrame(mesh, frame).get(), size.x, size.y);
}

QList<QByteArray> selectPreviewImages(const StudyTree& tree)
{
    QList<QByteArray> keys;
    for (const TagMap* series : tree.series()) {
        for (const TagMap* image : selectedOf(kindsIn(*series)))
            keys.append(StudyTree::imageKey(*image));
    }
    return keys;
}

bool addPreview(TagMap* image, DcmDataset* dataset, const QString& path)
{
    if (image == nullptr)
        return false;
    if (const Result loaded = loadLate(LateLibrary::Pictures); loaded.bad()) {
        LogFile::warnf(kNotCreated, qUtf8Printable(path), qUtf8Printable(loaded.text()));
        return false;
    }
    const Vec2i size = TagFileSettings::previewSize();
    QString reason;
    const QImage preview = PreviewGenerator::createPreviewImage(
        dataset, static_cast<unsigned long>(size.x), static_cast<unsigned long>(size.y), path, &reason);
    if (preview.isNull()) {
        LogFile::warnf(kNotCreated, qUtf8Printable(path), qUtf8Printable(reason));
        return false;
    }
    const QByteArray jpeg = PreviewGenerator::createPreviewData(preview);
    if (jpeg.isEmpty())
        return false;
    image->putAndInsertValue(kPreview, VrCode::OB, jpeg);
    // While the picture is at hand; of anything but a mammogram nothing is stored.
    QuadrantNavigation::process(preview, *image);
    return true;
}

bool addPreview(TagMap* image, const QByteArray& file)
{
    if (image == nullptr)
        return false;
    DcmFileFormat format;
    // Of many frames behind a URL the one that is shown is fetched.
    const OFCondition condition = loadDicomHeader(file, format, kRemotePicture);
    const QByteArray shown = shownAddress(file);
    if (condition.bad()) {
        LogFile::warnf(kNotCreated, shown.constData(), condition.text());
        return false;
    }
    return addPreview(image, format.getDataset(), pathText(shown));
}

bool addPreview(const StudyTree& tree, DcmDataset* dataset, const QString& path)
{
    DcmElement* element = nullptr;
    if (dataset == nullptr || dataset->findAndGetElement(DCM_SOPInstanceUID, element).bad())
        return false;
    // By way of a map, which also knows UIDs that a writer stored without their VR.
    TagMap uid;
    uid.setElement(element);
    return addPreview(tree.findImage(uid.uid(TagMap::ImageLevel)), dataset, path);
}

int exportPreviews(const StudyTree& tree, const QString& folder)
{
    if (const Result loaded = loadLate(LateLibrary::Pictures); loaded.bad()) {
        LogFile::errorf("Previews cannot be written to %s: %s", qUtf8Printable(folder),
                        qUtf8Printable(loaded.text()));
        return 0;
    }
    QString prefix = folder.isEmpty() ? QDir::currentPath() : folder;
    if (!prefix.endsWith(QLatin1Char('/')))
        prefix += QLatin1Char('/');
    int count = 0;
    for (auto study = tree.studies().cbegin(); study != tree.studies().cend(); ++study) {
        NameNumbers numbers;
        for (TagMap* series : study.value()->children()) {
            const QString number = numbers.take(numberOf(*series, DCM_SeriesNumber));
            count += exportSeries(*series,
                                  prefix + studyPrefix(study.key()) + QStringLiteral("_Series_") + number);
        }
    }
    if (count > 0)
        LogFile::printf("%d preview image(s) written to %s", count, qUtf8Printable(prefix));
    else
        LogFile::printf("No preview image written");
    return count;
}

}  // namespace Kdd
