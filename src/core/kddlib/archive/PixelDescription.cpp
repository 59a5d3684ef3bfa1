#include "kddlib/archive/PixelDescription.h"

#include "kddlib/Limits.h"
#include "platform/volume/FragmentReader.h"
#include "platform/volume/StoredFrame.h"

#include <dcmtk/dcmdata/dctk.h>

#include <memory>

namespace Kdd
{

namespace
{

/// Icons are compressed as the image is, and are decoded with it.
Result decodeIcon(DcmItem& item)
{
    DcmElement* element = nullptr;
    E_TransferSyntax xfer = EXS_Unknown;
    StoredFrame icon;
    if (item.findAndGetElement(DCM_PixelData, element).bad() || findFragments(*element, xfer) == nullptr)
        return {};
    Result result = readStoredFrame(item, 0, 0, icon);
    const bool isWide = sizeOf(icon.pixels.type) > 1;
    QByteArray pixels = icon.pixels.pixels;
    pixels.append(pixels.size() % 2, '\0');
    auto native = std::make_unique<DcmPixelData>(DcmTag(DCM_PixelData, isWide ? EVR_OW : EVR_OB));
    native->putUint8Array(reinterpret_cast<const Uint8*>(pixels.constData()),
                          static_cast<Uint32>(pixels.size()));
    if (result.good() && icon.pixels.components == 3) {
        const bool isRgb = icon.colour == StoredFrame::Colour::Rgb;
        item.putAndInsertString(DCM_PhotometricInterpretation, isRgb ? "RGB" : "YBR_FULL");
        item.putAndInsertUint16(DCM_PlanarConfiguration, 0);
    }
    if (result.good() && item.insert(native.get(), OFTrue).good())
        static_cast<void>(native.release());
    return result.within(QStringLiteral("The icon"));
}

Result decodeBelow(DcmItem& item, int depth)
{
    Result result;
    for (DcmObject* object = item.nextInContainer(nullptr); object != nullptr && result.good();
         object = item.nextInContainer(object)) {
        if (object->ident() != EVR_SQ || depth >= kMaxItemDepth)
            continue;
        auto& items = static_cast<DcmSequenceOfItems&>(*object);
        for (DcmObject* next = items.nextInContainer(nullptr); next != nullptr && result.good();
             next = items.nextInContainer(next)) {
            result = decodeIcon(static_cast<DcmItem&>(*next));
            if (result.good())
                result = decodeBelow(static_cast<DcmItem&>(*next), depth + 1);
        }
    }
    return result;
}

}  // namespace

void describePixels(DcmDataset& dataset, const QByteArray& photometric)
{
    for (const DcmTagKey& key :
         {DcmTagKey(0x7fe0, 0x0001), DcmTagKey(0x7fe0, 0x0002), DcmTagKey(0x7fe0, 0x0003)})
        dataset.findAndDeleteElement(key);
    if (!photometric.isEmpty())
        dataset.putAndInsertString(DCM_PhotometricInterpretation, photometric.constData());
    if (dataset.tagExists(DCM_PlanarConfiguration))
        dataset.putAndInsertUint16(DCM_PlanarConfiguration, 0);
}

Result decodeIcons(DcmDataset& dataset)
{
    return decodeBelow(dataset, 0);
}

}  // namespace Kdd
