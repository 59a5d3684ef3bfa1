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

/// One range of the client against the offer.
bool fits(const Http::MediaRange& range, const PixelOffer& offer, PixelForm& form)
{
    const bool isMultipart = range.name == "multipart/related";
    const QByteArray& type = isMultipart ? range.parts : range.name;
    const bool isEither = isAnything(range.name) || range.name == "multipart/*";
    form.isSinglePart = isEither ? offer.prefersSingle && offer.canBeSingle : !isMultipart;
    if (form.isSinglePart && !offer.canBeSingle)
        return false;

    const QByteArray stored = mediaTypeOf(offer.transferSyntax);
    const QByteArray& syntax = range.transferSyntax;
    const bool isNative = offer.transferSyntax == kExplicitLittleEndian;
    const bool isNamed = names(type, stored) && stored != kOctetStream;
    // Whoever takes any transfer syntax takes it under its own name, also where it asks for plain bytes: viewers do.
    const bool takesStored = syntax == "*" || syntax == offer.transferSyntax ||
                             (syntax.isEmpty() && (isNamed || isAnything(type)));
    const bool isStoredType = covers(type, stored) || (type == kOctetStream && !syntax.isEmpty());
    if (takesStored && isStoredType) {
        form.isStored = true;
        form.mediaType = stored;
        form.transferSyntax = offer.transferSyntax;
        return true;
    }
    const bool takesDecoded = syntax.isEmpty() || syntax == kExplicitLittleEndian;
    if (!takesDecoded || !covers(type, kOctetStream) || !offer.canDecode)
        return false;
    form.isStored = isNative;
    form.mediaType = kOctetStream;
    form.transferSyntax = kExplicitLittleEndian;
    return true;
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
        {"1.2.840.10008.1.2.4.70", "image/jpeg"},
        {"1.2.840.10008.1.2.4.80", "image/jls"},
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
        {"1.2.840.10008.1.2.5", "image/dicom-rle"},
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
    for (const Http::MediaRange& range : accept.ranges()) {
        PixelForm fitting;
        if (range.quality > 0 && fits(range, offer, fitting)) {
            form = fitting;
            return true;
        }
    }
    return false;
}

QByteArray InstanceForm::syntaxFor(const QByteArray& stored, bool canDecode) const
{
    for (const QByteArray& syntax : syntaxes) {
        if (syntax == "*" || syntax == stored)
            return stored;
        if (canDecode && (syntax == kExplicitLittleEndian || syntax == kImplicitLittleEndian))
            return syntax;
    }
    return {};
}

bool chooseInstanceForm(const Http::AcceptHeader& accept, bool canBeSingle, InstanceForm& form)
{
    bool isChosen = false;
    for (const Http::MediaRange& range : accept.ranges()) {
        InstanceForm::Packing packing = InstanceForm::Packing::Multipart;
        if (range.quality == 0 || !packingOf(range, canBeSingle, packing))
            continue;
        if (!isChosen)
            form = {packing, {}};
        isChosen = true;
        if (packing == form.packing)
            form.syntaxes.append(range.transferSyntax.isEmpty() ? kExplicitLittleEndian : range.transferSyntax);
    }
    return isChosen;
}

}  // namespace Kdd::DicomWeb
