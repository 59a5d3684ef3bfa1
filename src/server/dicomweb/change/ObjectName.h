#pragma once

#include <QString>

#include <dcmtk/config/osconfig.h>

#include <dcmtk/dcmdata/dctagkey.h>

namespace Kdd::DicomWeb
{

// How answers of our own name things.

/// A series or an image by its UID. Of those that have none, or something else in its place, a digest: images without UID are
/// known by the path of their file, which concerns nobody outside.
QByteArray publicKey(const QByteArray& key);

/// "00100010"
QString keyDigits(const DcmTagKey& key);

/// That of the dictionary, private attributes left aside; empty when there is none.
QString keywordOf(const DcmTagKey& key);

}  // namespace Kdd::DicomWeb
