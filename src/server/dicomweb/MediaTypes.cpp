#include "server/dicomweb/MediaTypes.h"

namespace Kdd::DicomWeb
{

namespace
{

/// Whether a range of a client, "image/jpeg", "image/*" or "*/*", covers a type. An empty one covers all.
bool covers(const QByteArray& range, const QByteArray& type)
{
    return range.isEmpty() || range == "*/*" || range == type ||
           (range.endsWith("/*") && type.startsWith(range.left(range.size() - 1)));
}

/// Whether the type is named, and not only one of many that are taken.
bool names(const QByteArray& range, const QByteArray& type)
{
    return !range.isEmpty() && range != "*/*" && covers(range, type);
}

bool isAnything(const QByteArray& range)
{
    return range == "*/*";
}

/// Whether whoever names the media type alone means this syntax of it.
bool isUsual(const QByteArray& syntaxUID)
{
    for (const SyntaxMedia& row : syntaxMedia()) {
        if (syntaxUID == row.uid)
            return row.isUsual;
    }
    return false;
}

/// One way to give pixels, without its packing.
struct Candidate
{
    QByteArray mediaType;
    QByteArray syntax;
    bool isStored = false;   // the bytes as they lie in the file
    bool isDecoded = false;  // plain bytes, stored so or decoded
};

// Whether the range of types, whose transfer syntax may be named as well, takes a candidate.

bool takesPlain(const QByteArray& type, const QByteArray& syntax, const Candidate& candidate)
{
    const bool isSyntax =
        syntax.isEmpty() || syntax == kExplicitLittleEndian || (syntax == "*" && candidate.isStored);
    return isSyntax && covers(type, candidate.mediaType);
}

bool takesEncoded(const QByteArray& type, const QByteArray& syntax, const Candidate& candidate)
{
    if (type == kOctetStream)
        return syntax == candidate.syntax;
    return type == candidate.mediaType &&
           (syntax.isEmpty() ? isUsual(candidate.syntax) : syntax == candidate.syntax);
}

/// Whoever takes any transfer syntax takes it under its own name, also where it asks for plain bytes: viewers do.
bool takesStored(const QByteArray& type, const QByteArray& syntax, const Candidate& candidate)
{
    if (syntax.isEmpty())
        return isAnything(type) || (names(type, candidate.mediaType) && candidate.mediaType != kOctetStream);
    return (syntax == "*" || syntax == candidate.syntax) &&
           (covers(type, candidate.mediaType) || type == kOctetStream);
}

/// How closely it fits, the syntax considered; 0: not at all.
int fitOf(const QByteArray& type, const QByteArray& syntax, const Candidate& candidate)
{
    const auto takes = candidate.isDecoded ? takesPlain : candidate.isStored ? takesStored : takesEncoded;
    if (!takes(type, syntax, candidate))
        return 0;
    if (syntax.isEmpty())
        return 1;
    return syntax == "*" ? 2 : 3;
}

/// How welcome the candidate is, alone or as a part: as the range says that fits it most closely [thousandths].
int qualityOf(const Http::AcceptHeader& accept, const Candidate& candidate, bool isSinglePart)
{
    int closest = 0;
    int quality = 0;
    for (const Http::MediaRange& range : accept.ranges()) {
        const bool isMultipart = range.name == "multipart/related";
        const bool isEither = isAnything(range.name);
        if (!isEither && isSinglePart == (isMultipart || range.name == "multipart/*"))
            continue;
        const QByteArray& type = isMultipart || range.name == "multipart/*" ? range.parts : range.name;
        const int fit = fitOf(type, range.transferSyntax, candidate);
        // A named type is closer than a group of them, a group closer than anything, whatever the syntax.
        const int group = isEither || type.isEmpty() ? 0 : type.endsWith("/*") ? 1 : 2;
        const int closeness = fit == 0 ? 0 : fit + 4 * group + (isEither ? 0 : 1);
        if (closeness > closest) {
            closest = closeness;
            quality = range.quality;
        }
    }
    return quality;
}

/// By what they cost.
QVector<Candidate> candidatesOf(const PixelOffer& offer)
{
    const bool isNative = offer.transferSyntax == kExplicitLittleEndian;
    QVector<Candidate> candidates = {
        {mediaTypeOf(offer.transferSyntax), offer.transferSyntax, true, isNative}};
    if (!isNative && offer.canDecode)
        candidates.append({kOctetStream, kExplicitLittleEndian, false, true});
    for (const QByteArray& uid : offer.encodings)
        candidates.append({mediaTypeOf(uid), uid, false, false});
    return candidates;
}

bool packingOf(const Http::MediaRange& range, bool canBeSingle, InstanceForm::Packing& packing)
{
    using Packing = InstanceForm::Packing;
    const bool isMultipart = range.name == "multipart/related" && covers(range.parts, "application/dicom");
    if (isMultipart || isAnything(range.name) || range.name == "multipart/*")
        packing = Packing::Multipart;
    else if (range.name == "application/zip")
        packing = Packing::Zip;
    else if (range.name == "application/dicom" || range.name == "application/*")
        packing = canBeSingle ? Packing::Single : Packing::Multipart;
    else
        return false;
    // Several objects cannot be sent as one, and who names that form alone could not read another.
    return packing != Packing::Multipart || range.name != "application/dicom";
}

}  // namespace

const QVector<SyntaxMedia>& syntaxMedia()
{
    static const QVector<SyntaxMedia> table = {
        {"1.2.840.10008.1.2", "application/octet-stream"},
        {"1.2.840.10008.1.2.1", "application/octet-stream"},
        {"1.2.840.10008.1.2.1.98", "application/octet-stream"},
        {"1.2.840.10008.1.2.1.99", "application/octet-stream"},
        {"1.2.840.10008.1.2.2", "application/octet-stream"},
        {"1.2.840.10008.1.2.4.50", "image/jpeg"},
        {"1.2.840.10008.1.2.4.51", "image/jpeg"},
        {"1.2.840.10008.1.2.4.53", "image/jpeg"},
        {"1.2.840.10008.1.2.4.55", "image/jpeg"},
        {"1.2.840.10008.1.2.4.57", "image/jpeg"},
        {"1.2.840.10008.1.2.4.70", "image/jpeg", true},
        {"1.2.840.10008.1.2.4.80", "image/jls", true},
        {"1.2.840.10008.1.2.4.81", "image/jls"},
        {"1.2.840.10008.1.2.4.90", "image/jp2"},
        {"1.2.840.10008.1.2.4.91", "image/jp2"},
        {"1.2.840.10008.1.2.4.92", "image/jpx"},
        {"1.2.840.10008.1.2.4.93", "image/jpx"},
        {"1.2.840.10008.1.2.4.100", "video/mpeg"},
        {"1.2.840.10008.1.2.4.101", "video/mpeg"},
        {"1.2.840.10008.1.2.4.102", "video/mp4"},
        {"1.2.840.10008.1.2.4.103", "video/mp4"},
        {"1.2.840.10008.1.2.4.104", "video/mp4"},
        {"1.2.840.10008.1.2.4.105", "video/mp4"},
        {"1.2.840.10008.1.2.4.106", "video/mp4"},
        {"1.2.840.10008.1.2.4.107", "video/mp4"},
        {"1.2.840.10008.1.2.4.108", "video/mp4"},
        {"1.2.840.10008.1.2.4.110", "image/jxl"},
        {"1.2.840.10008.1.2.4.111", "image/jxl"},
        {"1.2.840.10008.1.2.4.112", "image/jxl"},
        {"1.2.840.10008.1.2.4.201", "image/jphc"},
        {"1.2.840.10008.1.2.4.202", "image/jphc"},
        {"1.2.840.10008.1.2.4.203", "image/jphc"},
        {"1.2.840.10008.1.2.5", "image/dicom-rle", true},
        {"1.2.840.10008.1.2.8.1", "application/x-deflate"},
    };
    return table;
}

QByteArray mediaTypeOf(const QByteArray& syntaxUID)
{
    for (const SyntaxMedia& row : syntaxMedia()) {
        if (syntaxUID == row.uid)
            return row.mediaType;
    }
    return kOctetStream;
}

bool isVideo(const QByteArray& syntaxUID)
{
    return mediaTypeOf(syntaxUID).startsWith("video/");
}

bool choosePixelForm(const Http::AcceptHeader& accept, const PixelOffer& offer, PixelForm& form)
{
    int best = 0;
    for (const Candidate& candidate : candidatesOf(offer)) {
        for (const bool isSinglePart : {offer.prefersSingle, !offer.prefersSingle}) {
            if (isSinglePart && !offer.canBeSingle)
                continue;
            const int quality = qualityOf(accept, candidate, isSinglePart);
            if (quality <= best)
                continue;
            best = quality;
            form = {candidate.isStored, isSinglePart, candidate.mediaType, candidate.syntax};
        }
    }
    return best > 0;
}

/// What is named counts more than "as stored".
int InstanceForm::qualityOf(const QByteArray& uid, bool isStored) const
{
    int quality = 0;
    for (const Syntax& each : syntaxes) {
        if (each.uid == uid)
            return each.quality;
        if (each.uid == "*" && isStored)
            quality = qMax(quality, each.quality);
    }
    return quality;
}

QByteArray InstanceForm::syntaxFor(const QByteArray& stored, const QVector<QByteArray>& others) const
{
    QByteArray chosen = stored;
    int best = qualityOf(stored, true);
    for (const QByteArray& uid : others) {
        const int quality = qualityOf(uid, false);
        if (quality <= best)
            continue;
        best = quality;
        chosen = uid;
    }
    return best > 0 ? chosen : QByteArray();
}

bool chooseInstanceForm(const Http::AcceptHeader& accept, bool canBeSingle, InstanceForm& form)
{
    bool isChosen = false;
    for (const Http::MediaRange& range : accept.ranges()) {
        InstanceForm::Packing packing = InstanceForm::Packing::Multipart;
        if (!packingOf(range, canBeSingle, packing) || (range.quality == 0 && !isChosen))
            continue;
        if (!isChosen)
            form = InstanceForm{packing, {}};
        isChosen = true;
        if (packing == form.packing)
            form.syntaxes.append(
                {range.transferSyntax.isEmpty() ? kExplicitLittleEndian : range.transferSyntax,
                 range.quality});
    }
    return isChosen;
}

}  // namespace Kdd::DicomWeb
