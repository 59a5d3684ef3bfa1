#pragma once

#include <QJsonArray>
#include <QJsonObject>
#include <QList>
#include <QStringList>

#include <kddlib/DicomInput.h>

#include <vector>

namespace Kdd
{

/// Writes one JSON object and a line end to standard output.
void printJson(const QJsonObject& object);

/// [{"path":,"reason":}, ...]
QJsonArray jsonOf(const std::vector<RefusedFile>& files);

/// Writes rows with aligned columns to standard output, the first row as a heading. Columns whose heading ends in a
/// blank are set to the right.
void printTable(const QList<QStringList>& rows);

/// "17.3 MB"
QString humanBytes(qint64 bytes);

/// Control characters become blanks, so that a text cannot steer the terminal.
QString withoutControls(const QString& text);

/// Bytes for display: UTF-8 where it is that, else Latin-1; without control characters.
QString displayText(const QByteArray& text);

}  // namespace Kdd
