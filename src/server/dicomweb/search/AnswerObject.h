#pragma once

#include <QByteArray>

#include <dcmtk/config/osconfig.h>

#include <dcmtk/dcmdata/dctagkey.h>

#include <utility>
#include <vector>

namespace Kdd::DicomWeb
{

/// The eight hexadecimal digits of an attribute.
QByteArray keyName(const DcmTagKey& key);

/// The element of an attribute among lines as the database keeps them; empty when it is not there.
QByteArray elementOf(const QByteArray& lines, const QByteArray& name);

/// One object of an answer, in the DICOM JSON model.
class AnswerObject
{
public:
    /// Adds an element; one that is there already stays.
    void add(const QByteArray& name, const QByteArray& element);

    void addText(const QByteArray& name, const char* vr, const QByteArray& value);
    void addNumber(const QByteArray& name, int value);

    /// What is there of the names among the lines, or all lines.
    void addLines(const QByteArray& lines, const std::vector<QByteArray>& names);
    void addAllLines(const QByteArray& lines);

    /// The elements of an object as `writeDicomJson` writes it.
    void addObject(const QByteArray& json);

    /// Those of the pairs (name, VR) that are not there yet, without value.
    void addMissing(const std::vector<std::pair<QByteArray, const char*>>& names);

    /// Appends the object; attributes stand in the order of their tags.
    void write(QByteArray& out);

private:
    std::vector<std::pair<QByteArray, QByteArray>> mElements;
};

/// A text as JSON has it, quotes included.
QByteArray jsonText(const QByteArray& text);

}  // namespace Kdd::DicomWeb
