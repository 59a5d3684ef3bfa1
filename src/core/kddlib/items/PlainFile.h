#pragma once

#include <QtGlobal>

#include <memory>

namespace Kdd
{

class PlainSource;
class TagMap;

/// What a DICOM file says of its image.
struct PlainImage
{
    PlainImage();
    PlainImage(PlainImage&&) noexcept;
    PlainImage& operator=(PlainImage&&) noexcept;
    ~PlainImage();

    std::unique_ptr<TagMap> map;  ///< parentless
    qint64 pixelBytes = 0;        ///< what its pixels take of the file
};

/// Makes of an image's file what `TagMap::createTagMap` makes of its dataset, if it is written in the usual way: with its
/// prefix and meta header, in ascending order, all lengths right and all texts padded with blanks. False, with nothing
/// said of the file, if it is not, or is no image; DCMTK's parser then has the word.
///
/// That parser makes an object of every element and asks a dictionary behind a lock for each, which takes ten times
/// as long as to read it and keeps threads waiting for each other. Long values are passed over unread. Nothing is
/// logged; may be called on any thread.
bool readPlainFile(PlainSource& file, unsigned int maxLength, PlainImage& image);

}  // namespace Kdd
