#pragma once

#include "platform/base/Result.h"

#include <QByteArray>

namespace Kdd
{

/// What the meta information of a DICOM file says.
struct ObjectMeta
{
    QByteArray sopClassUID;
    QByteArray sopInstanceUID;
    QByteArray transferSyntaxUID;
};

/// Where the dataset of a file begins [bytes]. Failure: it is no DICOM file as they are exchanged, with preamble, prefix
/// and meta information.
Result findDataset(const QByteArray& path, qint64& offset);

/// Failure: as above.
Result readMeta(const QByteArray& path, ObjectMeta& meta);

/// Whether two files hold the same object: the same bytes, or the same dataset in the same transfer syntax, for senders
/// write meta information of their own. False also when one cannot be read.
bool isSameObject(const QByteArray& path, const QByteArray& other);

}  // namespace Kdd
