#pragma once

#include <QJsonObject>
#include <QVector>

namespace Kdd
{

class TagFile;
class TagMap;

}  // namespace Kdd

namespace Kdd::Browser
{

/// Images of a series in one answer, at most.
constexpr int kMaxListedImages = 1000;

/// What a study shows of itself and its series, without their images:
///
///     {"study": "1.2", "images": 120, "corrected": true, "own": 60,
///      "attributes": {"PatientName": "Doe^Jane", "StudyDate": "20240131", ...},
///      "sizes": {"tagFile": 20480, "uncompressed": 90000, "previews": 9000},
///      "series": [{"key": "1.3", "label": "CT 2 Lung", "images": 120, "own": 70, "preview": true,
///                  "attributes": {"Modality": "CT", ...}, "volumes": [...]}]}
///
/// Sizes are those of the tag file [bytes], "own" counts the values that a node holds itself. Series come by number.
QJsonObject studyJson(const TagFile& file);

/// Of the images of a series, by number, those from `offset` on, at most `limit`:
///
///     {"count": 120, "offset": 0,
///      "images": [{"key": "1.4", "number": "1", "preview": true, "pixels": true, "frames": 1}]}
QJsonObject imagesJson(const TagMap& series, int offset, int limit);

/// An image, where it stands among the images of its series, and how much each of its three nodes holds:
///
///     {"study": "1.2", "key": "1.4", "series": "1.3", "position": 3, "count": 120, "previous": "1.4.2", "next": null,
///      "image": {...as in a list...}, "own": {"study": 60, "series": 70, "image": 9}}
QJsonObject imageJson(const TagMap& image);

/// The series of a study or the images of a series, by number and then by UID.
QVector<TagMap*> sortedChildren(const TagMap& node);

}  // namespace Kdd::Browser
