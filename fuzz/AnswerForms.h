#pragma once

#include <QByteArray>
#include <QVector>

#include <dcmtk/config/osconfig.h>

#include <dcmtk/dcmdata/dctagkey.h>
#include <nlohmann/json.hpp>

class DcmDataset;

namespace Kdd::Dimse
{
struct QueryIdentifier;
}

namespace Kdd
{

// The forms in which answers leave, read by others than made them. What does not hold ends the process.

/// JSON, whose texts have to be UTF-8.
nlohmann::json readJson(const QByteArray& text);

/// Of eight hexadecimal digits.
DcmTagKey keyOf(const QByteArray& digits);

/// A value of the DICOM JSON model as it is asked for; person names with all their groups.
QByteArray textOf(const nlohmann::json& value);

/// Whether two elements of that model say the same; numbers need not be written alike, and which character set a text was in
/// and where values are that were left out does not count.
bool isSame(const nlohmann::json& a, const nlohmann::json& b);

/// The bodies of a multipart answer of that content type.
QVector<QByteArray> partsOf(const QByteArray& contentType, const QByteArray& body);

/// The document of the Native DICOM Model says what the object of the DICOM JSON model says.
void requireSameXml(const QByteArray& document, const nlohmann::json& object);

/// The answer to a question, as it is sent, says what the object says.
void requireSameDataset(DcmDataset& answer, const nlohmann::json& object,
                        const Dimse::QueryIdentifier& question);

/// The attributes that the study browser shows are those of the object, and their texts its texts.
void requireSameTree(const nlohmann::json& attributes, const nlohmann::json& object);

}  // namespace Kdd
