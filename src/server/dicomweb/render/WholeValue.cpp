#include "server/dicomweb/render/WholeValue.h"

#include "server/dicomweb/MediaTypes.h"
#include "server/dicomweb/render/PictureTag.h"
#include "server/dicomweb/render/ReportText.h"
#include "server/dicomweb/retrieve/BodyBlocks.h"
#include "server/dicomweb/retrieve/InstanceParts.h"
#include "server/dicomweb/retrieve/PixelValue.h"
#include "server/dicomweb/retrieve/ValueAnswer.h"
#include "server/http/EntityTag.h"

#include <dcmtk/dcmdata/dctk.h>
#include <kddlib/DicomFileReader.h>
#include <kddlib/TagMap.h>
#include <kddlib/TextDecoding.h>

#include <algorithm>

namespace Kdd::DicomWeb
{

namespace
{

const QByteArray kPdf("application/pdf");

/// What is read of a video to see what it is: two packets of a transport stream [bytes].
constexpr int kHead = 2 * 188;

bool isPdf(const ServedStudy& study, const QByteArray& key)
{
    return study.look([&](const TagFile& file) {
        const TagMap* image = file.findImage(key);
        QByteArray type;
        return image != nullptr && image->findElement(DCM_EncapsulatedDocument) != nullptr &&
               image->findAndGetString(DCM_MIMETypeOfEncapsulatedDocument, type) && type.toLower() == kPdf;
    });
}

bool namesVideo(const Http::AcceptHeader& accept)
{
    const auto isVideo = [](const Http::MediaRange& range) {
        return range.quality > 0 && range.name.startsWith("video/");
    };
    return std::any_of(accept.ranges().begin(), accept.ranges().end(), isVideo);
}

/// As what a player takes the stream; empty for a bare one, which has to be packed before it can be played.
QByteArray typeOfStream(const FoundObject& object, const BulkValue& value)
{
    QByteArray head(kHead, 0);
    const FileStretch first = value.stretches.value(0);
    const qint64 count = object.bytes->read(first.offset, head.data(), qMin<qint64>(kHead, first.length));
    if (count < kHead)
        return {};
    if (head.mid(4, 4) == "ftyp")
        return "video/mp4";
    if (head.at(0) == 'G' && head.at(kHead / 2) == 'G')
        return "video/mp2t";
    // The head of a pack, or of a sequence of pictures.
    const bool isMpeg =
        head.startsWith(QByteArray("\0\0\1\xba", 4)) || head.startsWith(QByteArray("\0\0\1\xb3", 4));
    return isMpeg ? QByteArray("video/mpeg") : QByteArray();
}

Http::Response showPdf(const Http::Request& request, const Http::AcceptHeader& accept,
                       const ServedStudy& study, const ListedImage& image, ObjectShelf& objects)
{
    if (accept.quality({kPdf, {}}) == 0)
        return Http::failure(406,
                             QStringLiteral("The instance is a document and is given as application/pdf"));
    BulkValue value;
    const Verdict found = findBulkValue(study, image, {{DCM_EncapsulatedDocument, 0}}, objects, value);
    return found.good() ? alone(request, value, kPdf) : found.response();
}

const QByteArray kHtml("text/html");
const QByteArray kPlain("text/plain");

/// Of a report with all its sequences, which has to be in memory to be read [bytes]; the longest are some MiB.
constexpr qint64 kMaxReport = qint64(64) * 1024 * 1024;

bool isReport(const ServedStudy& study, const QByteArray& key)
{
    return study.look([&](const TagFile& file) {
        const TagMap* image = file.findImage(key);
        return image != nullptr && DicomWeb::isReport(*image);
    });
}

/// The report with all corrections, its texts in UTF-8.
Verdict readReport(const ServedStudy& study, const ListedImage& image, ObjectShelf& objects,
                   DcmFileFormat& file)
{
    InstanceForm form;
    form.syntaxes = {{"*", 1000}};
    std::vector<Http::BodyPart> body;
    MadeInstance made;
    QByteArray bytes;
    QByteArray block;
    const Verdict verdict = makeInstance(study, image, form, objects, body, made);
    if (verdict.bad())
        return verdict;
    BodyBlocks blocks(std::move(body));
    do {
        if (blocks.next(block).bad())
            return {500, QStringLiteral("The instance's DICOM file cannot be read")};
        bytes += block;
        if (bytes.size() > kMaxReport)
            return {413, QStringLiteral("The report is too long to be shown")};
    } while (!block.isEmpty());
    if (readDicomBuffer(bytes, file).bad())
        return {500, QStringLiteral("The instance's DICOM file cannot be read")};
    convertValuesToUtf8(*file.getDataset());
    return {};
}

Http::Response showReport(const Http::Request& request, const Http::AcceptHeader& accept,
                          const ServedStudy& study, const ListedImage& image, ObjectShelf& objects)
{
    const QVector<Http::MediaType> offers = {{kHtml, {}}, {kPlain, {}}};
    const int chosen = accept.choose(offers);
    if (chosen < 0)
        return Http::failure(406,
                             QStringLiteral("The instance is a report, given as text/html and text/plain"));
    const QByteArray& type = offers[chosen].name;
    DcmFileFormat file;
    QByteArray tag;
    Verdict verdict = PictureTag{image.key, "report " + type}.ofDrawn(study, objects, tag);
    if (verdict.good() && Http::hasEntity(request, tag))
        return Http::notModified(tag);
    if (verdict.good())
        verdict = readReport(study, image, objects, file);
    if (verdict.bad())
        return verdict.response();
    DcmDataset& report = *file.getDataset();
    const QString text = type == kHtml ? reportAsHtml(report) : reportAsText(report);
    Http::Response response = Http::textResponse(200, type + "; charset=utf-8", text.toUtf8());
    // Were anything of it markup in spite of all, it could neither run nor fetch.
    response.addHeader("Content-Security-Policy", "default-src 'none'; sandbox");
    response.addHeader("X-Content-Type-Options", "nosniff");
    Http::addEntityTag(tag, response);
    return response;
}

Http::Response showVideo(const Http::Request& request, const Http::AcceptHeader& accept,
                         const FoundObject& object)
{
    BulkValue value;
    const Verdict found = storedPixels(object, value);
    if (found.bad())
        return found.response();
    const QByteArray type = typeOfStream(object, value);
    if (type.isEmpty())
        return Http::failure(406,
                             QStringLiteral("The video is stored as a bare stream, which has no media type"));
    if (accept.quality({type, {}}) == 0)
        return Http::failure(406, QStringLiteral("The video is stored as ") + QString::fromLatin1(type));
    return alone(request, value, type);
}

}  // namespace

bool isReport(const TagMap& image)
{
    QByteArray type;
    return image.findElement(DCM_ContentSequence) != nullptr && image.findAndGetString(DCM_ValueType, type) &&
           type == "CONTAINER";
}

std::optional<Http::Response> showWhole(const Http::Request& request, const Http::AcceptHeader& accept,
                                        const ServedStudy& study, const ListedImage& image,
                                        ObjectShelf& objects)
{
    if (isPdf(study, image.key))
        return showPdf(request, accept, study, image, objects);
    if (isReport(study, image.key))
        return showReport(request, accept, study, image, objects);
    if (!namesVideo(accept))
        return std::nullopt;
    ImageOrigin origin;
    FoundObject object;
    Verdict verdict = takeImage(study, image.key, origin, nullptr);
    if (verdict.good())
        verdict = objects.open(origin, object);
    if (verdict.bad())
        return verdict.response();
    if (!isVideo(object.index.transferSyntaxUID()) || !object.index.hasPixels())
        return std::nullopt;
    return showVideo(request, accept, object);
}

}  // namespace Kdd::DicomWeb
