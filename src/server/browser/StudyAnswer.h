#pragma once

#include "server/browser/StudyJson.h"
#include "server/http/Response.h"

namespace Kdd::Browser
{

// What is answered about one study, from its tree. `version` is that of its tag file. Paths are as `BrowserService` tells
// them, from the name of the series or image on.

/// 404 when one of the images is not there.
Http::Response differenceAnswer(const Http::Request& request, const TagFile& file);

/// A study without a picture gets one that says so: lists of studies ask for all of them.
Http::Response studyPreview(const Http::Request& request, const TagFile& file, const QByteArray& version);

/// 404 when there is no such series, or the path names nothing of one.
Http::Response seriesAnswer(const Http::Request& request, const TagFile& file, const QByteArray& version,
                            const QVector<QByteArray>& path);

/// 404 when there is no such image, or the path names nothing of one.
Http::Response imageAnswer(const Http::Request& request, const TagFile& file, const QByteArray& version,
                           const QVector<QByteArray>& path);

}  // namespace Kdd::Browser
