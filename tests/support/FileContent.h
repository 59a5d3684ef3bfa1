#pragma once

#include <QByteArray>
#include <QString>
#include <QStringList>
#include <QTemporaryDir>

#include <gtest/gtest.h>

namespace Kdd
{

/// Writes a file and the folder that it is missing.
void putFile(const QString& path, const QByteArray& content);

/// "(no file)" when there is none.
QByteArray fileContent(const QString& path);

/// All files below a folder, hidden ones too, sorted; with patterns those whose names fit one of them.
QStringList filesBelow(const QString& folder, const QStringList& patterns = {});

/// Changes a bit, as a disk does it, which leaves the time as it was, or as a program.
enum class Clock { Kept, Now };
void flipBit(const QString& path, qint64 byte, Clock clock = Clock::Kept);

/// The journal of a writer that was about to write the content.
QByteArray journalOf(const QByteArray& content);

/// A file, absent at first, in a folder of its own.
class FileTest : public testing::Test
{
protected:
    QString path() const { return mFolder.filePath(QStringLiteral("file")); }
    QByteArray content() const { return fileContent(path()); }

private:
    QTemporaryDir mFolder;
};

}  // namespace Kdd
