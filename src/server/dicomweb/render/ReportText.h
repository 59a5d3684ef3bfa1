#pragma once

#include <QString>

class DcmItem;

namespace Kdd::DicomWeb
{

/// What a structured report says, item by item with what each of them is called, for people. The dataset's texts are in
/// UTF-8; it is only read.
QString reportAsText(DcmItem& report);

/// The same as a page of HTML without scripts, styles or addresses. Whatever the report says stands in it as text.
QString reportAsHtml(DcmItem& report);

}  // namespace Kdd::DicomWeb
