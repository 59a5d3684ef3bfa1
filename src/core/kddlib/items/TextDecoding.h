#pragma once

#include "platform/base/Export.h"

#include <QByteArray>
#include <QString>

class DcmElement;
class DcmItem;

namespace Kdd
{

/// A text in the character set that a value of Specific Character Set (0008,0005) declares. What the declared set
/// cannot explain is taken for UTF-8 if it is that, else for Latin-1. Japanese code extensions are understood also
/// where DCMTK's conversion library lacks them.
KDD_EXPORT QString decodeText(const QByteArray& bytes, const QByteArray& characterSet);

/// Whether texts of this character set show another character where ASCII has the tilde. In all others ASCII is itself.
KDD_EXPORT bool replacesTilde(const QByteArray& characterSet);

/// A value of a text VR in UTF-8, as `decodeText` decodes it. Without a character set of its own, as codes, dates and
/// numbers, what is ASCII stays as it is.
KDD_EXPORT QByteArray utf8Of(const QByteArray& value, const QByteArray& characterSet, bool hasCharacterSet);

/// Converts a dataset to UTF-8 as a whole, declared character set included. False when that cannot be done: a text
/// does not fit its character set, or items declare one of their own. The dataset may be half converted then.
KDD_EXPORT bool convertToUtf8(DcmItem& dataset);

/// Converts every value on its own, as `decodeText` does, by the character set of its item. Values that are UTF-8
/// already stay as they are; where nothing changes the declared character sets stay as well. Whether
/// anything has changed.
KDD_EXPORT bool convertValuesToUtf8(DcmItem& dataset);

/// The same for one value by the character set of its item; the one declared stays. Whether it has changed.
KDD_EXPORT bool convertValueToUtf8(DcmElement& element, const QByteArray& characterSet);

/// Declares UTF-8 throughout a dataset of nothing but ASCII, unless it declares what no one knows.
KDD_EXPORT void declareUtf8(DcmItem& dataset);

}  // namespace Kdd
