#pragma once

#include "server/http/Request.h"

namespace Kdd::Http
{

/// A media type as an answer has it. For multipart/related also the type of its parts.
struct MediaType
{
    QByteArray name;   ///< "image/jpeg", in small letters
    QByteArray parts;  ///< of multipart/related: "application/dicom"; else empty
};

/// One range of media types that a client takes.
struct MediaRange
{
    QByteArray name;            ///< in small letters; "*/*" and "image/*" stand for many
    QByteArray parts;           ///< parameter `type` of multipart/related, in small letters; empty: any
    QByteArray transferSyntax;  ///< parameter `transfer-syntax`; "*": as stored; empty: none was named
    QByteArray charset;         ///< in small letters; empty: none was named
    int quality = 1000;         ///< [thousandths]; 0: not this one

    /// How closely the range names the type: 0 not at all, more for one that says more.
    int closeness(const MediaType& type) const;
};

/// What a client takes: its Accept header, or in place of that the query parameter `accept`, for clients that cannot
/// set headers. Values of parameters may stand without quotes although they hold a "/": viewers do that to save the
/// browser's preliminary request.
class AcceptHeader
{
public:
    /// Anything is taken when the request names nothing.
    static AcceptHeader of(const Request& request);

    /// Ranges that are none are passed over, as are those beyond a number that no client reaches.
    explicit AcceptHeader(const QByteArray& text);

    /// Best first; of the same quality in the order sent. Refused ones (quality 0) are among them, at the end.
    const QVector<MediaRange>& ranges() const { return mRanges; }

    /// How welcome the type is [thousandths], as the range says that names it most closely; 0: not at all.
    int quality(const MediaType& type) const;

    /// The index of the type to give, the first of the most welcome ones; -1 when none is taken.
    int choose(const QVector<MediaType>& offers) const;

private:
    QVector<MediaRange> mRanges;
};

/// Whether the client takes the content coding ("gzip"): it is named, or "*" is, with a quality above 0.
bool acceptsCoding(const Request& request, const QByteArray& coding);

}  // namespace Kdd::Http
