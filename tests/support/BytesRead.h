#pragma once

#include <QFile>

namespace Kdd
{

/// What this process has read from files so far [bytes].
inline qint64 bytesRead()
{
    QFile file(QStringLiteral("/proc/self/io"));
    return file.open(QIODevice::ReadOnly) ? file.readLine().mid(int(sizeof "rchar:")).trimmed().toLongLong()
                                          : -1;
}

/// Resident memory of a process, or of this one [KiB].
inline qint64 residentMemory(const QString& process = QStringLiteral("self"))
{
    QFile file(QStringLiteral("/proc/%1/status").arg(process));
    const QByteArray text = file.open(QIODevice::ReadOnly) ? file.readAll() : QByteArray();
    return text.mid(text.indexOf("VmRSS:") + 6).trimmed().split(' ').first().toLongLong();
}

}  // namespace Kdd
