#pragma once

#include <QByteArray>

namespace Kdd::Http
{
class Packing;
}

namespace Kdd::DicomWeb
{

inline constexpr const char* kXmlMediaType = "application/dicom+xml";

/// An object of an answer, in the DICOM JSON model, as a document of the Native DICOM Model, which is a part of its own.
QByteArray xmlPart(const QByteArray& json, Http::Packing& parts);

}  // namespace Kdd::DicomWeb
