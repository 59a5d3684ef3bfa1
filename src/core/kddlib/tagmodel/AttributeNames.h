#pragma once

#include <QByteArray>
#include <QString>

#include <dcmtk/config/osconfig.h>

#include <dcmtk/dcmdata/dctagkey.h>

namespace Kdd
{

/// Finds the key of an attribute that a caller names by keyword ("PatientName"), by a keyword of an earlier
/// dictionary ("PatientsName"), or by its numbers ("(0010,0010)"). Only public attributes are found. False when the
/// text names none.
///
/// DCMTK's look-up by name walks its whole dictionary, so answers are remembered. May be called on every thread.
bool resolveAttributeName(const QString& name, DcmTagKey& key);

/// The dictionary's keyword of a key, through the private creator if that is not null; empty when it has none.
QByteArray attributeName(const DcmTagKey& key, const char* privateCreator);

}  // namespace Kdd
