#include "platform/database/SearchColumns.h"

namespace Kxg
{

Column columnOf(SearchColumn column)
{
    switch (column) {
    case SearchColumn::StudyUID:
        return {"uid", Where::Study, nullptr};
    case SearchColumn::StudyDate:
        return {"study_date", Where::Study, nullptr};
    case SearchColumn::StudyTime:
        return {"study_time", Where::Study, nullptr};
    case SearchColumn::AccessionNumber:
        return {"accession_number", Where::Study, "accession_number"};
    case SearchColumn::ModalitiesInStudy:
        return {"modality", Where::Modality, nullptr};
    case SearchColumn::ReferringPhysician:
        return {nullptr, Where::Words, "referring_physician"};
    case SearchColumn::PatientName:
        return {"sort_name", Where::Words, "patient_name"};
    case SearchColumn::PatientID:
        return {"patient_id", Where::Study, "patient_id"};
    case SearchColumn::PatientBirthDate:
        return {"patient_birth_date", Where::Study, nullptr};
    case SearchColumn::PatientSex:
        return {"patient_sex", Where::Study, nullptr};
    case SearchColumn::StudyID:
        return {"study_code", Where::Study, "study_code"};
    case SearchColumn::StudyDescription:
        return {nullptr, Where::Words, "description"};
    case SearchColumn::SeriesUID:
        return {"uid", Where::Series, nullptr};
    case SearchColumn::Modality:
        return {"modality", Where::Series, nullptr};
    case SearchColumn::SeriesNumber:
        return {"number_text", Where::Series, nullptr};
    case SearchColumn::SeriesDescription:
        return {"description", Where::Series, nullptr};
    case SearchColumn::PerformedDate:
        return {"performed_date", Where::Series, nullptr};
    case SearchColumn::PerformedTime:
        return {"performed_time", Where::Series, nullptr};
    case SearchColumn::ScheduledStep:
        return {"scheduled_step", Where::Request, nullptr};
    case SearchColumn::RequestedProcedure:
        return {"requested_procedure", Where::Request, nullptr};
    case SearchColumn::SOPInstanceUID:
        return {"sop_uid", Where::Image, nullptr};
    }
    return {"uid", Where::Study, nullptr};
}

}  // namespace Kxg
