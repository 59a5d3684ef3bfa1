#pragma once

#include "platform/base/Export.h"

#include <QVector>

class QImage;

namespace Kdd
{

class ParamBundle;
class TagMap;

/// Where the breast lies in a mammogram, so that a viewer can zoom to it and step through its quadrants before any
/// pixel of the image itself is loaded. On any thread.
class KDD_EXPORT QuadrantNavigation
{
public:
    enum class Laterality { Unknown, Left, Right };
    enum class View { Unknown, CranioCaudal, Oblique, Lateral };

    /// A side of the picture. The numbers are stored and never changed.
    enum class Side { Unknown = 0, Left = 1, Right = 2, Top = 3, Bottom = 4 };

    struct Orientation
    {
        Laterality laterality = Laterality::Unknown;
        View view = View::Unknown;
        Side chestWall = Side::Unknown;
        Side upper =
            Side::Unknown;  ///< where the head is; in a cranio-caudal view the outer half of the breast
    };

    /// How many values `computeImageBoxAndCenter` gives.
    static constexpr int kNumValues = 10;

    /// Whether the image is a mammogram (by modality or SOP class) of one breast whose side is known.
    static bool isSupported(const TagMap& image);

    /// What the attributes say: Image Laterality, Laterality or the Frame Laterality of a tomosynthesis; View Position
    /// or View Code Sequence; Patient Orientation. What they do not say is unknown.
    static Orientation checkOrientation(const TagMap& image);

    /// The same from the bundle "DICOM" of a volume file.
    static Orientation checkOrientation(const ParamBundle& dicom);

    /// Finds the breast in a preview. Positions are fractions of the width and the height of the picture, from its left
    /// top corner, so they hold for the image in every size:
    ///
    ///     0  left, 1 top, 2 right, 3 bottom of the box around the breast
    ///     4  x, 5 y of its centre of area, where its quadrants meet
    ///     6  x, 7 y of the point that lies farthest from the chest wall, near the nipple
    ///     8  `Side` of the chest wall: as in `orientation`, else the side that the breast lies along, else the
    ///        usual side of that breast
    ///     9  `Side` called upper in `orientation`
    ///
    /// Empty when there is no breast in the picture. White frames, burned-in labels and markers do not count, nor does
    /// it matter whether the background is black or white.
    static QVector<float> computeImageBoxAndCenter(const QImage& preview, const Orientation& orientation);

    /// Finds and stores the values for an image, if it is supported. Whether they were stored.
    static bool process(const QImage& preview, TagMap& image);

    /// Stores the values as little-endian floats, VR FL, in (0071,xx70) of our private creator.
    static bool store(const QVector<float>& values, TagMap& image);
};

}  // namespace Kdd
