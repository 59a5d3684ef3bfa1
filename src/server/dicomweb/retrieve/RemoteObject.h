#pragma once

#include "server/dicomweb/retrieve/StoredObject.h"

#include <kddlib/ObjectVersion.h>

#include <string>

namespace Kdd::DicomWeb
{

/// A file behind a URL, of which no more is fetched than is asked for. What is read is all of the version that was met
/// first; a server that has another one meanwhile makes reading fail.
class RemoteObject : public StoredObject
{
public:
    /// Fetches the beginning. Null, with the reason in `result`, when the server cannot be reached, refuses or does not
    /// tell how long the object is.
    static std::unique_ptr<RemoteObject> open(const QByteArray& url, Result& result);

    qint64 size() const override { return mSize; }
    qint64 read(qint64 offset, char* out, qint64 length) override;
    QByteArray identity() const override;
    Http::BodyPart part(const FileStretch& stretch) const override;

private:
    RemoteObject() = default;

    std::string mUrl;
    ObjectVersion mVersion;
    qint64 mSize = 0;
    QByteArray mWindow;  // what was fetched last, from mStart on
    qint64 mStart = 0;
};

}  // namespace Kdd::DicomWeb
