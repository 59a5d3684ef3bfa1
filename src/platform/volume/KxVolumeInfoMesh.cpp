#include "platform/volume/ImageAttributes.h"
#include "platform/volume/KxVolumeInfo.h"
#include "platform/volume/ShownPixels.h"
#include "platform/volumefile/OrlanMesh.h"

#include <limits>

namespace Kdd
{

namespace
{

using Info = std::shared_ptr<KxVolumeInfo>;

bool isShowable(const TypedData2D& pixels)
{
    const int components = pixels.components;
    const bool isKnown = components == KxVolumeInfo::Grey || components == KxVolumeInfo::Colour ||
                         components == KxVolumeInfo::ColourAlpha || components == KxVolumeInfo::SixComponents;
    return isKnown && pixels.width > 0 && pixels.height > 0 && sizeOf(pixels.type) > 0 &&
           pixels.rowStride() * pixels.height == pixels.pixels.size();
}

ValueRange paddingOf(const ParamBundle& parameters)
{
    const auto range = parameters.numbers("PaddingRangeMin") + parameters.numbers("PaddingRangeMax");
    // Both limits or none, and they take the place of the single value.
    if (range.size() == 2)
        return {range.at(0), range.at(1)};
    const auto value = parameters.numbers("PaddingValue");
    return value.isEmpty() ? ValueRange() : ValueRange{value.first(), value.first()};
}

ValueRange rangeFor(const ParamBundle& parameters, const TypedData2D& pixels)
{
    const ValueRange values = rangeOf(pixels, paddingOf(parameters));
    const auto center = parameters.numbers("WindowCenter");
    const auto width = parameters.numbers("WindowWidth");
    if (center.isEmpty() || width.isEmpty() || !(width.first() > 0))
        return values;
    const ValueRange window = windowRange(center.first(), width.first());
    // A window that shows none of the values was made for others.
    return window.overlaps(values) ? window : values;
}

/// Colour of whole numbers fills its type; everything else is shown as its values are.
ValueRange colourRange(const TypedData2D& pixels)
{
    if (pixels.type == PrimitiveType::UInt8)
        return {0, std::numeric_limits<quint8>::max()};
    if (pixels.type == PrimitiveType::UInt16)
        return {0, std::numeric_limits<quint16>::max()};
    return rangeOf(pixels);
}

/// Of the box around the volume and the number of voxels; the box is xmin, xmax, ymin, ymax, zmin, zmax.
double aspectOf(const OrlanMesh& mesh, const Lattice& lattice)
{
    auto box = mesh.parameters().numbers("BoundingBox");
    if (box.size() != 6)
        box = mesh.parameters().numbers("BoundingBox0");
    if (box.size() != 6)
        return 1;
    return believableAspect((box.at(1) - box.at(0)) / lattice.dims.at(0),
                            (box.at(3) - box.at(2)) / lattice.dims.at(1));
}

Info showPixels(const OrlanMesh* mesh, const TypedData2D& pixels, int width, int height, double aspect)
{
    const bool isGrey = pixels.components == KxVolumeInfo::Grey;
    const ParamBundle parameters = mesh ? mesh->parameters() : ParamBundle();
    const ValueRange range = isGrey ? rangeFor(parameters, pixels) : colourRange(pixels);
    // Six components hold a marker for pixels without a value, which must reach the preview as it is.
    const bool hasMarker = pixels.components == KxVolumeInfo::SixComponents;
    const ShownPixels shown =
        hasMarker ? reduce({pixels, range}, 0, 0) : spreadNarrowRange(reduce({pixels, range}, width, height));
    return std::make_shared<KxVolumeInfo>(
        shown.pixels, static_cast<KxVolumeInfo::ComponentCode>(pixels.components),
        toFloat(shown.range.lowest), toFloat(shown.range.highest), toFloat(aspect), false);
}

}  // namespace

Info KxVolumeInfo::readVolumeInfo(const OrlanMesh& mesh, int width, int height, int slice, Result& result)
{
    result = Result();
    const Lattice* lattice = mesh.findLattice("Level0", 3);
    if (!lattice) {
        result = Result::failure(QStringLiteral("There is no volume in ") + QString::fromUtf8(mesh.name()));
        return nullptr;
    }
    TypedData2D pixels;
    result = mesh.readSlice(*lattice, slice, pixels);
    if (result.good() && !isShowable(pixels))
        result = Result::failure(
            QStringLiteral("A slice of %1 components cannot be shown: ").arg(pixels.components) +
            QString::fromUtf8(mesh.name()));
    return result.good() ? showPixels(&mesh, pixels, width, height, aspectOf(mesh, *lattice)) : nullptr;
}

Info KxVolumeInfo::fromFrame(const OrlanMesh* mesh, const TypedData2D& frame)
{
    return isShowable(frame) ? showPixels(mesh, frame, 0, 0, 1) : nullptr;
}

}  // namespace Kdd
