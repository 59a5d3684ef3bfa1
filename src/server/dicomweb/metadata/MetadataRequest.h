#pragma once

#include "server/dicomweb/ResourcePath.h"
#include "server/http/Request.h"

#include <QString>

#include <kddlib/DicomJson.h>

namespace Kdd::DicomWeb
{

/// What is asked for of metadata.
struct MetadataRequest
{
    ResourcePath path;
    MetadataForm form = MetadataForm::Json;
    QByteArray mediaType;       ///< of the answer; of XML of its parts
    QVector<DcmTagKey> wanted;  ///< sorted, each once; empty: all
    bool takesGzip = false;

    /// Reads the request. False with the status and the reason why it cannot be served.
    bool read(const Http::Request& request, const ResourcePath& resource, int& status, QString& reason);

    /// Between the parts of an answer that has parts.
    QByteArray boundary() const { return "kdd-" + digest(); }

    /// The media type of the answer as a whole.
    QByteArray contentType() const;

    /// In 32 hexadecimal digits what, beside the study's version, the answer's bytes depend on.
    QByteArray digest() const;
};

}  // namespace Kdd::DicomWeb
