#include "server/dicomweb/render/ReportText.h"

#include <QStringList>
#include <QVector>

#include <dcmtk/dcmdata/dctk.h>
#include <kddlib/Limits.h>

namespace Kdd::DicomWeb
{

namespace
{

/// One line of a report.
struct ReportLine
{
    int depth = 0;
    QString name;
    QString value;
};

QString textOf(DcmItem& item, const DcmTagKey& key)
{
    OFString text;
    item.findAndGetOFStringArray(key, text);
    return QString::fromUtf8(text.c_str()).trimmed();
}

/// What the first item of the sequence says; empty when there is none.
QString textIn(DcmItem& item, const DcmTagKey& sequence, const DcmTagKey& key)
{
    DcmItem* found = nullptr;
    return item.findAndGetSequenceItem(sequence, found, 0).good() && found != nullptr ? textOf(*found, key)
                                                                                      : QString();
}

/// The meaning of a code, or the code where nobody wrote down what it means.
QString meaningIn(DcmItem& item, const DcmTagKey& sequence)
{
    const QString meaning = textIn(item, sequence, DCM_CodeMeaning);
    return meaning.isEmpty() ? textIn(item, sequence, DCM_CodeValue) : meaning;
}

QString measurementOf(DcmItem& item)
{
    DcmItem* measured = nullptr;
    if (item.findAndGetSequenceItem(DCM_MeasuredValueSequence, measured, 0).bad() || measured == nullptr)
        return (QStringLiteral("no value ") + meaningIn(item, DCM_NumericValueQualifierCodeSequence))
            .trimmed();
    const QString number = textOf(*measured, DCM_NumericValue);
    const QString unit = textIn(*measured, DCM_MeasurementUnitsCodeSequence, DCM_CodeValue);
    const QString qualifier = meaningIn(item, DCM_NumericValueQualifierCodeSequence);
    const QString text = number + QLatin1Char(' ') + (unit == QLatin1String("1") ? QString() : unit) +
                         QLatin1Char(' ') + qualifier;
    return text.simplified();
}

/// Of a kind of items whose value is one attribute.
struct PlainKind
{
    const char* type;
    DcmTagKey key;
};

const PlainKind kPlainKinds[] = {
    {"TEXT", DCM_TextValue},     {"PNAME", DCM_PersonName},     {"DATE", DCM_Date},
    {"TIME", DCM_Time},          {"DATETIME", DCM_DateTime},    {"UIDREF", DCM_UID},
    {"SCOORD", DCM_GraphicType}, {"SCOORD3D", DCM_GraphicType}, {"TCOORD", DCM_TemporalRangeType},
};

QString valueOf(DcmItem& item)
{
    const QString type = textOf(item, DCM_ValueType);
    for (const PlainKind& kind : kPlainKinds) {
        if (type == QLatin1String(kind.type))
            return textOf(item, kind.key);
    }
    if (type == QLatin1String("CODE"))
        return meaningIn(item, DCM_ConceptCodeSequence);
    if (type == QLatin1String("NUM"))
        return measurementOf(item);
    if (type == QLatin1String("CONTAINER"))
        return {};
    const QString referenced = textIn(item, DCM_ReferencedSOPSequence, DCM_ReferencedSOPInstanceUID);
    if (!referenced.isEmpty())
        return type + QLatin1Char(' ') + referenced;
    // An item that stands elsewhere in the report is only pointed to.
    const QString place = textOf(item, DCM_ReferencedContentItemIdentifier);
    return place.isEmpty() ? QLatin1Char('(') + type + QLatin1Char(')')
                           : QStringLiteral("item ") + place.split(QLatin1Char('\\')).join(QLatin1Char('.'));
}

void addLines(DcmItem& item, int depth, QVector<ReportLine>& lines)
{
    const ReportLine line{depth, meaningIn(item, DCM_ConceptNameCodeSequence), valueOf(item)};
    if (!line.name.isEmpty() || !line.value.isEmpty())
        lines.append(line);
    DcmSequenceOfItems* content = nullptr;
    if (depth >= kMaxItemDepth || item.findAndGetSequence(DCM_ContentSequence, content).bad() ||
        content == nullptr)
        return;
    for (unsigned long i = 0; i < content->card(); ++i)
        addLines(*content->getItem(i), depth + 1, lines);
}

/// Whose report it is, and whether anybody stands for it.
QVector<ReportLine> linesOf(DcmItem& report)
{
    const struct
    {
        const char* name;
        DcmTagKey key;
    } heads[] = {{"Patient", DCM_PatientName},         {"Patient ID", DCM_PatientID},
                 {"Birth date", DCM_PatientBirthDate}, {"Study date", DCM_StudyDate},
                 {"Study", DCM_StudyDescription},      {"Report date", DCM_ContentDate},
                 {"Completion", DCM_CompletionFlag},   {"Verification", DCM_VerificationFlag},
                 {"Preliminary", DCM_PreliminaryFlag}};
    QVector<ReportLine> lines;
    for (const auto& head : heads) {
        const QString value = textOf(report, head.key);
        if (!value.isEmpty())
            lines.append({0, QLatin1String(head.name), value});
    }
    addLines(report, 0, lines);
    return lines;
}

QString joined(const ReportLine& line)
{
    return line.name.isEmpty() || line.value.isEmpty() ? line.name + line.value
                                                       : line.name + QStringLiteral(": ") + line.value;
}

}  // namespace

QString reportAsText(DcmItem& report)
{
    QString text;
    const QVector<ReportLine> lines = linesOf(report);
    for (const ReportLine& line : lines) {
        const QString indent(line.depth * 2, QLatin1Char(' '));
        text += indent +
                joined(line)
                    .replace(QLatin1String("\r\n"), QLatin1String("\n"))
                    .replace(QLatin1Char('\n'), QLatin1Char('\n') + indent) +
                QLatin1Char('\n');
    }
    return text;
}

QString reportAsHtml(DcmItem& report)
{
    QString body;
    int depth = -1;
    const QVector<ReportLine> lines = linesOf(report);
    for (const ReportLine& line : lines) {
        for (; depth < line.depth; ++depth)
            body += QLatin1String("<ul>\n");
        for (; depth > line.depth; --depth)
            body += QLatin1String("</ul>\n");
        QString value = line.value.toHtmlEscaped();
        value.replace(QLatin1String("\r\n"), QLatin1String("\n"))
            .replace(QLatin1Char('\n'), QLatin1String("<br>\n"));
        const QString name = line.name.toHtmlEscaped();
        const QString colon = name.isEmpty() || value.isEmpty() ? QString() : QStringLiteral(": ");
        body += QStringLiteral("<li><b>") + name + colon + QStringLiteral("</b>") + value +
                QStringLiteral("</li>\n");
    }
    for (; depth >= 0; --depth)
        body += QLatin1String("</ul>\n");
    return QStringLiteral(
               "<!DOCTYPE html>\n<html><head><meta charset=\"utf-8\"><title>Report</title></head><body>\n") +
           body + QStringLiteral("</body></html>\n");
}

}  // namespace Kdd::DicomWeb
