#pragma once

#include "kddlib/volumes/FrameTags.h"
#include "kddlib/volumes/Vec3d.h"

#include <QByteArray>
#include <QString>

namespace Kdd
{

class TagMap;

/// One frame of an image that can be a slice of a stack, with all that decides to which stack it belongs and what its
/// pixels mean. Read from the cached metadata alone.
///
/// Points to its image, which must outlive it.
struct StackFrame
{
    explicit StackFrame(const TagMap& image)
        : tags(image, 0)
    {
    }

    FrameTags tags;
    QByteArray imageUID;
    int frame = 0;              ///< 0-based
    bool isMultiFrame = false;  ///< whether the image has 2 or more frames

    int columns = 0;
    int rows = 0;
    double columnSpacing = 0;  ///< between the centres of two pixels of a row [mm]
    double rowSpacing = 0;     ///< between the centres of two rows [mm]
    Vec3d position;            ///< centre of the first pixel [mm]
    Vec3d alongRow;            ///< of length 1, from column to column
    Vec3d alongColumn;         ///< of length 1, from row to row, at a right angle to the other

    QByteArray photometric;
    QByteArray frameOfReference;

    int bitsStored = 0;  ///< 1 to 16
    bool isSigned = false;
    double slope = 1;  ///< from stored to physical values; not 0
    double intercept = 0;

    /// Stored values that are no measurements, both limits included.
    bool hasPadding = false;
    bool hasPaddingRange = false;
    int paddingMin = 0;
    int paddingMax = 0;

    /// Direction in which slices are counted: at a right angle to the slice, of length 1.
    Vec3d normal() const { return cross(alongRow, alongColumn); }
};

/// An image, or a frame of one, that no stack can take, and why.
struct LeftOutFrame
{
    QByteArray imageUID;
    int frame = -1;  ///< 0-based; -1 for all frames of the image
    QString reason;
};

}  // namespace Kdd
