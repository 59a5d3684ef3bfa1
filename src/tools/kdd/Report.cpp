#include "tools/kdd/Report.h"

#include <QJsonDocument>

#include <kddlib/TagMap.h>
#include <kddlib/TextDecoding.h>

#include <cstdio>

namespace Kdd
{

void printJson(const QJsonObject& object)
{
    // On one line, so that scripts can read line by line.
    const QByteArray text = QJsonDocument(object).toJson(QJsonDocument::Compact);
    std::printf("%s\n", text.constData());
}

QJsonArray jsonOf(const std::vector<RefusedFile>& files)
{
    QJsonArray list;
    for (const RefusedFile& file : files)
        list.append(QJsonObject{{QStringLiteral("path"), displayText(file.path)},
                                {QStringLiteral("reason"), withoutControls(file.reason)}});
    return list;
}

void printTable(const QList<QStringList>& rows)
{
    if (rows.isEmpty())
        return;
    QList<int> widths;
    for (const QStringList& row : rows) {
        for (int i = 0; i < row.size(); ++i) {
            if (i >= widths.size())
                widths.append(0);
            // In characters and not in bytes, so that names in other scripts line up as well.
            widths[i] = qMax(widths.at(i), row.at(i).size());
        }
    }
    for (const QStringList& row : rows) {
        QString line;
        for (int i = 0; i < row.size(); ++i) {
            const bool isNumber = rows.first().at(i).endsWith(QLatin1Char(' '));
            // The blank in the heading was only the mark.
            const QString cell = row.at(i).trimmed();
            line += isNumber ? cell.rightJustified(widths.at(i)) : cell.leftJustified(widths.at(i));
            line += QStringLiteral("  ");
        }
        std::printf("%s\n", qUtf8Printable(line.trimmed()));
    }
}

QString humanBytes(qint64 bytes)
{
    // Powers of a thousand, as disks and networks are sold by.
    const char* const units[] = {"B", "KB", "MB", "GB", "TB"};
    auto value = static_cast<double>(bytes);
    int unit = 0;
    while (value >= 1000 && unit < 4) {
        value /= 1000;
        ++unit;
    }
    return QString::asprintf(unit == 0 ? "%.0f %s" : "%.1f %s", value, units[unit]);
}

QString withoutControls(const QString& text)
{
    QString shown = text;
    for (QChar& c : shown) {
        // The upper range as well, for some terminals obey those too.
        if (c < QLatin1Char(' ') || (c >= QChar(0x7f) && c < QChar(0xa0)))
            c = QLatin1Char(' ');
    }
    return shown;
}

QString displayText(const QByteArray& text)
{
    return withoutControls(decodeText(text, QByteArray()));
}

}  // namespace Kdd
