#include "kddlib/tagfile/SearchAttributes.h"

#include "kddlib/items/DicomJson.h"
#include "kddlib/items/TextDecoding.h"
#include "kddlib/tagmodel/TagMap.h"
#include "kddlib/tagmodel/TagSequence.h"
#include "platform/database/SearchText.h"

#include <QJsonArray>
#include <QJsonDocument>
#include <QJsonObject>

#include <dcmtk/dcmdata/dcdeftag.h>

#include <algorithm>
#include <iterator>
#include <sstream>

namespace Kdd
{

namespace
{

// What an answer may show of each level, if the image says it: what is the same throughout the level.

const DcmTagKey kStudyKeys[] = {
    DCM_SpecificCharacterSet,
    DCM_StudyDate,
    DCM_StudyTime,
    DCM_AccessionNumber,
    DCM_IssuerOfAccessionNumberSequence,
    DCM_ReferringPhysicianName,
    DCM_ReferringPhysicianIdentificationSequence,
    DCM_ConsultingPhysicianName,
    DCM_TimezoneOffsetFromUTC,
    DCM_StudyDescription,
    DCM_ProcedureCodeSequence,
    DCM_PhysiciansOfRecord,
    DCM_NameOfPhysiciansReadingStudy,
    DCM_AdmittingDiagnosesDescription,
    DCM_ReferencedStudySequence,
    DCM_ReferencedPatientSequence,
    DCM_PatientName,
    DCM_PatientID,
    DCM_IssuerOfPatientID,
    DCM_IssuerOfPatientIDQualifiersSequence,
    DCM_PatientBirthDate,
    DCM_PatientBirthTime,
    DCM_PatientSex,
    DCM_OtherPatientIDsSequence,
    DCM_OtherPatientNames,
    DCM_PatientAge,
    DCM_PatientSize,
    DCM_PatientWeight,
    DCM_PatientSpeciesDescription,
    DCM_PatientBreedDescription,
    DCM_ResponsiblePerson,
    DCM_EthnicGroup,
    DCM_Occupation,
    DCM_AdditionalPatientHistory,
    DCM_PatientComments,
    DCM_PatientIdentityRemoved,
    DCM_DeidentificationMethod,
    DCM_StudyInstanceUID,
    DCM_StudyID,
    DCM_ReasonForPerformedProcedureCodeSequence,
    DCM_RequestingService,
};

const DcmTagKey kSeriesKeys[] = {
    DCM_SpecificCharacterSet,
    DCM_SeriesDate,
    DCM_SeriesTime,
    DCM_Modality,
    DCM_Manufacturer,
    DCM_InstitutionName,
    DCM_InstitutionAddress,
    DCM_TimezoneOffsetFromUTC,
    DCM_StationName,
    DCM_SeriesDescription,
    DCM_SeriesDescriptionCodeSequence,
    DCM_InstitutionalDepartmentName,
    DCM_PerformingPhysicianName,
    DCM_OperatorsName,
    DCM_ManufacturerModelName,
    DCM_ReferencedPerformedProcedureStepSequence,
    DCM_BodyPartExamined,
    DCM_DeviceSerialNumber,
    DCM_SoftwareVersions,
    DCM_ProtocolName,
    DCM_PatientPosition,
    DCM_StudyInstanceUID,
    DCM_SeriesInstanceUID,
    DCM_SeriesNumber,
    DCM_Laterality,
    DCM_FrameOfReferenceUID,
    DCM_PositionReferenceIndicator,
    DCM_PerformedProcedureStepStartDate,
    DCM_PerformedProcedureStepStartTime,
    DCM_PerformedProcedureStepEndDate,
    DCM_PerformedProcedureStepEndTime,
    DCM_PerformedProcedureStepID,
    DCM_PerformedProcedureStepDescription,
    DCM_PerformedProtocolCodeSequence,
    DCM_RequestAttributesSequence,
    DCM_CommentsOnThePerformedProcedureStep,
};

QByteArray textOf(const TagMap& map, const DcmTagKey& key, const QByteArray& characterSet)
{
    QByteArray bytes;
    map.findAndGetString(key, bytes);
    return decodeText(bytes, characterSet).trimmed().toUtf8();
}

/// The texts of one image in UTF-8.
class Texts
{
public:
    explicit Texts(const TagMap& image)
        : mImage(image)
    {
        image.findAndGetString(DCM_SpecificCharacterSet, mCharacterSet);
    }

    QByteArray operator()(const DcmTagKey& key) const { return textOf(mImage, key, mCharacterSet); }
    QByteArray of(const TagMap& item, const DcmTagKey& key) const { return textOf(item, key, mCharacterSet); }

private:
    const TagMap& mImage;
    QByteArray mCharacterSet;
};

QJsonObject withoutOmitted(const QJsonObject& object);

/// The items of a sequence without what the tag file left out: of a study or series that has no address.
QJsonObject elementWithoutOmitted(QJsonObject element)
{
    if (element.value(QLatin1String("vr")) != QLatin1String("SQ"))
        return element;
    QJsonArray items;
    for (const QJsonValue& item : element.value(QLatin1String("Value")).toArray())
        items.append(withoutOmitted(item.toObject()));
    if (!items.isEmpty())
        element.insert(QLatin1String("Value"), items);
    return element;
}

QJsonObject withoutOmitted(const QJsonObject& object)
{
    QJsonObject kept;
    for (auto it = object.begin(); it != object.end(); ++it) {
        const QJsonObject element = it.value().toObject();
        if (!element.contains(QLatin1String("BulkDataURI")))
            kept.insert(it.key(), elementWithoutOmitted(element));
    }
    return kept;
}

/// The attributes as answers show them, a line for each.
template <size_t n>
QByteArray attributeLines(const TagMap& image, const DcmTagKey (&keys)[n])
{
    TagMap chosen;
    for (const DcmTagKey& key : keys) {
        const TagElement* element = image.findElement(key);
        if (element != nullptr && !element->markedAsOmitted())
            chosen.putElement(key, element->clone());
    }
    std::ostringstream json;
    writeDicomJson(json, chosen, std::string());
    const QByteArray text = QByteArray::fromStdString(json.str());
    const QJsonObject object = withoutOmitted(QJsonDocument::fromJson(text).object());
    QByteArray lines;
    for (auto it = object.begin(); it != object.end(); ++it) {
        // An attribute without value says nothing here, and there are viewers that fall over one.
        const QJsonObject element = it.value().toObject();
        if (element.contains(QLatin1String("Value")))
            lines += it.key().toLatin1() + QJsonDocument(element).toJson(QJsonDocument::Compact) + '\n';
    }
    return lines;
}

/// Each request once.
QVector<QPair<QByteArray, QByteArray>> requestsOf(const TagMap& image, const Texts& text)
{
    QVector<QPair<QByteArray, QByteArray>> requests;
    const TagElement* element = image.findElement(DCM_RequestAttributesSequence);
    if (element == nullptr || !element->isSequence())
        return requests;
    const auto& sequence = static_cast<const TagSequence&>(*element);
    for (int i = 0; i < sequence.numItems(); ++i) {
        const TagMap& item = sequence.itemToRead(i);
        const QPair<QByteArray, QByteArray> request(text.of(item, DCM_ScheduledProcedureStepID),
                                                    text.of(item, DCM_RequestedProcedureID));
        if (!requests.contains(request))
            requests.append(request);
    }
    return requests;
}

Kxg::SeriesSearchRecord seriesRecord(const TagMap& image)
{
    const Texts text(image);
    Kxg::SeriesSearchRecord series;
    series.uid = image.uid(TagMap::SeriesLevel);
    series.modality = text(DCM_Modality);
    series.number = text(DCM_SeriesNumber);
    series.description = text(DCM_SeriesDescription);
    series.performedDate = Kxg::searchDate(text(DCM_PerformedProcedureStepStartDate));
    series.performedTime = Kxg::searchTime(text(DCM_PerformedProcedureStepStartTime));
    series.requests = requestsOf(image, text);
    series.instances = image.parent() != nullptr ? image.parent()->children().size() : 0;
    series.attributes = attributeLines(image, kSeriesKeys);
    return series;
}

}  // namespace

Kxg::StudySearchRecord searchRecord(const FirstImages& images)
{
    Kxg::StudySearchRecord study;
    if (images.isEmpty())
        return study;
    const TagMap& first = *images.first();
    const Texts text(first);
    study.date = Kxg::searchDate(text(DCM_StudyDate));
    study.time = Kxg::searchTime(text(DCM_StudyTime));
    study.accessionNumber = text(DCM_AccessionNumber);
    study.referringPhysician = text(DCM_ReferringPhysicianName);
    study.patientName = text(DCM_PatientName);
    study.patientID = text(DCM_PatientID);
    study.patientBirthDate = Kxg::searchDate(text(DCM_PatientBirthDate));
    study.patientSex = text(DCM_PatientSex);
    study.studyID = text(DCM_StudyID);
    study.description = text(DCM_StudyDescription);
    study.attributes = attributeLines(first, kStudyKeys);
    for (const TagMap* image : images)
        study.series.push_back(seriesRecord(*image));
    return study;
}

bool isKeptOfStudy(const DcmTagKey& key)
{
    return std::find(std::begin(kStudyKeys), std::end(kStudyKeys), key) != std::end(kStudyKeys);
}

bool isKeptOfSeries(const DcmTagKey& key)
{
    return std::find(std::begin(kSeriesKeys), std::end(kSeriesKeys), key) != std::end(kSeriesKeys);
}

}  // namespace Kdd
