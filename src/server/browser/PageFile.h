#pragma once

#include <QByteArray>

namespace Kdd::Browser
{

/// A file of the page as it was when the program was built.
struct PageFile
{
    const char* name;  ///< "app.js"
    const char* mediaType;
    const char* digest;  ///< of the content, in hexadecimal digits
    const unsigned char* content;
    int size;                         ///< [bytes]
    const unsigned char* compressed;  ///< the same as gzip
    int compressedSize;               ///< [bytes]
};

/// Null when the page has no such file.
const PageFile* findPageFile(const QByteArray& name);

}  // namespace Kdd::Browser
