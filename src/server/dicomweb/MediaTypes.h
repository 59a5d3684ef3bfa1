#pragma once

#include "server/http/AcceptHeader.h"

#include <QByteArray>
#include <QVector>

namespace Kdd::DicomWeb
{

inline const QByteArray kExplicitLittleEndian("1.2.840.10008.1.2.1");
inline const QByteArray kImplicitLittleEndian("1.2.840.10008.1.2");
inline const QByteArray kDeflatedLittleEndian("1.2.840.10008.1.2.1.99");
inline const QByteArray kOctetStream("application/octet-stream");

/// A transfer syntax, and what frames that have it are outside of DICOM.
struct SyntaxMedia
{
    const char* uid;
    const char* mediaType;
    bool isUsual = false;  ///< meant by whoever names the media type alone, where that stands for several
};

/// All that are known.
const QVector<SyntaxMedia>& syntaxMedia();

/// What frames of the transfer syntax are; bytes of no known kind for one that is not in the table.
QByteArray mediaTypeOf(const QByteArray& syntaxUID);

bool isVideo(const QByteArray& syntaxUID);

/// In which form pixels are sent: as stored or decoded, as what, alone or as parts.
struct PixelForm
{
    bool isStored = false;
    bool isSinglePart = false;
    QByteArray mediaType;
    QByteArray transferSyntax;

    /// For a header Content-Type: the transfer syntax is always told.
    QByteArray contentType() const { return mediaType + "; transfer-syntax=" + transferSyntax; }
};

/// Pixels as they are there to be sent.
struct PixelOffer
{
    QByteArray transferSyntax;  ///< as stored; of those without compression always explicit VR little endian
    bool canDecode = true;
    bool canBeSingle = true;     ///< there is only one part
    bool prefersSingle = false;  ///< where the client takes both alike
    QVector<QByteArray>
        encodings;  ///< other transfer syntaxes in which they can be given, the cheapest first
};

/// Chooses what the client likes best of what can be given; of what it likes alike the cheapest, which is as stored, then
/// decoded. As stored is given where it names the stored syntax or media type, "*" as the transfer syntax, or takes
/// anything; another syntax with compression where it names that, or the media type of which it is the usual one. False
/// when there is nothing that suits.
bool choosePixelForm(const Http::AcceptHeader& accept, const PixelOffer& offer, PixelForm& form);

/// In which form whole objects are sent.
struct InstanceForm
{
    enum class Packing { Multipart, Single, Zip };

    /// A transfer syntax that the client names; "*" is as stored.
    struct Syntax
    {
        QByteArray uid;
        int quality = 0;  ///< [thousandths]; 0: not this one
    };

    Packing packing = Packing::Multipart;
    QVector<Syntax> syntaxes;  ///< best first

    /// The one in which an object is given; empty when it cannot be. `others` are those it can be given in beside the
    /// stored one, the cheapest first.
    QByteArray syntaxFor(const QByteArray& stored, const QVector<QByteArray>& others) const;

private:
    int qualityOf(const QByteArray& uid, bool isStored) const;
};

/// False when the client takes no form of whole objects. `canBeSingle`: there is only one of them.
bool chooseInstanceForm(const Http::AcceptHeader& accept, bool canBeSingle, InstanceForm& form);

}  // namespace Kdd::DicomWeb
