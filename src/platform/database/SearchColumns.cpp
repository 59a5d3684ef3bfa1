#include "platform/database/SearchColumns.h"

namespace Kxg
{

Column columnOf(SearchColumn column)
{
    switch (column) {
    case SearchColumn::StudyUID:
        return {"s.uid", Where::Study, nullptr};
    case SearchColumn::StudyDate:
        return {"s.study_date", Where::Study, nullptr};
    case SearchColumn::StudyTime:
        return {"s.study_time", Where::Study, nullptr};
    case SearchColumn::AccessionNumber:
        return {"s.accession_number", Where::Study, "accession_number"};
    case SearchColumn::ModalitiesInStudy:
        return {"m.modality", Where::Study, nullptr};
    case SearchColumn::ReferringPhysician:
        return {nullptr, Where::Words, "referring_physician"};
    case SearchColumn::PatientName:
        return {"s.sort_name", Where::Words, "patient_name"};
    case SearchColumn::PatientID:
        return {"s.patient_id", Where::Study, "patient_id"};
    case SearchColumn::PatientBirthDate:
        return {"s.patient_birth_date", Where::Study, nullptr};
    case SearchColumn::PatientSex:
        return {"s.patient_sex", Where::Study, nullptr};
    case SearchColumn::StudyID:
        return {"s.study_code", Where::Study, "study_code"};
    case SearchColumn::StudyDescription:
        return {nullptr, Where::Words, "description"};
    case SearchColumn::SeriesUID:
        return {"r.uid", Where::Series, nullptr};
    case SearchColumn::Modality:
        return {"r.modality", Where::Series, nullptr};
    case SearchColumn::SeriesNumber:
        return {"r.number_text", Where::Series, nullptr};
    case SearchColumn::SeriesDescription:
        return {"r.description", Where::Series, nullptr};
    case SearchColumn::PerformedDate:
        return {"r.performed_date", Where::Series, nullptr};
    case SearchColumn::PerformedTime:
        return {"r.performed_time", Where::Series, nullptr};
    case SearchColumn::ScheduledStep:
        return {"q.scheduled_step", Where::Request, nullptr};
    case SearchColumn::RequestedProcedure:
        return {"q.requested_procedure", Where::Request, nullptr};
    case SearchColumn::SOPInstanceUID:
        return {"f.sop_uid", Where::Series, nullptr};
    }
    return {"s.uid", Where::Study, nullptr};
}

}  // namespace Kxg
