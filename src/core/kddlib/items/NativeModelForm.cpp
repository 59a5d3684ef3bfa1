#include "kddlib/items/NativeModelForm.h"

#include "kddlib/items/RealText.h"
#include "kddlib/tagmodel/AttributeNames.h"

#include <QList>
#include <QString>

#include <dcmtk/dcmdata/dcelem.h>
#include <dcmtk/dcmdata/dctag.h>

#include <cmath>
#include <iterator>

namespace Kdd
{

namespace
{

constexpr const char* kGroups[] = {"Alphabetic", "Ideographic", "Phonetic"};
constexpr const char* kComponents[] = {"FamilyName", "GivenName", "MiddleName", "NamePrefix", "NameSuffix"};

/// Text as XML can hold it. Control characters have no form there, not even an escaped one.
QByteArray escaped(const QByteArray& text)
{
    QByteArray out;
    out.reserve(text.size() + 16);
    for (int i = 0; i < text.size(); ++i) {
        const auto c = static_cast<unsigned char>(text.at(i));
        if (c == '&')
            out.append("&amp;");
        else if (c == '<')
            out.append("&lt;");
        else if (c == '>')
            out.append("&gt;");
        else if (c == '"')
            out.append("&quot;");
        else if (c == '\n' || c == '\t' || c == '\r')
            out.append("&#").append(QByteArray::number(c)).append(';');
        else if (c < ' ')
            out.append("\xef\xbf\xbd");
        else if (c == 0xef && (text.mid(i, 3) == "\xef\xbf\xbe" || text.mid(i, 3) == "\xef\xbf\xbf"))
            out.append("\xef\xbf\xbd"), i += 2;
        else
            out.append(text.at(i));
    }
    return out;
}

QByteArray bytesOf(const OFString& text)
{
    return {text.c_str(), static_cast<int>(text.size())};
}

void appendOpening(QByteArray& out, const AttributeName& name, const char* vr)
{
    const bool isPrivate = (name.key.getGroup() & 1) != 0 && name.key.getElement() > 0xff;
    // The block that a creator happens to have reserved is no part of an attribute's name.
    const unsigned int element =
        isPrivate && name.creator != nullptr ? name.key.getElement() & 0xffU : name.key.getElement();
    out.append(QString::asprintf("<DicomAttribute tag=\"%04X%04X\" vr=\"%s\"", unsigned(name.key.getGroup()),
                                 element, vr)
                   .toLatin1());
    const QByteArray keyword =
        (name.key.getGroup() & 1) == 0 ? attributeName(name.key, nullptr) : QByteArray();
    if (!keyword.isEmpty())
        out.append(" keyword=\"").append(escaped(keyword)).append('"');
    if (name.creator != nullptr)
        out.append(" privateCreator=\"")
            .append(escaped(QString::fromLatin1(name.creator).toUtf8()))
            .append('"');
    out.append('>');
}

void appendNumbered(QByteArray& out, const char* element, unsigned long number, const QByteArray& content)
{
    out.append('<').append(element).append(" number=\"").append(QByteArray::number(qulonglong(number)));
    out.append("\">").append(content).append("</").append(element).append('>');
}

void appendElement(QByteArray& out, const char* element, const QByteArray& content)
{
    if (!content.isEmpty())
        out.append('<').append(element).append('>').append(content).append("</").append(element).append('>');
}

QByteArray personName(const QByteArray& name)
{
    QByteArray out;
    const QList<QByteArray> groups = name.split('=');
    for (int i = 0; i < groups.size() && i < static_cast<int>(std::size(kGroups)); ++i) {
        QByteArray group;
        const QList<QByteArray> components = groups.at(i).split('^');
        for (int k = 0; k < components.size() && k < static_cast<int>(std::size(kComponents)); ++k)
            appendElement(group, kComponents[k], escaped(components.at(k)));
        appendElement(out, kGroups[i], group);
    }
    return out;
}

bool isBinary(DcmEVR evr)
{
    switch (evr) {
    case EVR_OB:
    case EVR_OD:
    case EVR_OF:
    case EVR_OL:
    case EVR_OV:
    case EVR_OW:
    case EVR_UN:
    case EVR_ox:
    case EVR_lt:
    case EVR_px:
    case EVR_PixelData:
    case EVR_OverlayData:
    case EVR_UNKNOWN:
        return true;
    default:
        return false;
    }
}

void appendValues(QByteArray& out, DcmElement& element)
{
    OFString text;
    for (unsigned long i = 0; i < element.getVM() && element.getOFString(text, i).good(); ++i) {
        Float64 real = 0;
        const bool isReal =
            element.getVR() == EVR_FD && element.getFloat64(real, i).good() && std::isfinite(real);
        QByteArray value;
        if (isReal)
            appendReal(value, real);
        else
            value = bytesOf(text);
        if (element.getVR() == EVR_PN)
            appendNumbered(out, "PersonName", i + 1, personName(value));
        else if (element.getVR() == EVR_AT)
            appendNumbered(out, "Value", i + 1, (value.mid(1, 4) + value.mid(6, 4)).toUpper());
        else
            appendNumbered(out, "Value", i + 1, escaped(value));
    }
}

void appendBinary(QByteArray& out, DcmElement& element)
{
    QByteArray bytes(static_cast<int>(element.getLengthField()), Qt::Uninitialized);
    if (bytes.isEmpty() ||
        element.getPartialValue(bytes.data(), 0, element.getLengthField(), nullptr, EBO_LittleEndian).bad())
        return;
    out.append("<InlineBinary>").append(bytes.toBase64()).append("</InlineBinary>");
}

}  // namespace

const NativeModelForm& NativeModelForm::instance()
{
    static const NativeModelForm form;
    return form;
}

bool NativeModelForm::plainValue(QByteArray& /*out*/, const DcmTagKey& /*key*/, VrCode /*vr*/,
                                 const QByteArray& /*bytes*/) const
{
    return false;
}

void NativeModelForm::element(QByteArray& out, DcmElement& element, const char* creator) const
{
    const DcmVR vr(element.getTag().getEVR());
    appendOpening(out, {element.getTag(), creator}, vr.getValidVRName());
    if (isBinary(element.getTag().getEVR()))
        appendBinary(out, element);
    else
        appendValues(out, element);
    out.append("</DicomAttribute>");
}

void NativeModelForm::beginOmitted(QByteArray& out, const AttributeName& name) const
{
    appendOpening(out, name, DcmVR(DcmTag(name.key).getEVR()).getValidVRName());
    out.append("<BulkData uri=\"");
}

void NativeModelForm::endOmitted(QByteArray& out) const
{
    out.append("\"/></DicomAttribute>");
}

QByteArray NativeModelForm::addressPart(const QByteArray& text) const
{
    return escaped(text);
}

void NativeModelForm::beginSequence(QByteArray& out, const AttributeName& name) const
{
    appendOpening(out, name, "SQ");
}

void NativeModelForm::endSequence(QByteArray& out, int /*items*/) const
{
    out.append("</DicomAttribute>");
}

void NativeModelForm::beginItem(QByteArray& out, int index) const
{
    out.append("<Item number=\"").append(QByteArray::number(index + 1)).append("\">");
}

void NativeModelForm::endItem(QByteArray& out, int /*begin*/) const
{
    out.append("</Item>");
}

void NativeModelForm::beginImage(QByteArray& out) const
{
    out.append("<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n<NativeDicomModel xml:space=\"preserve\">");
}

void NativeModelForm::endImage(QByteArray& out, int /*begin*/) const
{
    out.append("</NativeDicomModel>\n");
}

void NativeModelForm::declareUtf8(QByteArray& out) const
{
    out.append(R"(<DicomAttribute tag="00080005" vr="CS" keyword="SpecificCharacterSet">)"
               R"(<Value number="1">ISO_IR 192</Value></DicomAttribute>)");
}

}  // namespace Kdd
