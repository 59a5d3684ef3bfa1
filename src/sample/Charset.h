#pragma once

#include <QByteArray>

namespace Kdd
{

/// The character sets that the sample patients' texts are written in.
enum class SampleCharset { Ascii, Latin1, Greek, Cyrillic, Japanese, Utf8 };

/// The value of Specific Character Set (0008,0005); empty for ASCII, where the attribute is left out.
QByteArray specificCharacterSet(SampleCharset charset);

/// `utf8` in the bytes of `charset`. SampleFault: the text holds a character that the set has not.
QByteArray inCharset(SampleCharset charset, const char* utf8);

}  // namespace Kdd
