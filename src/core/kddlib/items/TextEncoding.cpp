#include "kddlib/items/TextEncoding.h"

#include "kddlib/items/TextDecoding.h"

#include <QTextCodec>

#include <algorithm>

namespace Kdd
{

namespace
{

/// How a text of one character set is written: with one of Qt's codecs, behind an escape sequence where the set is not
/// the first one declared.
struct CharacterSet
{
    const char* number;  // what its names end in: "ISO_IR 100", "ISO 2022 IR 100"
    const char* codec;
    const char* escape;
};

const char* const kIntoKanji = "\x1b$B";
const char* const kBackToAscii = "\x1b(B";

const CharacterSet kCharacterSets[] = {
    {"IR 100", "ISO-8859-1", "\x1b-A"},
    {"IR 101", "ISO-8859-2", "\x1b-B"},
    {"IR 109", "ISO-8859-3", "\x1b-C"},
    {"IR 110", "ISO-8859-4", "\x1b-D"},
    {"IR 144", "ISO-8859-5", "\x1b-L"},
    {"IR 127", "ISO-8859-6", "\x1b-G"},
    {"IR 126", "ISO-8859-7", "\x1b-F"},
    {"IR 138", "ISO-8859-8", "\x1b-H"},
    {"IR 148", "ISO-8859-9", "\x1b-M"},
    {"IR 203", "ISO-8859-15", "\x1b-b"},
    {"IR 166", "TIS-620", "\x1b-T"},
    {"IR 13", "Shift_JIS", "\x1b)I"},
    {"IR 87", "ISO-2022-JP", ""},  // the codec writes the escape sequences, but for the last
    {"IR 149", "EUC-KR", "\x1b$)C"},
    {"IR 58", "GB2312", "\x1b$)A"},
    {"IR 192", "UTF-8", ""},
    {"GB18030", "GB18030", ""},
    {"GBK", "GBK", ""},
};

bool isAscii(const QString& text)
{
    return std::all_of(text.begin(), text.end(),
                       [](QChar c) { return c.unicode() < 0x80 && c.unicode() != 0x1b; });
}

/// By the end of the name, which a set has in common with and without code extensions. The
/// underscore of "ISO_IR" counts as a blank.
const CharacterSet* findCharacterSet(QByteArray name)
{
    name.replace('_', ' ');
    const auto* const found =
        std::find_if(std::begin(kCharacterSets), std::end(kCharacterSets), [&](const CharacterSet& set) {
            return name == set.number || name.endsWith(QByteArray(" ") + set.number);
        });
    return found != std::end(kCharacterSets) ? found : nullptr;
}

/// Empty where Qt lacks the codec; no text that has to be written is read back from that.
QByteArray encodedWith(const CharacterSet& set, bool isFirst, const QString& text)
{
    const QTextCodec* codec = QTextCodec::codecForName(set.codec);
    if (codec == nullptr)
        return {};
    const QByteArray bytes = (isFirst ? "" : set.escape) + codec->fromUnicode(text);
    // Delimiters and the end of a value are ASCII.
    return bytes.lastIndexOf(kIntoKanji) > bytes.lastIndexOf(kBackToAscii) ? bytes + kBackToAscii : bytes;
}

/// A part between delimiters. What a codec makes of a character it lacks is not looked into: only what is read back as
/// the same text counts.
bool encodePart(const QString& part, const QByteArray& characterSet, QByteArray& bytes)
{
    if (isAscii(part)) {
        bytes = part.toLatin1();
        return true;
    }
    const QByteArray declared = characterSet.trimmed().isEmpty() ? "ISO_IR 100" : characterSet;
    const QList<QByteArray> names = declared.split('\\');
    for (int i = 0; i < names.size(); ++i) {
        const CharacterSet* set = findCharacterSet(names.at(i).trimmed());
        if (set == nullptr)
            continue;
        // Where the first value is empty it stands for ASCII, which
        // was tried above; all others are switched to.
        bytes = encodedWith(*set, i == 0, part);
        if (decodeText(bytes, characterSet) == part)
            return true;
    }
    return false;
}

bool isDelimiter(QChar c)
{
    return c == QLatin1Char('\\') || c == QLatin1Char('^') || c == QLatin1Char('=');
}

}  // namespace

bool encodeText(const QString& text, const QByteArray& characterSet, QByteArray& bytes)
{
    QByteArray all;
    QByteArray part;
    int start = 0;
    // Part by part, because each begins in the first character set
    // again, whatever the one before was switched to.
    for (int i = 0; i <= text.size(); ++i) {
        if (i < text.size() && !isDelimiter(text.at(i)))
            continue;
        if (!encodePart(text.mid(start, i - start), characterSet, part))
            return false;
        all += part;
        if (i < text.size())
            all += static_cast<char>(text.at(i).unicode());
        start = i + 1;
    }
    // As a whole once more: a two-byte set that one part switches to would hide the delimiters behind it.
    if (decodeText(all, characterSet) != text)
        return false;
    bytes = all;
    return true;
}

}  // namespace Kdd
