#pragma once

#include <optional>

namespace Kdd
{

/// A window that takes the place of the one an image brings, in values after the rescale.
struct FrameWindow
{
    /// How values between black and white are spread, as DICOM's VOI LUT Function has it.
    enum class Function { Linear, LinearExact, Sigmoid };

    double center = 0;
    double width = 1;  ///< above 0; of `Linear` at least 1
    Function function = Function::Linear;
};

/// Which frame of an image is to be shown, and how.
struct FrameView
{
    /// Stands for the frame that shows best what the image is about.
    static constexpr int kRepresentative = -1;

    int frame = kRepresentative;  ///< 0-based
    int width = 0;   ///< of the picture wanted [pixels]; what is read is about as large, never smaller
    int height = 0;  ///< 0: as stored
    std::optional<FrameWindow> window;  ///< for grey values; colour has none
};

}  // namespace Kdd
