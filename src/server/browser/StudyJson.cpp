#include "server/browser/StudyJson.h"

#include "server/browser/ShownValue.h"
#include "server/browser/VolumeJson.h"

#include <QJsonArray>

#include <dcmtk/dcmdata/dcdeftag.h>
#include <kddlib/OwnAttributes.h>
#include <kddlib/QAAudit.h>
#include <kddlib/TagElement.h>
#include <kddlib/TagFile.h>
#include <kddlib/TagMap.h>
#include <kddlib/Volume.h>

#include <algorithm>
#include <limits>

namespace Kdd::Browser
{
namespace
{

const DcmTagKey kStudyAttributes[] = {DCM_PatientName,
                                      DCM_PatientID,
                                      DCM_PatientBirthDate,
                                      DCM_PatientSex,
                                      DCM_PatientAge,
                                      DCM_StudyDate,
                                      DCM_StudyTime,
                                      DCM_StudyDescription,
                                      DCM_AccessionNumber,
                                      DCM_StudyID,
                                      DCM_ReferringPhysicianName};

const DcmTagKey kSeriesAttributes[] = {
    DCM_SeriesNumber, DCM_Modality,     DCM_SeriesDescription,     DCM_BodyPartExamined, DCM_SeriesDate,
    DCM_SeriesTime,   DCM_ProtocolName, DCM_ManufacturerModelName, DCM_StationName};

/// As searches show them, also where images differ.
template <size_t Count>
QJsonObject attributes(const TagMap& node, const DcmTagKey (&keys)[Count])
{
    QJsonObject object;
    const TagMap* const image = describingImage(node);
    const TagMap& shown = image == nullptr ? node : *image;
    for (const DcmTagKey& key : keys) {
        const QString text = shortValue(shown, key);
        if (!text.isEmpty())
            object.insert(keywordOf(shown, key), text);
    }
    return object;
}

/// Attributes, marks and what is the system's own left out.
int ownCount(const TagMap& node)
{
    const TagMap::Tags& tags = node.tagsForLevel();
    return static_cast<int>(std::count_if(tags.keyBegin(), tags.keyEnd(), [&](const DcmTagKey& key) {
        return key.getGroup() != 0x0006 && !tags.value(key)->markedAsMissing();
    }));
}

bool isSeries(const TagMap& node)
{
    return node.parent() != nullptr && node.parent()->parent() == nullptr;
}

int numberOf(const TagMap& node)
{
    int number = 0;
    // What has no number comes last.
    return node.findAndGetInt(isSeries(node) ? DCM_SeriesNumber : DCM_InstanceNumber, number)
               ? number
               : std::numeric_limits<int>::max();
}

QByteArray keyOf(const TagMap& node)
{
    return isSeries(node) ? node.uid(TagMap::SeriesLevel) : TagFile::imageKey(node);
}

bool hasPreview(const TagMap& image)
{
    const TagElement* preview = image.findElement(kPreview);
    return preview != nullptr && !preview->value().isEmpty();
}

int framesOf(const TagMap& image)
{
    int frames = 0;
    return image.findAndGetInt(DCM_NumberOfFrames, frames) && frames > 0 ? frames : 1;
}

QJsonObject entryOf(const TagMap& image)
{
    int rows = 0;
    return {{QStringLiteral("key"), QString::fromLatin1(publicKey(TagFile::imageKey(image)))},
            {QStringLiteral("number"), shortValue(image, DCM_InstanceNumber)},
            {QStringLiteral("preview"), hasPreview(image)},
            {QStringLiteral("pixels"), image.findAndGetInt(DCM_Rows, rows) && rows > 0},
            {QStringLiteral("frames"), framesOf(image)}};
}

QJsonObject seriesJson(TagMap& series)
{
    QJsonArray volumes;
    for (const Volume* volume : series.volumes())
        volumes.append(volumeJson(*volume));
    return {{QStringLiteral("key"), QString::fromLatin1(publicKey(keyOf(series)))},
            {QStringLiteral("label"), shortValue(series, kAbstract)},
            {QStringLiteral("images"), series.children().size()},
            {QStringLiteral("own"), ownCount(series)},
            {QStringLiteral("preview"), !series.findPreviewData(nullptr).isEmpty()},
            {QStringLiteral("attributes"), attributes(series, kSeriesAttributes)},
            {QStringLiteral("volumes"), volumes}};
}

}  // namespace

QVector<TagMap*> sortedChildren(const TagMap& node)
{
    struct Place
    {
        int number;
        QByteArray key;
        TagMap* child;
    };
    QVector<Place> places;
    for (TagMap* child : node.children())
        places.append({numberOf(*child), keyOf(*child), child});
    std::sort(places.begin(), places.end(), [](const Place& a, const Place& b) {
        return a.number != b.number ? a.number < b.number : a.key < b.key;
    });
    QVector<TagMap*> sorted;
    for (const Place& place : places)
        sorted.append(place.child);
    return sorted;
}

QJsonObject studyJson(const TagFile& file)
{
    const TagMap& study = *file.study();
    const TagFile::Statistics statistics = file.statistics();
    QJsonArray series;
    for (TagMap* one : sortedChildren(study))
        series.append(seriesJson(*one));
    const auto& images = file.imagesByUID();
    const bool isCorrected = std::any_of(images.begin(), images.end(), [](const TagMap* image) {
        return !AuditLog::keysIn(*image).isEmpty();
    });
    return {
        {QStringLiteral("study"), QString::fromLatin1(file.studyInstanceUID())},
        {QStringLiteral("images"), images.size()},
        {QStringLiteral("corrected"), isCorrected},
        {QStringLiteral("own"), ownCount(study)},
        {QStringLiteral("attributes"), attributes(study, kStudyAttributes)},
        {QStringLiteral("sizes"), QJsonObject{{QStringLiteral("tagFile"), statistics.storedSize},
                                              {QStringLiteral("uncompressed"), statistics.uncompressedSize},
                                              {QStringLiteral("previews"), statistics.blobBytes}}},
        {QStringLiteral("series"), series}};
}

QJsonObject imagesJson(const TagMap& series, int offset, int limit)
{
    const QVector<TagMap*> sorted = sortedChildren(series);
    QJsonArray images;
    for (const TagMap* image : sorted.mid(qMin(offset, sorted.size()), qBound(0, limit, kMaxListedImages)))
        images.append(entryOf(*image));
    return {{QStringLiteral("count"), sorted.size()},
            {QStringLiteral("offset"), offset},
            {QStringLiteral("images"), images}};
}

QJsonObject imageJson(const TagMap& image)
{
    const TagMap& series = *image.parent();
    const QVector<TagMap*> sorted = sortedChildren(series);
    const int position = static_cast<int>(std::find(sorted.begin(), sorted.end(), &image) - sorted.begin());
    const auto keyAt = [&](int place) {
        return place < 0 || place >= sorted.size()
                   ? QJsonValue()
                   : QJsonValue(QString::fromLatin1(publicKey(TagFile::imageKey(*sorted.at(place)))));
    };
    return {{QStringLiteral("study"), QString::fromLatin1(image.uid(TagMap::StudyLevel))},
            {QStringLiteral("series"), QString::fromLatin1(publicKey(keyOf(series)))},
            {QStringLiteral("key"), keyAt(position)},
            {QStringLiteral("position"), position},
            {QStringLiteral("count"), sorted.size()},
            {QStringLiteral("previous"), keyAt(position - 1)},
            {QStringLiteral("next"), keyAt(position + 1)},
            {QStringLiteral("image"), entryOf(image)},
            {QStringLiteral("own"), QJsonObject{{QStringLiteral("study"), ownCount(*series.parent())},
                                                {QStringLiteral("series"), ownCount(series)},
                                                {QStringLiteral("image"), ownCount(image)}}}};
}

}  // namespace Kdd::Browser
