#include "kddlib/items/TextDecoding.h"

#include <QTextCodec>

#include <dcmtk/config/osconfig.h>

#include <dcmtk/dcmdata/dcspchrs.h>
#include <dcmtk/dcmdata/dctk.h>

#include <algorithm>

namespace Kdd
{

namespace
{

constexpr char kEscape = '\x1b';

// Code extensions end at the separators of values, components and component groups.
const char* const kDelimiters = "\\^=";

const char* const kUtf8CharacterSet = "ISO_IR 192";

/// An escape sequence may switch to a set whose characters are bytes of ASCII, so it counts as none.
bool isAscii(const QByteArray& bytes)
{
    return std::all_of(bytes.begin(), bytes.end(),
                       [](char c) { return c != kEscape && static_cast<signed char>(c) >= 0; });
}

/// Whether the bytes are the text. Of the sets of DICOM one has another character than ASCII where that has the tilde, and
/// is converted so where images are shown. (Its other one, for the backslash, stands between values.)
bool isText(const QByteArray& bytes, const QByteArray& characterSet)
{
    return isAscii(bytes) && (!bytes.contains('~') || !replacesTilde(characterSet));
}

/// Decodes with one of Qt's codecs; false when bytes are left that it cannot explain.
bool decodeWith(const char* codecName, const QByteArray& bytes, QString& text)
{
    const QTextCodec* codec = QTextCodec::codecForName(codecName);
    if (codec == nullptr)
        return false;
    QTextCodec::ConverterState state(QTextCodec::IgnoreHeader);
    text = codec->toUnicode(bytes.constData(), bytes.size(), &state);
    return state.invalidChars == 0 && state.remainingChars == 0;
}

/// A converter for one character set. Selecting a set makes the system look for its tables, which takes longer than to
/// convert a name; texts that follow each other mostly have the same.
struct SelectedConverter
{
    bool select(const QByteArray& wanted)
    {
        if (isGood && wanted == characterSet)
            return true;
        characterSet = wanted;
        isGood = converter.selectCharacterSet(wanted.constData()).good();
        return isGood;
    }

    QByteArray characterSet;
    DcmSpecificCharacterSet converter;
    bool isGood = false;
};

bool decodeByDeclaration(const QByteArray& bytes, const QByteArray& characterSet, QString& text)
{
    thread_local SelectedConverter tSelected;
    OFString converted;
    if (!tSelected.select(characterSet))
        return false;
    // One that met what it cannot convert is used no further: it may stand in the middle of a text.
    tSelected.isGood =
        tSelected.converter
            .convertString(bytes.constData(), static_cast<size_t>(bytes.size()), converted, kDelimiters)
            .good();
    return tSelected.isGood && decodeWith("UTF-8", QByteArray::fromStdString(converted), text);
}

/// Sets with characters of two bytes, the second of which may look like a delimiter. Of those of China one of four bytes
/// passes for two of two. Shift JIS some write where JIS X 0201 is declared, which has none of the first bytes; whoever
/// escapes to other sets does not.
enum class BytePairs { None, Chinese, ShiftJis };

BytePairs bytePairsOf(const QByteArray& bytes, const QByteArray& characterSet)
{
    for (const QByteArray& name : characterSet.split('\\')) {
        const QByteArray trimmed = name.trimmed();
        if (trimmed == "GB18030" || trimmed == "GBK")
            return BytePairs::Chinese;
        if (trimmed.endsWith("IR 13") && !bytes.contains(kEscape))
            return BytePairs::ShiftJis;
    }
    return BytePairs::None;
}

bool beginsPair(BytePairs pairs, const QByteArray& bytes, int at)
{
    const auto first = static_cast<unsigned char>(bytes.at(at));
    if (pairs == BytePairs::None || first < 0x81 || first > 0xfe)
        return false;
    if (at + 1 == bytes.size() || static_cast<unsigned char>(bytes.at(at + 1)) < 0x40)
        return false;
    return pairs == BytePairs::Chinese || first <= 0x9f || (first >= 0xe0 && first <= 0xfc);
}

/// Kanji come behind escape sequences, katakana as single bytes of JIS X 0201.
bool decodeJapanese(const QByteArray& bytes, BytePairs pairs, QString& text)
{
    if (bytes.contains(kEscape) && decodeWith("ISO-2022-JP", bytes, text))
        return true;
    return pairs == BytePairs::ShiftJis && decodeWith("Shift_JIS", bytes, text);
}

/// What is declared comes first, then what Japanese files write beyond it. UTF-8 comes before Latin-1 because
/// bytes of another set hardly ever are valid UTF-8, while Latin-1 explains any bytes.
QString decodePart(const QByteArray& bytes, const QByteArray& characterSet, BytePairs pairs)
{
    QString text;
    if (isText(bytes, characterSet))
        return QString::fromLatin1(bytes);
    if (decodeByDeclaration(bytes, characterSet, text) || decodeJapanese(bytes, pairs, text) ||
        decodeWith("UTF-8", bytes, text))
        return text;
    return QString::fromLatin1(bytes);
}

bool isDelimiter(char c)
{
    return c == '\\' || c == '^' || c == '=';
}

/// ESC $ switches to a two-byte set, but for ESC $ ) whose characters have the high bit set.
bool entersTwoByteSet(const QByteArray& bytes, int escape)
{
    return bytes.mid(escape + 1, 1) == "$" && bytes.mid(escape + 2, 1) != ")";
}

bool declaresCharacterSet(DcmItem& item, OFString& characterSet)
{
    return item.findAndGetOFStringArray(DCM_SpecificCharacterSet, characterSet).good() &&
           !characterSet.empty();
}

/// Calls `visit` with every item of every sequence of `item`.
template <typename Visit>
void forItems(DcmItem& item, Visit visit)
{
    for (DcmObject* object = item.nextInContainer(nullptr); object != nullptr;
         object = item.nextInContainer(object)) {
        if (object->ident() != EVR_SQ)
            continue;
        auto& sequence = static_cast<DcmSequenceOfItems&>(*object);
        for (DcmObject* below = sequence.nextInContainer(nullptr); below != nullptr;
             below = sequence.nextInContainer(below))
            visit(static_cast<DcmItem&>(*below));
    }
}

/// At any depth, for one such item is enough.
bool itemsDeclareCharacterSets(DcmItem& item)
{
    bool found = false;
    forItems(item, [&](DcmItem& below) {
        found = found || below.tagExists(DCM_SpecificCharacterSet) || itemsDeclareCharacterSets(below);
    });
    return found;
}

/// Value by value, so that one that does not fit leaves the others right. Whether anything has changed.
bool convertItem(DcmItem& item, const OFString& inherited)
{
    OFString characterSet;
    // An item without a character set of its own has that of the item or dataset around it.
    if (!declaresCharacterSet(item, characterSet))
        characterSet = inherited;
    bool hasChanged = false;
    for (DcmObject* object = item.nextInContainer(nullptr); object != nullptr;
         object = item.nextInContainer(object)) {
        if (object->ident() != EVR_SQ)
            hasChanged |= convertValueToUtf8(static_cast<DcmElement&>(*object),
                                             QByteArray::fromStdString(characterSet));
    }
    forItems(item, [&](DcmItem& below) { hasChanged |= convertItem(below, characterSet); });
    return hasChanged;
}

void declareUtf8InItems(DcmItem& item)
{
    forItems(item, [](DcmItem& below) {
        if (below.tagExists(DCM_SpecificCharacterSet))
            below.putAndInsertString(DCM_SpecificCharacterSet, kUtf8CharacterSet);
        declareUtf8InItems(below);
    });
}

}  // namespace

bool replacesTilde(const QByteArray& characterSet)
{
    return characterSet.trimmed() == "ISO_IR 13";
}

QString decodeText(const QByteArray& bytes, const QByteArray& characterSet)
{
    if (isText(bytes, characterSet))
        return QString::fromLatin1(bytes);
    QString text;
    const BytePairs pairs = bytePairsOf(bytes, characterSet);
    int start = 0;
    bool isTwoByte = false;
    for (int i = 0; i < bytes.size(); ++i) {
        if (bytes.at(i) == kEscape)
            isTwoByte = entersTwoByteSet(bytes, i);
        // Halves of two-byte characters look like delimiters.
        if (beginsPair(pairs, bytes, i))
            ++i;
        else if (!isTwoByte && isDelimiter(bytes.at(i))) {
            text += decodePart(bytes.mid(start, i - start), characterSet, pairs) + QLatin1Char(bytes.at(i));
            start = i + 1;
        }
    }
    return text + decodePart(bytes.mid(start), characterSet, pairs);
}

QByteArray utf8Of(const QByteArray& value, const QByteArray& characterSet, bool hasCharacterSet)
{
    if (isText(value, hasCharacterSet ? characterSet : QByteArray()))
        return value;
    return decodeText(value, characterSet).toUtf8();
}

bool convertToUtf8(DcmItem& dataset)
{
    // DCMTK converts items by the character set of the whole dataset, whatever they declare.
    return !itemsDeclareCharacterSets(dataset) && dataset.convertToUTF8().good();
}

bool convertValuesToUtf8(DcmItem& dataset)
{
    if (!convertItem(dataset, OFString()))
        return false;
    // Declared last: until then each value was explained by the set of its item.
    dataset.putAndInsertString(DCM_SpecificCharacterSet, kUtf8CharacterSet);
    declareUtf8InItems(dataset);
    return true;
}

/// Binary values and empty ones never change.
bool convertValueToUtf8(DcmElement& element, const QByteArray& characterSet)
{
    char* text = nullptr;
    Uint32 length = 0;
    if (!DcmVR(element.getVR()).isaString() || element.getString(text, length).bad() || text == nullptr)
        return false;
    // With what stands behind a NUL, which not all forms end at.
    const QByteArray bytes(text, static_cast<int>(length));
    const QByteArray converted = utf8Of(bytes, characterSet, element.isAffectedBySpecificCharacterSet());
    if (converted == bytes)
        return false;
    // Of the base class, for a UID would be looked for by its name behind "=".
    static_cast<DcmByteString&>(element).DcmByteString::putString(converted.constData(),
                                                                  static_cast<Uint32>(converted.size()));
    return true;
}

void declareUtf8(DcmItem& dataset)
{
    // ASCII is UTF-8 already: only the declaration changes, and not where
    // DCMTK does not know the one that is there.
    if (dataset.convertToUTF8().good())
        declareUtf8InItems(dataset);
}

}  // namespace Kdd
