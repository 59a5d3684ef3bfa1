#pragma once

#include "server/dicomweb/Verdict.h"

#include <QSize>

#include <kddlib/FrameView.h>

#include <optional>

namespace Kdd::DicomWeb
{

/// A rectangle of the picture as it is stored, that is to be shown in place of the whole [pixels, or sides of the
/// picture].
struct SourceRegion
{
    double x = 0;
    double y = 0;
    double width = 0;  ///< 0: up to the edge; negative: shown from right to left
    double height = 0;
    bool isRelative = false;  ///< in sides of the picture, from 0 to 1

    bool isWhole() const { return width == 0 && height == 0; }
};

/// The longest side of a picture that is made [pixels]: a wall of displays. A larger one would be made of repeated pixels
/// and take memory of the server's.
constexpr int kLongestSide = 8192;

/// How a picture is wanted: the query parameters `viewport`, `window` and `quality`.
struct RenderRequest
{
    QSize viewport;  ///< into which the picture is fitted; empty: as it is stored
    SourceRegion region;
    std::optional<FrameWindow> window;
    int quality = 90;  ///< of a JPEG, 1 to 100

    /// 400 with the parameter's name when a value is none. `annotation` and `iccprofile`, which ask for more than
    /// pixels, are passed over.
    static Verdict parse(const Http::Request& request, RenderRequest& rendering);

    /// All of it in a text that is the same for the same wishes only.
    QByteArray text() const;
};

}  // namespace Kdd::DicomWeb
