#include "kddlib/tagmodel/FormerKeywords.h"

#include <QHash>

namespace Kdd
{

namespace
{

struct Row
{
    const char* former;
    const char* current;
};

// Paths and queries that programs have stored outlive the dictionary they were written with. Since then DICOM
// has dropped the possessive forms and unified how units, dates and compound words are spelt.
constexpr Row kRows[] = {
    {"ReferringPhysiciansName", "ReferringPhysicianName"},
    {"ReferringPhysiciansAddress", "ReferringPhysicianAddress"},
    {"ReferringPhysiciansTelephoneNumbers", "ReferringPhysicianTelephoneNumbers"},
    {"ManufacturersModelName", "ManufacturerModelName"},
    {"ReferencedGrayscalePresentationStateSequence", "ReferencedPresentationStateSequence"},
    {"PatientsName", "PatientName"},
    {"PatientsBirthDate", "PatientBirthDate"},
    {"PatientsBirthTime", "PatientBirthTime"},
    {"PatientsSex", "PatientSex"},
    {"PatientsInsurancePlanCodeSequence", "PatientInsurancePlanCodeSequence"},
    {"PatientsPrimaryLanguageCodeSequence", "PatientPrimaryLanguageCodeSequence"},
    {"PatientsPrimaryLanguageModifierCodeSequence", "PatientPrimaryLanguageModifierCodeSequence"},
    {"PatientsMothersBirthName", "PatientMotherBirthName"},
    {"PatientsTelephoneNumbers", "PatientTelephoneNumbers"},
    {"PatientsReligiousPreference", "PatientReligiousPreference"},
    {"PatientsSexNeutered", "PatientSexNeutered"},
    {"DeIdentificationMethod", "DeidentificationMethod"},
    {"DeIdentificationMethodCodeSequence", "DeidentificationMethodCodeSequence"},
    {"InterventionDrugSequence", "InterventionDrugCodeSequence"},
    {"SecondaryCaptureDeviceManufacturers", "SecondaryCaptureDeviceManufacturer"},
    {"SecondaryCaptureDeviceManufacturersModelName", "SecondaryCaptureDeviceManufacturerModelName"},
    {"RETIRED_HardcopyDeviceManufacturersModelName", "RETIRED_HardcopyDeviceManufacturerModelName"},
    {"ExposureInMicroAs", "ExposureInuAs"},
    {"DBDt", "dBdt"},
    {"DetectorManufacturersModelName", "DetectorManufacturerModelName"},
    {"ExposureTimeInMicroS", "ExposureTimeInuS"},
    {"XRayTubeCurrentInMicroA", "XRayTubeCurrentInuA"},
    {"SpatialPreSaturation", "SpatialPresaturation"},
    {"DeCoupling", "Decoupling"},
    {"DeCoupledNucleus", "DecoupledNucleus"},
    {"DeCouplingFrequency", "DecouplingFrequency"},
    {"DeCouplingMethod", "DecouplingMethod"},
    {"DeCouplingChemicalShiftReference", "DecouplingChemicalShiftReference"},
    {"RETIRED_ChemicalShiftsMinimumIntegrationLimitInHz", "RETIRED_ChemicalShiftMinimumIntegrationLimitInHz"},
    {"RETIRED_ChemicalShiftsMaximumIntegrationLimitInHz", "RETIRED_ChemicalShiftMaximumIntegrationLimitInHz"},
    {"ChemicalShiftsMinimumIntegrationLimitInPpm", "ChemicalShiftMinimumIntegrationLimitInppm"},
    {"ChemicalShiftsMaximumIntegrationLimitInPpm", "ChemicalShiftMaximumIntegrationLimitInppm"},
    {"ExposureTimeInMs", "ExposureTimeInms"},
    {"XRayTubeCurrentInMA", "XRayTubeCurrentInmA"},
    {"ExposureInMAs", "ExposureInmAs"},
    {"DCM_RETIRED_Attribute00189445UsedInadvertentlyInAProduct", "(deleted)"},
    {"ExclusionStartDateTime", "ExclusionStartDatetime"},
    {"RETIRED_LookupTableNumber", "RETIRED_LUTNumber"},
    {"RETIRED_Attribute00280020UsedInadvertentlyInAProduct", "(deleted)"},
    {"ImplantPresent", "BreastImplantPresent"},
    {"FrameNumbersOfInterestFOI", "FrameNumbersOfInterest"},
    {"FramesOfInterestDescription", "FrameOfInterestDescription"},
    {"IssuerOfAdmissionID", "RETIRED_IssuerOfAdmissionID"},
    {"PatientsInstitutionResidence", "PatientInstitutionResidence"},
    {"ScheduledPerformingPhysiciansName", "ScheduledPerformingPhysicianName"},
    {"SpecimenAccessionNumber", "RETIRED_SpecimenAccessionNumber"},
    {"SpecimenSequence", "RETIRED_SpecimenSequence"},
    {"SlideIdentifier", "RETIRED_SlideIdentifier"},
    {"PersonsAddress", "PersonAddress"},
    {"PersonsTelephoneNumbers", "PersonTelephoneNumbers"},
    {"OrderEnterersLocation", "OrderEntererLocation"},
    {"ScheduledProcedureStepStartDateAndTime", "ScheduledProcedureStepModificationDateTime"},
    {"ExpectedCompletionDateAndTime", "ExpectedCompletionDateTime"},
    {"HumanPerformersOrganization", "HumanPerformerOrganization"},
    {"HumanPerformersName", "HumanPerformerName"},
    {"EntranceDoseInMGy", "EntranceDoseInmGy"},
    {"IntermarkerDistance", "InterMarkerDistance"},
    {"ContentCreatorsName", "ContentCreatorName"},
    {"ContentCreatorsIdentificationCodeSequence", "ContentCreatorIdentificationCodeSequence"},
    {"3DRenderingType", "ThreeDRenderingType"},
    {"UPSProgressInformationSequence", "UnifiedProcedureStepProgressInformationSequence"},
    {"UPSPerformedProcedureSequence", "UnifiedProcedureStepPerformedProcedureSequence"},
    {"UPSListStatus", "UnifiedProcedureStepListStatus"},
    {"SOPAuthorizationDateAndTime", "SOPAuthorizationDateTime"},
};

QHash<QByteArray, const char*> tableOfRows()
{
    QHash<QByteArray, const char*> table;
    for (const Row& row : kRows)
        table.insert(row.former, row.current);
    return table;
}

}  // namespace

const char* currentKeyword(const QByteArray& formerKeyword)
{
    static const QHash<QByteArray, const char*> table = tableOfRows();
    return table.value(formerKeyword, nullptr);
}

}  // namespace Kdd
