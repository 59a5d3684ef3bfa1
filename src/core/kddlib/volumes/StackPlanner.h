#pragma once

#include "kddlib/volumes/StackFrame.h"
#include "platform/base/Export.h"
#include "platform/base/Geometry.h"

#include <QVector>

namespace Kdd
{

class TagMap;

/// Parallel slices of equal size at equal distances.
struct Stack
{
    /// Along the normal of the slices: of axial slices whose rows run to the patient's left, feet first.
    QVector<StackFrame> slices;

    Vec3i dims;               ///< columns, rows, slices
    double sliceSpacing = 0;  ///< between two slices, along their normal [mm]

    /// From (column, row, slice), each 0-based and whole at the centre of a voxel, to patient space: x to the left, y
    /// to the back, z to the head [mm]. The third column is the step from slice to slice as it is: of images made with
    /// a tilted gantry it is not at a right angle to the slices, and the voxels are sheared.
    Mat4f transformation;

    /// The smallest box in patient space around the CENTRES of all voxels [mm]. So the distance of two voxels of an
    /// axial stack is (max - min) / (dims - 1), and a stack of oblique slices does not fill its box.
    Box3f boundingBox;
};

/// What becomes of the images of a series.
struct StackPlan
{
    QVector<Stack> stacks;  ///< as their first images follow each other; the runs of one along the normal
    QVector<LeftOutFrame> leftOut;
};

/// Fewer slices make no stack.
constexpr int kLeastSlices = 3;

/// Whether slices of one stack share their Frame of Reference. Anonymisers that give each image one of its own leave
/// nothing that says the positions belong together; who knows that they do ignores it.
enum class FrameOfReference { Shared, Ignored };

/// Plans which images of a series, or frames of them, form stacks. It goes by the cached metadata alone and does not
/// depend on the order of the images in the tree. The plan points into the series and is valid while that stays
/// unchanged.
///
/// Slices of one stack are grey and agree in size, Pixel Spacing (one part in a thousand), Photometric Interpretation,
/// Frame of Reference (but see `FrameOfReference`) and orientation (2/1000 in each cosine). They may differ in bits, sign and rescale.
///
/// Where several lie in one plane (within 0.01 mm), the series is split by the first attribute that divides them evenly
/// (time, echo, diffusion, image type and so on), several times if need be; without one by the order of the images
/// if there are equally many in every plane. Otherwise the first in each plane is taken.
///
/// The step from slice to slice must be constant within 0.11 mm, because positions are rounded, and within a quarter
/// of the step, so that a missing slice is always noticed. Where it is not, the stack ends and another begins.
KDD_EXPORT StackPlan planStacks(const TagMap& series, FrameOfReference frames = FrameOfReference::Shared);

}  // namespace Kdd
