// Attributes of any kind and content, in sequences too: what clients are given of them is JSON and XML that can be read.

#include "fuzz/Choices.h"
#include "fuzz/Property.h"
#include "kddlib/items/DicomJson.h"
#include "kddlib/tagmodel/TagElement.h"
#include "kddlib/tagmodel/TagMap.h"
#include "kddlib/tagmodel/TagSequence.h"

#include <QXmlStreamReader>

#include <dcmtk/config/osconfig.h>

#include <dcmtk/dcmdata/dcdeftag.h>
#include <nlohmann/json.hpp>

using namespace Kdd;

namespace
{

constexpr int kMaxDepth = 4;

const DcmTagKey kKeys[] = {DCM_SpecificCharacterSet,
                           DCM_PatientName,
                           DCM_PatientComments,
                           DCM_PatientWeight,
                           DCM_PixelSpacing,
                           DCM_InstanceNumber,
                           DCM_StudyDate,
                           DCM_ImageType,
                           DCM_RetrieveURL,
                           DCM_FrameIncrementPointer,
                           DCM_SelectorSVValue,
                           DCM_LUTData,
                           DCM_OverlayData,
                           DCM_PixelData,
                           {0x0009, 0x0010},
                           {0x0009, 0x1001},
                           DCM_StudyInstanceUID};

/// An attribute is its place among the keys, its VR, and a value or the number of items.
void fill(TagMap& map, Choices& choices, int depth)
{
    for (int left = choices.next() % 8; left > 0 && !choices.isAtEnd(); --left) {
        const DcmTagKey key = kKeys[static_cast<std::size_t>(choices.next()) % std::size(kKeys)];
        const auto code = static_cast<VrCode>(choices.next());
        if (code == VrCode::Omitted) {
            map.markAsOmitted(key);
        } else if (code != VrCode::SQ || depth == kMaxDepth) {
            map.putElement(key, new TagElement(code, choices.value()));
        } else {
            auto* sequence = new TagSequence;
            for (int items = choices.next() % 4; items > 0; --items) {
                auto* item = new TagMap;
                fill(*item, choices, depth + 1);
                sequence->addItem(item);
            }
            map.putElement(key, sequence);
        }
    }
}

bool isXml(const QByteArray& text)
{
    QXmlStreamReader reader(text);
    while (!reader.atEnd())
        reader.readNext();
    return !reader.hasError();
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, std::size_t size)
{
    const QByteArray bytes = bytesOf(data, size);
    Choices choices(bytes);
    TagMap map;
    fill(map, choices, 0);
    QByteArray json;
    DicomImageWriter(MetadataForm::Json).append(json, map, "root");
    // Qt takes no number that is too small for a normal one.
    require(nlohmann::json::accept(json.cbegin(), json.cend()), "JSON can be read");
    QByteArray xml;
    DicomImageWriter(MetadataForm::Xml).append(xml, map, "root");
    require(isXml(xml), "XML can be read");
    return 0;
}
