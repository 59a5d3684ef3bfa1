#pragma once

#include <QtGlobal>

namespace Kdd
{

// Everything read from a file or the network is held against these bounds before memory is taken or a function recurses.
// docs/limits.md tells them to users.

/// Sequence items inside each other, in DICOM input and in tag files.
constexpr int kMaxItemDepth = 256;

/// A tag file's body before compression [bytes].
constexpr qint64 kMaxBodySize = qint64(256) * 1024 * 1024;

/// Nodes, items and attribute values in one tag file, taken together. A hostile body could otherwise spend three
/// bytes on each of ninety million.
constexpr int kMaxElements = 16 * 1000 * 1000;

/// Images of one tag file that a later one of the same UID replaces.
constexpr int kMaxReplacedImages = 100;

/// Slices of a volume whose list is not stored because it is in order.
constexpr int kMaxRun = 1000 * 1000;

/// Images named by the volumes of one series, taken together.
constexpr int kMaxVolumeImages = 1000 * 1000;

/// The XML of a correction [bytes], and the attributes that it replaces.
constexpr int kMaxJobXml = 1024 * 1024;
constexpr int kMaxSubstitutions = 1000;

/// The body of an HTTP response that is read into memory as a whole [bytes].
constexpr qint64 kMaxResponseSize = qint64(1024) * 1024 * 1024;

/// The file with a service account's key [bytes].
constexpr qint64 kMaxServiceAccountFile = qint64(64) * 1024;

/// Values up to this length are kept, longer ones are only known to exist [bytes].
constexpr unsigned int kDefaultValueBound = 1024;

/// The same for the few attributes that viewers need whole: overlays, curves, look-up tables, graphics [bytes].
constexpr unsigned int kLargeValueBound = 0x1000000;

}  // namespace Kdd
