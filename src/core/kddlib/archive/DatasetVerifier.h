#pragma once

#include <QByteArray>

#include <functional>

class DcmItem;

namespace Kdd
{

class TagMap;

/// Holds every attribute of a DICOM dataset against the merged view of an image, VRs and value bytes, and the reverse.
/// Each difference is told to `report` as the path of the attribute and what is wrong with it; the number found is
/// returned. A value may be left out of the cache only when it is longer than the cache keeps.
int verifyDataset(DcmItem& dataset, const TagMap& image,
                  const std::function<void(const QByteArray& path, const QByteArray& fault)>& report);

/// Holds an image against what it is expected to show, a map that was made from its file and corrected: attributes, VRs
/// and value bytes, the audit log included. Each difference is told to `report`; the number found is returned.
int verifyCorrected(const TagMap& expected, const TagMap& image,
                    const std::function<void(const QByteArray& path, const QByteArray& fault)>& report);

}  // namespace Kdd
