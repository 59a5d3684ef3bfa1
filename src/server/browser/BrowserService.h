#pragma once

#include "server/dicomweb/StudyShelf.h"
#include "server/http/Response.h"

#include <QJsonObject>

#include <functional>

namespace Kdd::Browser
{

struct BrowserSettings
{
    QByteArray dicomWeb = "dicom-web";  ///< where DICOMweb stands, without "/" at either end
    bool hasViewer = false;             ///< a viewer stands under "viewer/"
    bool hasThumbnails = false;         ///< DICOMweb renders images that have no stored preview
    QVector<QByteArray> changes;        ///< rights that are of use on this server, beside "read"
};

/// The study browser: its page, and what it tells of studies beyond DICOMweb, as JSON from their tag files.
///
///     /                                                   the page
///     /page/{file}                                        what it consists of
///     /browser/config                                     what else stands on this server, and what the caller may change
///     /browser/studies/{s}                                `studyJson`
///     /browser/studies/{s}/sizes                          `sizesJson`
///     /browser/studies/{s}/corrections                    `correctionsOf`
///     /browser/studies/{s}/preview                        a picture of it, or one that says that there is none
///     /browser/studies/{s}/series/{r}/preview             a picture of it (JPEG)
///     /browser/studies/{s}/series/{r}/images              `imagesJson`, from `offset` on, `limit` of them
///     /browser/studies/{s}/series/{r}/volumes/{n}/preview
///     /browser/studies/{s}/images/{i}/preview
///     /browser/studies/{s}/images/{i}/attributes          `imageJson` and `attributeTree`
///     /browser/studies/{s}/difference?a={i}&b={i}         `differenceOf`
///
/// Series and images are named by their UIDs, or what `publicKey` makes of those that are none. Every answer forbids the
/// client to take any of it for a script, and others to embed it.
class BrowserService : public Http::Handler
{
public:
    /// The shelf outlives the service.
    BrowserService(DicomWeb::StudyShelf& shelf, const BrowserSettings& settings);

    Http::Response answer(const Http::Request& request) override;

private:
    using Rest = QVector<QByteArray>;
    using Look = std::function<Http::Response(const TagFile&, const QByteArray& version)>;

    Http::Response find(const Http::Request& request) const;
    Http::Response config(const Http::Request& request) const;
    Http::Response study(const Http::Request& request, const QByteArray& uid, const Rest& rest) const;
    Http::Response sizes(const Http::Request& request, const QByteArray& uid) const;
    Http::Response lookAt(const QByteArray& uid, const Look& look) const;

    DicomWeb::StudyShelf& mShelf;
    BrowserSettings mSettings;
};

}  // namespace Kdd::Browser
