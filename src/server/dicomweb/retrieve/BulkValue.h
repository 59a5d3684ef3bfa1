#pragma once

#include "server/dicomweb/retrieve/ImageFinder.h"
#include "server/dicomweb/retrieve/ObjectShelf.h"

#include <kddlib/FrameIndex.h>

namespace Kdd::DicomWeb
{

/// The way to a value, of the segments of a path: "00409096/0/00281051". False when they are of another form.
bool readSteps(const QVector<QByteArray>& segments, QVector<ElementStep>& steps);

/// The same in reverse.
QByteArray textOf(const QVector<ElementStep>& steps);

/// Whether the steps lead to the pixels of the image itself.
bool leadToPixels(const QVector<ElementStep>& steps);

/// One value of an image: bytes of its DICOM file, or what the tag file holds.
struct BulkValue
{
    std::shared_ptr<StoredObject> source;
    QVector<FileStretch> stretches;  ///< of the source, in order
    QByteArray etag;                 ///< empty where another state could not be told from this one
    QByteArray mediaType;            ///< what it is, beside bytes

    qint64 length() const;  ///< [bytes]

    /// Appends `length` bytes from `offset` on.
    void append(qint64 offset, qint64 length, std::vector<Http::BodyPart>& body) const;
};

/// A strong ETag, with its quotes, of what `name` stands for in the state.
QByteArray etagOf(const QByteArray& state, const QByteArray& name);

/// Finds the value that the image shows: in the tag file, or where that left it out in the DICOM file. Of other values
/// than the image's pixels.
Verdict findBulkValue(const ServedStudy& study, const ListedImage& image, const QVector<ElementStep>& steps,
                      ObjectShelf& objects, BulkValue& value);

/// The ways to all values that the tag file left out.
QVector<QVector<ElementStep>> omittedValues(const ServedStudy& study, const ListedImage& image);

}  // namespace Kdd::DicomWeb
