#pragma once

#include "server/dicomweb/render/RenderRequest.h"
#include "server/http/AcceptHeader.h"

#include <QImage>

namespace Kdd::DicomWeb
{

/// In which form pictures are sent.
struct PictureForm
{
    QByteArray mediaType;  ///< of a picture
    bool isMultipart = false;

    /// 406 when the client takes no form that is offered.
    static Verdict choose(const Http::AcceptHeader& accept, PictureForm& form);
};

/// Cuts the region out of a picture, turns it where it is wanted so, and fits it into the viewport, also where it has
/// to be enlarged for that. A region that lies outside gives a null picture.
QImage fitInto(const QImage& picture, const RenderRequest& rendering);

/// Null when it cannot be written in that form.
QByteArray encode(const QImage& picture, const QByteArray& mediaType, int quality);

}  // namespace Kdd::DicomWeb
