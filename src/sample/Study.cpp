#include "sample/Study.h"

#include "sample/Dataset.h"
#include "sample/Random.h"

#include <dcmtk/config/osconfig.h>

#include <dcmtk/dcmdata/dcdeftag.h>
#include <dcmtk/dcmdata/dcuid.h>

#include <cmath>

namespace Kdd
{

const char* const kSampleDate = "20240517";

namespace
{

// Times are told in four decimals, and counted in whole steps so that no rounding shows.
constexpr qint64 kTicksPerSecond = 10000;

const SampleAttribute kVisit[] = {
    {DCM_InstitutionName, "Sample Clinic"},
    // Texts of this kind may have line ends.
    {DCM_InstitutionAddress, "1 Hospital Road\r\nNorthfield"},
    {DCM_InstitutionalDepartmentName, "Radiology"},
    {DCM_PhysiciansOfRecord, ""},
    {DCM_NameOfPhysiciansReadingStudy, "Reader^First\\Reader^Second"},
    {DCM_OperatorsName, "Operator^Olga"},
    {DCM_AdmittingDiagnosesDescription, ""},
    {DCM_RequestingService, "Outpatients"},
    {DCM_CurrentPatientLocation, "Ward 3"},
    {DCM_AdmissionID, ""},
    {DCM_TimezoneOffsetFromUTC, "+0200"},
};

const SampleCode kProtocol = {"P100", "99SAMPLE", "Routine protocol"};
const SampleCode kContrast = {"Q7", "99SAMPLE", "Is contrast agent to be given?"};
const SampleCode kNoContrast = {"A2", "99SAMPLE", "No, the kidneys do not allow it"};

// Its umlaut has other bytes in each of the two sets.
const char* const kNameBefore = "Unbekannt^Männlich";

// The name before the correction came from another system and kept that system's character set.
SampleCharset otherCharset(SampleCharset charset)
{
    return charset == SampleCharset::Utf8 ? SampleCharset::Latin1 : SampleCharset::Utf8;
}

}  // namespace

QByteArray SampleStudy::name(const QByteArray& part) const
{
    // Everything random is drawn by such a name, and UIDs are made of it.
    return part + " of " + directory.toLatin1() + " of " + QByteArray::number(seed);
}

QByteArray SampleStudy::uid(const QByteArray& part) const
{
    return sampleUid(name(part));
}

QByteArray SampleStudy::time(double second) const
{
    const qint64 ticks = startSecond * kTicksPerSecond + std::llround(second * kTicksPerSecond);
    // A series after midnight has a time of the same day; dates stay as they are.
    const qint64 clock = ticks / kTicksPerSecond % (24 * 60 * 60);
    const qint64 digits = clock / 3600 * 10000 + clock / 60 % 60 * 100 + clock % 60;
    return QByteArray::number(digits).rightJustified(6, '0') + '.' +
           QByteArray::number(ticks % kTicksPerSecond).rightJustified(4, '0');
}

QByteArray SampleStudy::accessionNumber() const
{
    return "A" + QByteArray::number(SampleRandom(name("accession")).between(1000000, 9999999));
}

void SampleStudy::describe(SampleDataset& dataset) const
{
    patient.describe(dataset);
    dataset.with(DCM_StudyInstanceUID, uid("study"))
        .with(DCM_StudyDate, kSampleDate)
        .with(DCM_StudyTime, time(0))
        .with(DCM_StudyID, accessionNumber().right(5))
        .with(DCM_StudyDescription, description)
        .with(DCM_AccessionNumber, accessionNumber())
        .with(DCM_RequestingPhysician, patient.physician)
        .withAll(kVisit);
    // Retired, and met in files all the same.
    dataset.item(DCM_ReferencedStudySequence)
        .with(DCM_ReferencedSOPClassUID, UID_RETIRED_DetachedStudyManagementSOPClass)
        .with(DCM_ReferencedSOPInstanceUID, uid("referenced study"));
}

void SampleStudy::describeRequest(SampleDataset& dataset) const
{
    const QByteArray step = "S" + accessionNumber().right(6);
    dataset.with(DCM_RequestedProcedureDescription, description)
        .with(DCM_PerformedProcedureStepStartDate, kSampleDate)
        .with(DCM_PerformedProcedureStepStartTime, time(0))
        .with(DCM_PerformedProcedureStepID, step)
        .with(DCM_PerformedProcedureStepDescription, description);
    dataset.withCode(DCM_ProcedureCodeSequence, kProtocol);

    // Sequences four deep inside each other, the same in all images of a study.
    SampleDataset request = dataset.item(DCM_RequestAttributesSequence);
    request.with(DCM_RequestedProcedureDescription, description)
        .with(DCM_ScheduledProcedureStepDescription, description)
        .with(DCM_ScheduledProcedureStepID, step)
        .with(DCM_RequestedProcedureID, accessionNumber());
    SampleDataset protocol = request.item(DCM_ScheduledProtocolCodeSequence)
                                 .with(DCM_CodeValue, kProtocol.value)
                                 .with(DCM_CodingSchemeDesignator, kProtocol.scheme)
                                 .with(DCM_CodeMeaning, kProtocol.meaning)
                                 .item(DCM_ProtocolContextSequence);
    protocol.with(DCM_ValueType, "CODE")
        .withCode(DCM_ConceptNameCodeSequence, kContrast)
        .withCode(DCM_ConceptCodeSequence, kNoContrast);
}

void SampleStudy::describeCorrection(SampleDataset& dataset) const
{
    const SampleCharset before = otherCharset(patient.charset);
    SampleDataset correction = dataset.item(DCM_OriginalAttributesSequence);
    correction.with(DCM_AttributeModificationDateTime, QByteArray(kSampleDate) + time(900))
        .with(DCM_ModifyingSystem, "SAMPLE ARCHIVE")
        .with(DCM_SourceOfPreviousValues, "")
        .with(DCM_ReasonForTheAttributeModification, "CORRECT");
    // Inside the item the texts are in the character set that the item names.
    correction.item(DCM_ModifiedAttributesSequence)
        .with(DCM_SpecificCharacterSet, specificCharacterSet(before))
        .with(DCM_PatientName, inCharset(before, kNameBefore))
        .with(DCM_PatientID, "UNKNOWN-" + patient.id);
}

}  // namespace Kdd
