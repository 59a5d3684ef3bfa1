#pragma once

#include "platform/base/Export.h"
#include "platform/base/Geometry.h"
#include "platform/volume/KxHistogram.h"

#include <QByteArray>
#include <QVector>

#include <boost/optional.hpp>

#include <string>
#include <vector>

namespace Kdd
{

class OrlanMesh;

/// What a tag file takes over from one volume file. A value. Each thread uses a copy of its own.
struct KDD_EXPORT VolumeInfo
{
    std::vector<std::string> imageUIDs;  ///< distinct SOP Instance UIDs
    std::vector<std::string>
        frameIdentifiers;         ///< per slice "UID.frame"; empty unless the images have frames
    QByteArray name;              ///< of the file, without folder
    Vec3i dims;                   ///< columns, rows, slices
    Box3f boundingBox;            ///< [mm]
    Mat4f transformation;         ///< from voxels to patient space
    QByteArray preview;           ///< JPEG of the middle slice
    QVector<float> quadrantData;  ///< where the breast lies in a mammogram
    float rescaleSlope = 1;
    float rescaleIntercept = 0;
    float precisionBitLoss = 0;
    qint32 numLossyCompressedImages = 0;
    qint32 numOverlayPlanes = 0;
    boost::optional<qint32> paddingValue;
    boost::optional<qint32> paddingRangeLimit;
    KxHistogram histogram;  ///< of the stored values

    /// Takes over what the file's header says, all but preview and quadrant data. False, with a log line that names
    /// the file, when it does not name its images.
    bool readHeader(const OrlanMesh& mesh, const QByteArray& path);

private:
    void nameImages(bool haveFrames);
};

/// The value of an attribute in the bundle "DICOM" of a volume file, where it stands as "VR:value"; `name` is
/// "Ggggg-eeee". Empty when absent.
KDD_EXPORT QByteArray dicomValue(const OrlanMesh& mesh, const QByteArray& name);

}  // namespace Kdd
