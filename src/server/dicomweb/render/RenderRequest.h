#pragma once

#include "server/dicomweb/retrieve/Verdict.h"

#include <QSize>

#include <kddlib/FrameView.h>

#include <optional>

namespace Kdd::DicomWeb
{

/// A rectangle of the picture as it is stored, that is to be shown in place of the whole [pixels].
struct SourceRegion
{
    double x = 0;
    double y = 0;
    double width = 0;  ///< 0: up to the edge; negative: shown from right to left
    double height = 0;
};

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
};

}  // namespace Kdd::DicomWeb
