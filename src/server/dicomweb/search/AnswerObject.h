#pragma once

#include <QByteArray>

#include <dcmtk/config/osconfig.h>

#include <dcmtk/dcmdata/dctagkey.h>

#include <string_view>
#include <vector>

namespace Kdd::DicomWeb
{

/// An attribute by one number, the group in its upper half.
using AttributeNumber = quint32;

AttributeNumber numberOf(const DcmTagKey& key);

/// The eight hexadecimal digits of an attribute.
QByteArray keyName(const DcmTagKey& key);

/// The element of an attribute among lines as the database keeps them; empty when it is not there.
QByteArray elementOf(const QByteArray& lines, const DcmTagKey& key);

/// One object of an answer, in the DICOM JSON model.
///
/// An answer has some thousand elements, most of them as the database has them already. So texts are not copied before
/// they are written: whatever is handed in as a view or as lines must outlive the object.
class AnswerObject
{
public:
    struct Element
    {
        AttributeNumber attribute;
        std::string_view text;
    };

    /// Adds an element; one that is there already stays.
    void add(const Element& element);
    void add(AttributeNumber attribute, QByteArray text);

    void addText(AttributeNumber attribute, const char* vr, const QByteArray& value);
    void addNumber(AttributeNumber attribute, int value);

    /// What is there of the attributes among the lines, or all lines. `attributes` are sorted.
    void addLines(const QByteArray& lines, const std::vector<AttributeNumber>& attributes);
    void addAllLines(const QByteArray& lines);

    /// The elements of an object as `writeDicomJson` writes it.
    void addObject(const QByteArray& json);

    /// Appends the object; attributes stand in the order of their tags.
    void write(QByteArray& out);

private:
    std::vector<Element> mElements;
    std::vector<QByteArray> mOwned;  // what some of the views show
};

/// A text as JSON has it, quotes included.
QByteArray jsonText(const QByteArray& text);

}  // namespace Kdd::DicomWeb
