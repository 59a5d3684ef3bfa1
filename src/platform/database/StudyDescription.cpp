#include "platform/database/StudyDescription.h"

#include "platform/database/SqlConnection.h"

namespace Kxg
{
namespace
{

/// Column and value in one place, so that a statement and what is bound to it cannot get out of step.
struct Attribute
{
    const char* column;
    QByteArray DicomFileRecord::*value;
};

const Attribute kStudyAttributes[] = {
    {"patient_name", &DicomFileRecord::patientName},
    {"patient_id", &DicomFileRecord::patientID},
    {"patient_birth_date", &DicomFileRecord::patientBirthDate},
    {"patient_sex", &DicomFileRecord::patientSex},
    {"study_date", &DicomFileRecord::studyDate},
    {"study_time", &DicomFileRecord::studyTime},
    {"study_description", &DicomFileRecord::studyDescription},
    {"accession_number", &DicomFileRecord::accessionNumber},
};

const Attribute kSeriesAttributes[] = {
    {"series_number", &DicomFileRecord::seriesNumber},
    {"series_description", &DicomFileRecord::seriesDescription},
    {"modality", &DicomFileRecord::modality},
    {"series_date", &DicomFileRecord::seriesDate},
    {"series_time", &DicomFileRecord::seriesTime},
    {"station_name", &DicomFileRecord::stationName},
};

template <size_t n>
QByteArray describing(const char* table, const Attribute (&attributes)[n])
{
    QByteArray sql = QByteArray("UPDATE ") + table + " SET is_described = 1";
    for (const Attribute& attribute : attributes)
        sql += QByteArray(", ") + attribute.column + " = ?";
    return sql + " WHERE id = ?";
}

template <size_t n>
QVariantList description(const DicomFileRecord& record, const Attribute (&attributes)[n], qint64 id)
{
    QVariantList values;
    for (const Attribute& attribute : attributes)
        values << textValue(record.*attribute.value);
    return values << id;
}

}  // namespace

void describeStudy(SqlConnection& connection, qint64 studyId, const DicomFileRecord& image)
{
    // One text for all calls, because statements are prepared once and kept by their texts.
    static const QByteArray kDescribe = describing("study", kStudyAttributes);
    connection.change(kDescribe, description(image, kStudyAttributes, studyId));
}

void describeSeries(SqlConnection& connection, qint64 seriesId, const DicomFileRecord& image)
{
    static const QByteArray kDescribe = describing("series", kSeriesAttributes);
    connection.change(kDescribe, description(image, kSeriesAttributes, seriesId));
}

}  // namespace Kxg
