#include "server/dimse/MetaHeader.h"

#include <QtEndian>

#include <dcmtk/config/osconfig.h>

#include <dcmtk/dcmdata/dcuid.h>

namespace Kdd::Dimse
{
namespace
{

constexpr int kPreamble = 128;

template <typename Number>
void append(QByteArray& to, Number number)
{
    const Number little = qToLittleEndian(number);
    to.append(reinterpret_cast<const char*>(&little), sizeof little);
}

/// Of group 2, with an even length.
void append(QByteArray& to, quint16 element, const char* vr, QByteArray value, char padding)
{
    if (value.size() % 2 != 0)
        value.append(padding);
    append<quint16>(to, 2);
    append<quint16>(to, element);
    to.append(vr, 2);
    append<quint16>(to, static_cast<quint16>(value.size()));
    to.append(value);
}

}  // namespace

QByteArray MetaHeader::bytes() const
{
    // The version has a VR whose length takes six bytes.
    QByteArray elements("\x02\x00\x01\x00OB\x00\x00\x02\x00\x00\x00\x00\x01", 14);
    append(elements, 0x02, "UI", sopClass, '\0');
    append(elements, 0x03, "UI", sopInstance, '\0');
    append(elements, 0x10, "UI", transferSyntax, '\0');
    append(elements, 0x12, "UI", OFFIS_IMPLEMENTATION_CLASS_UID, '\0');
    append(elements, 0x13, "SH", OFFIS_DTK_IMPLEMENTATION_VERSION_NAME, ' ');
    append(elements, 0x16, "AE", sender, ' ');
    QByteArray length(4, 0);
    qToLittleEndian<quint32>(static_cast<quint32>(elements.size()), length.data());
    QByteArray made(kPreamble, 0);
    made.append("DICM");
    append(made, 0x00, "UL", length, '\0');
    return made + elements;
}

}  // namespace Kdd::Dimse
