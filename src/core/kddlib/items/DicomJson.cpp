#include "kddlib/items/DicomJson.h"

#include "kddlib/items/ImageWriter.h"
#include "kddlib/items/JsonForm.h"
#include "kddlib/items/NativeModelForm.h"

#include <dcmtk/dcmdata/dcdeftag.h>

#include <algorithm>
#include <ostream>
#include <utility>

namespace Kdd
{

namespace
{

void writeJson(std::ostream& out, const TagMap& map, const std::string& bulkDataRoot,
               ImageWriter::Entries entries)
{
    QByteArray text;
    ImageWriter(JsonForm::instance(), {}).append(text, map, QByteArray::fromStdString(bulkDataRoot), entries);
    out.write(text.constData(), text.size());
}

const AttributeForm& formOf(MetadataForm form)
{
    if (form == MetadataForm::Json)
        return JsonForm::instance();
    return NativeModelForm::instance();
}

/// Without the UIDs nobody could tell what the other attributes are of.
QVector<DcmTagKey> withNames(QVector<DcmTagKey> wanted)
{
    if (wanted.isEmpty())
        return wanted;
    wanted << DCM_SpecificCharacterSet << DCM_SOPInstanceUID << DCM_StudyInstanceUID << DCM_SeriesInstanceUID;
    std::sort(wanted.begin(), wanted.end());
    return wanted;
}

}  // namespace

void writeDicomJson(std::ostream& out, const TagMap& map, const std::string& bulkDataRoot)
{
    writeJson(out, map, bulkDataRoot, ImageWriter::Entries::Merged);
}

void writeOwnDicomJson(std::ostream& out, const TagMap& map, const std::string& bulkDataRoot)
{
    writeJson(out, map, bulkDataRoot, ImageWriter::Entries::Own);
}

struct DicomImageWriter::Private
{
    ImageWriter writer;
};

DicomImageWriter::DicomImageWriter(MetadataForm form, QVector<DcmTagKey> wanted)
    : d(new Private{ImageWriter(formOf(form), withNames(std::move(wanted)))})
{
}

DicomImageWriter::~DicomImageWriter() = default;

void DicomImageWriter::append(QByteArray& out, const TagMap& image, const QByteArray& bulkDataRoot)
{
    d->writer.append(out, image, bulkDataRoot, ImageWriter::Entries::Merged);
}

}  // namespace Kdd
