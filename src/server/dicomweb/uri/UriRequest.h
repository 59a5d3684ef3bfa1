#pragma once

#include "server/dicomweb/ResourcePath.h"
#include "server/dicomweb/render/RenderRequest.h"
#include "server/http/AcceptHeader.h"

namespace Kdd::DicomWeb
{

/// What the parameters of a request for one instance ask for.
struct UriRequest
{
    ResourcePath path;  ///< of the instance
    Http::AcceptHeader accept{"*/*"};
    QByteArray transferSyntax;  ///< of a whole object; empty: the usual one
    QByteArray frame;           ///< the number of one (1-based); empty: that which represents the image
    RenderRequest rendering;
    QByteArray notDone;  ///< a parameter that asks for more in a picture than is done here; empty: none does

    /// 400 with the parameter's name when one is missing or has no value that it can have, or asks for something that
    /// nobody may go without noticing: an object without the patient's name.
    static Verdict parse(const Http::Request& request, UriRequest& wanted);
};

}  // namespace Kdd::DicomWeb
