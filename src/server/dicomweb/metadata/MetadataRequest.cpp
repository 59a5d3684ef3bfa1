#include "server/dicomweb/metadata/MetadataRequest.h"

#include "server/http/AcceptHeader.h"

#include <QCryptographicHash>
#include <QList>

#include <dcmtk/dcmdata/dctag.h>
#include <kddlib/BuildInfo.h>

#include <algorithm>
#include <cctype>

namespace Kdd::DicomWeb
{
namespace
{

// More than all that the largest modules hold; each keyword is a search in the dictionary.
constexpr int kMaxFields = 500;

constexpr const char* kXml = "application/dicom+xml";

/// By eight hexadecimal digits or a keyword.
bool readField(const QByteArray& text, DcmTagKey& key)
{
    bool isNumber = false;
    const uint number = text.size() == 8 ? text.toUInt(&isNumber, 16) : 0;
    if (isNumber) {
        key.set(static_cast<Uint16>(number >> 16), static_cast<Uint16>(number & 0xffff));
        return true;
    }
    if (!std::all_of(text.begin(), text.end(), [](unsigned char c) { return std::isalnum(c) != 0; }))
        return false;
    DcmTag tag;
    // Names of private attributes mean something only together with their creator.
    if (DcmTag::findTagFromName(text.constData(), tag).bad() || (tag.getGroup() & 1) != 0)
        return false;
    key = tag;
    return true;
}

bool readFields(const Http::Request& request, QVector<DcmTagKey>& wanted, QString& reason)
{
    bool isAll = false;
    for (const QByteArray& list : request.parameters("includefield")) {
        for (const QByteArray& each : list.split(',')) {
            const QByteArray field = each.trimmed();
            DcmTagKey key;
            if (field == "all") {
                isAll = true;
            } else if (wanted.size() == kMaxFields) {
                reason = QStringLiteral("includefield names more than %1 attributes").arg(kMaxFields);
                return false;
            } else if (field.isEmpty() || !readField(field, key)) {
                reason = QStringLiteral("includefield names no attribute: %1")
                             .arg(QString::fromUtf8(field.left(64)));
                return false;
            } else {
                wanted.append(key);
            }
        }
    }
    if (isAll)
        wanted.clear();
    std::sort(wanted.begin(), wanted.end());
    wanted.erase(std::unique(wanted.begin(), wanted.end()), wanted.end());
    return true;
}

}  // namespace

bool MetadataRequest::read(const Http::Request& request, const ResourcePath& resource, int& status,
                           QString& reason)
{
    static const QVector<Http::MediaType> offers = {
        {"application/dicom+json", {}}, {"application/json", {}}, {"multipart/related", kXml}};
    path = resource;
    const int chosen = Http::AcceptHeader::of(request).choose(offers);
    if (chosen < 0) {
        status = 406;
        reason = QStringLiteral("Metadata comes as application/dicom+json, application/json or "
                                "multipart/related; type=\"application/dicom+xml\"");
        return false;
    }
    form = chosen < 2 ? MetadataForm::Json : MetadataForm::Xml;
    mediaType = chosen < 2 ? offers.at(chosen).name : offers.at(chosen).parts;
    takesGzip = Http::acceptsCoding(request, "gzip");
    status = 400;
    return readFields(request, wanted, reason);
}

QByteArray MetadataRequest::contentType() const
{
    if (form == MetadataForm::Json)
        return mediaType;
    return "multipart/related; type=\"" + mediaType + "\"; boundary=" + boundary();
}

QByteArray MetadataRequest::digest() const
{
    QCryptographicHash hash(QCryptographicHash::Md5);
    // The release too: another one may write the same study in another way.
    const QByteArray fields[] = {path.study, path.series, path.instance, mediaType,
                                 QByteArray(BuildInfo::text())};
    for (const QByteArray& field : fields) {
        hash.addData(field);
        hash.addData("\n", 1);
    }
    for (const DcmTagKey& key : wanted)
        hash.addData(QByteArray::number(key.hash(), 16) + ',');
    return hash.result().toHex();
}

}  // namespace Kdd::DicomWeb
