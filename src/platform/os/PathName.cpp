#include "platform/os/PathName.h"

#include <QFile>

#include <filesystem>
#include <system_error>

namespace Kdd
{
namespace
{

// Second halves of surrogate pairs, which stand alone in no valid text: the byte XX is the character U+DCXX.
constexpr ushort kFirstByte = 0xDC80;
constexpr ushort kLastByte = 0xDCFF;
constexpr ushort kShift = 0xDC00;

/// Such a character is the second half of one beyond the first plane when the first half stands before it.
bool isByte(const QString& text, int i)
{
    return text.at(i) >= QChar(kFirstByte) && text.at(i) <= QChar(kLastByte) &&
           (i == 0 || !text.at(i - 1).isHighSurrogate());
}

}  // namespace

bool isPlainText(const QByteArray& bytes)
{
    // Tried with the very bytes, so it holds for every encoding that a locale may have.
    return QFile::encodeName(QFile::decodeName(bytes)) == bytes;
}

QString pathText(const QByteArray& bytes)
{
    // Nearly every name: it stays readable, and Qt's own classes find it.
    if (isPlainText(bytes))
        return QFile::decodeName(bytes);
    QString text;
    for (const char byte : bytes) {
        const auto code = static_cast<uchar>(byte);
        text += QChar(static_cast<ushort>(code < 0x80 ? code : kShift + code));
    }
    return text;
}

QByteArray pathBytes(const QString& path)
{
    QByteArray bytes;
    int from = 0;
    // Text between such characters goes through the locale's encoding, each of them becomes the byte it
    // stands for.
    for (int i = 0; i < path.size(); ++i) {
        if (!isByte(path, i))
            continue;
        bytes += QFile::encodeName(path.mid(from, i - from));
        bytes += static_cast<char>(path.at(i).unicode() - kShift);
        from = i + 1;
    }
    return bytes + QFile::encodeName(path.mid(from));
}

bool makeFolder(const QString& path)
{
    // Not by Qt, which knows only names that are texts.
    const std::filesystem::path folder(pathBytes(path).toStdString());
    std::error_code error;
    std::filesystem::create_directories(folder, error);
    // Asked for itself: another process may have made it meanwhile, which is no failure.
    return std::filesystem::is_directory(folder, error);
}

}  // namespace Kdd
