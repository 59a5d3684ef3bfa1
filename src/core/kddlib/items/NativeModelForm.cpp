#include "kddlib/items/NativeModelForm.h"

#include "kddlib/items/KeyDigits.h"
#include "kddlib/tagmodel/AttributeNames.h"

#include <QString>

#include <iterator>

namespace Kdd
{

namespace
{

using Text = std::string_view;

constexpr const char* kComponents[] = {"FamilyName", "GivenName", "MiddleName", "NamePrefix", "NameSuffix"};

/// Text as XML can hold it. Control characters have no form there, not even an escaped one.
void appendEscaped(QByteArray& out, Text text)
{
    const char* const kReplacement = "\xef\xbf\xbd";
    for (std::size_t i = 0; i < text.size(); ++i) {
        const auto c = static_cast<unsigned char>(text[i]);
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
            out.append(kReplacement);
        else if (const Text next = text.substr(i, 3); next == "\xef\xbf\xbe" || next == "\xef\xbf\xbf")
            out.append(kReplacement), i += 2;
        else
            out.append(text[i]);
    }
}

void appendEscaped(QByteArray& out, const QByteArray& text)
{
    appendEscaped(out, Text(text.constData(), static_cast<std::size_t>(text.size())));
}

void appendOpening(QByteArray& out, const AttributeName& name, const char* vr)
{
    const bool isPrivate = (name.key.getGroup() & 1) != 0 && name.key.getElement() > 0xff;
    // The block that a creator happens to have reserved is no part of an attribute's name.
    const DcmTagKey shown(name.key.getGroup(), isPrivate && name.creator != nullptr
                                                   ? name.key.getElement() & 0xff
                                                   : name.key.getElement());
    out.append("<DicomAttribute tag=\"").append(keyDigits(shown)).append("\" vr=\"").append(vr).append('"');
    const QByteArray keyword =
        (name.key.getGroup() & 1) == 0 ? attributeName(name.key, nullptr) : QByteArray();
    if (!keyword.isEmpty()) {
        out.append(" keyword=\"");
        appendEscaped(out, keyword);
        out.append('"');
    }
    if (name.creator != nullptr) {
        out.append(" privateCreator=\"");
        appendEscaped(out, QString::fromLatin1(name.creator).toUtf8());
        out.append('"');
    }
    out.append('>');
}

void beginValue(QByteArray& out, const char* element, int index)
{
    out.append('<').append(element).append(" number=\"").append(QByteArray::number(index + 1)).append("\">");
}

void endValue(QByteArray& out, const char* element)
{
    out.append("</").append(element).append('>');
}

void appendComponents(QByteArray& out, const char* element, Text group)
{
    if (group.empty())
        return;
    out.append('<').append(element).append('>');
    for (const char* component : kComponents) {
        const std::size_t end = group.find('^');
        if (const Text text = group.substr(0, end); !text.empty()) {
            out.append('<').append(component).append('>');
            appendEscaped(out, text);
            endValue(out, component);
        }
        group = end == Text::npos ? Text() : group.substr(end + 1);
    }
    endValue(out, element);
}

}  // namespace

const NativeModelForm& NativeModelForm::instance()
{
    static const NativeModelForm form;
    return form;
}

void NativeModelForm::beginValues(QByteArray& out, const AttributeName& name, const char* vr) const
{
    appendOpening(out, name, vr);
}

void NativeModelForm::endValues(QByteArray& out, int /*count*/) const
{
    out.append("</DicomAttribute>");
}

void NativeModelForm::text(QByteArray& out, int index, Text text) const
{
    beginValue(out, "Value", index);
    appendEscaped(out, text);
    endValue(out, "Value");
}

void NativeModelForm::name(QByteArray& out, int index, const NameGroups& groups) const
{
    beginValue(out, "PersonName", index);
    appendComponents(out, "Alphabetic", groups.alphabetic);
    appendComponents(out, "Ideographic", groups.ideographic);
    appendComponents(out, "Phonetic", groups.phonetic);
    endValue(out, "PersonName");
}

void NativeModelForm::numeral(QByteArray& out, int index, Text text) const
{
    this->text(out, index, text);
}

void NativeModelForm::number(QByteArray& out, int index, Text digits) const
{
    text(out, index, digits);
}

void NativeModelForm::binary(QByteArray& out, const QByteArray& bytes) const
{
    out.append("<InlineBinary>").append(bytes.toBase64()).append("</InlineBinary>");
}

void NativeModelForm::beginAddress(QByteArray& out) const
{
    out.append("<BulkData uri=\"");
}

void NativeModelForm::endAddress(QByteArray& out) const
{
    out.append("\"/>");
}

QByteArray NativeModelForm::addressPart(const QByteArray& text) const
{
    QByteArray escaped;
    appendEscaped(escaped, text);
    return escaped;
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
