#include "sample/Charset.h"

#include "sample/Fault.h"

#include <QString>

namespace Kdd
{

namespace
{

// The alphabets lie in Unicode in the same order as in their ISO 8859 part, so that a constant distance
// suffices.
struct Alphabet
{
    ushort first;
    ushort last;
    int distance;
};

// What is in the set and at which distance, as its ISO 8859 part has it.
const Alphabet kLatin = {0x00A0, 0x00FF, 0};
const Alphabet kGreek = {0x0384, 0x03CE, 0x2D0};
const Alphabet kCyrillic = {0x0401, 0x045F, 0x360};

struct Kanji
{
    char16_t character;
    const char* jis;  // the two bytes of JIS X 0208
};

// Only what the names need; the kana are computed.
const Kanji kKanji[] = {
    {u'山', ";3"}, {u'田', "ED"}, {u'太', "B@"}, {u'郎', "O:"}, {u'花', "2V"}, {u'子', ";R"},
    {u'中', "Cf"}, {u'村', "B<"}, {u'一', "0l"}, {u'鈴', "Nk"}, {u'木', "LZ"},
};

// The escapes of ISO 2022 that lead into the two-byte set and back.
const char* const kToJapanese = "\033$B";
const char* const kToAscii = "\033(B";
// One row of the set holds the kana in the order of Unicode.
constexpr ushort kFirstHiragana = 0x3041;
constexpr ushort kLastHiragana = 0x3093;

[[noreturn]] void failOn(QChar character, SampleCharset charset)
{
    throw SampleFault(QStringLiteral("The character U+%1 has no code in the character set \"%2\"")
                          .arg(character.unicode(), 4, 16, QLatin1Char('0'))
                          .arg(QString::fromLatin1(specificCharacterSet(charset))));
}

QByteArray inAlphabet(SampleCharset charset, const Alphabet& alphabet, const QString& text)
{
    QByteArray bytes;
    for (const QChar character : text) {
        const ushort code = character.unicode();
        // ASCII is the lower half of each of these sets.
        if (code < 0x80) {
            bytes.append(static_cast<char>(code));
        } else if (code >= alphabet.first && code <= alphabet.last) {
            bytes.append(static_cast<char>(code - alphabet.distance));
        } else {
            failOn(character, charset);
        }
    }
    return bytes;
}

QByteArray jisOf(QChar character)
{
    const ushort code = character.unicode();
    // "$" is the row of the hiragana.
    if (code >= kFirstHiragana && code <= kLastHiragana)
        return QByteArray("$").append(static_cast<char>('!' + code - kFirstHiragana));
    for (const Kanji& kanji : kKanji) {
        if (kanji.character == code)
            return kanji.jis;
    }
    failOn(character, SampleCharset::Japanese);
}

// Delimiters and line ends are ASCII, so that each part of a name ends in the set it began in, as it has to.
QByteArray inJapanese(const QString& text)
{
    QByteArray bytes;
    bool isJapanese = false;
    for (const QChar character : text) {
        const bool wantsJapanese = character.unicode() >= 0x80;
        if (wantsJapanese != isJapanese)
            bytes.append(wantsJapanese ? kToJapanese : kToAscii);
        isJapanese = wantsJapanese;
        // Of the two bytes neither is 80 or above, so only the escapes tell them from ASCII.
        bytes.append(wantsJapanese ? jisOf(character) : QByteArray(1, character.toLatin1()));
    }
    // Text ends in ASCII, or what follows the value would be read as Japanese.
    return isJapanese ? bytes.append(kToAscii) : bytes;
}

}  // namespace

QByteArray specificCharacterSet(SampleCharset charset)
{
    switch (charset) {
    case SampleCharset::Ascii:
        return {};
    case SampleCharset::Latin1:
        return "ISO_IR 100";
    case SampleCharset::Greek:
        return "ISO_IR 126";
    case SampleCharset::Cyrillic:
        return "ISO_IR 144";
    // The empty first value is the set that texts begin in: ASCII.
    case SampleCharset::Japanese:
        return "\\ISO 2022 IR 87";
    case SampleCharset::Utf8:
        return "ISO_IR 192";
    }
    return {};
}

QByteArray inCharset(SampleCharset charset, const char* utf8)
{
    const QString text = QString::fromUtf8(utf8);
    switch (charset) {
    case SampleCharset::Ascii:
        // An alphabet without letters refuses everything beyond ASCII.
        return inAlphabet(charset, {}, text);
    case SampleCharset::Latin1:
        return inAlphabet(charset, kLatin, text);
    case SampleCharset::Greek:
        return inAlphabet(charset, kGreek, text);
    case SampleCharset::Cyrillic:
        return inAlphabet(charset, kCyrillic, text);
    case SampleCharset::Japanese:
        return inJapanese(text);
    case SampleCharset::Utf8:
        return utf8;
    }
    return {};
}

}  // namespace Kdd
