#pragma once

#include "server/http/AcceptHeader.h"

#include <QByteArray>
#include <QVector>

namespace Kdd::DicomWeb
{

inline const QByteArray kExplicitLittleEndian("1.2.840.10008.1.2.1");
inline const QByteArray kImplicitLittleEndian("1.2.840.10008.1.2");
inline const QByteArray kOctetStream("application/octet-stream");

/// A transfer syntax, and what frames that have it are outside of DICOM.
struct SyntaxMedia
{
    const char* uid;
    const char* mediaType;
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
    bool canBeSingle = true;    ///< there is only one part
    bool prefersSingle = false; ///< where the client takes both alike
};

/// Chooses what the client likes best of what can be given. As stored is given where it names the stored syntax or media
/// type, "*" as the transfer syntax, or takes anything; else decoded pixels. False when there is nothing that suits.
bool choosePixelForm(const Http::AcceptHeader& accept, const PixelOffer& offer, PixelForm& form);

/// In which form whole objects are sent.
struct InstanceForm
{
    enum class Packing { Multipart, Single, Zip };

    Packing packing = Packing::Multipart;
    QVector<QByteArray> syntaxes;  ///< that the client takes, best first; "*" is as stored

    /// The one in which an object is given; empty when it cannot be. `canDecode` tells whether its pixels can be given
    /// without compression.
    QByteArray syntaxFor(const QByteArray& stored, bool canDecode) const;
};

/// False when the client takes no form of whole objects. `canBeSingle`: there is only one of them.
bool chooseInstanceForm(const Http::AcceptHeader& accept, bool canBeSingle, InstanceForm& form);

}  // namespace Kdd::DicomWeb
