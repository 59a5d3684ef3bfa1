#include "kddlib/tagmodel/AttributeNames.h"
#include "kddlib/tagmodel/TagMap.h"
#include "kddlib/tagmodel/TagSequence.h"

#include <QTextStream>

namespace Kdd
{

namespace
{

const char* const kSequenceColumns = "SQ                                           # 0 ";
const char* const kMissingColumns = "--                                           # 0 ";

constexpr int kTextWidth = 42;  // brackets included

QByteArray hex(quint16 number)
{
    return QByteArray::number(number, 16).rightJustified(4, '0');
}

/// Values of several lines must not break the listing's own; escape sequences of character sets stay.
void keepOnOneLine(QByteArray& text)
{
    for (char& c : text) {
        if (static_cast<unsigned char>(c) < 0x20 && c != '\x1b')
            c = ' ';
    }
}

/// How one line of a text listing is laid out; the two listings differ in what they show and where they cut.
struct Layout
{
    int longest;  // characters of a value; a longer one is cut to `whenCut`
    int whenCut;
    bool withMultiplicity;
};

constexpr Layout kDump{64, 64, true};
constexpr Layout kListing{60, 58, false};

class Lister
{
public:
    Lister(QTextStream& out, const TagMap& map, int indent, const Layout& layout)
        : mOut(out)
        , mMap(map)
        , mIndent(indent)
        , mLayout(layout)
    {
    }

    void element(const DcmTagKey& key, const TagElement& element)
    {
        mOut << blanks(0) << '(' << hex(key.getGroup()) << ',' << hex(key.getElement()) << ") ";
        const QByteArray name = attributeName(key, mMap.privateCreator(key));
        if (element.markedAsMissing())
            mOut << kMissingColumns << name << '\n';
        else if (element.isSequence())
            sequence(static_cast<const TagSequence&>(element), name);
        else
            plain(key, element, name);
    }

private:
    QByteArray blanks(int more) const { return QByteArray(mIndent + more, ' '); }

    void sequence(const TagSequence& sequence, const QByteArray& name)
    {
        mOut << kSequenceColumns << name << '\n';
        for (int i = 0; i < sequence.numItems(); ++i) {
            mOut << blanks(2) << "(fffe,e000)\n";
            // Items are shown in the way of what holds them: a dump
            // goes on merged, a listing with own entries.
            if (&mLayout == &kDump)
                sequence.itemToRead(i).dump(mOut, mIndent + 4);
            else
                sequence.itemToRead(i).listContent(mOut, mIndent + 4);
            mOut << blanks(2) << "(fffe,e00d)\n";
        }
        mOut << blanks(0) << "(fffe,e0dd)\n";
    }

    void plain(const DcmTagKey& key, const TagElement& element, const QByteArray& name)
    {
        QByteArray text;
        // Private values of files without explicit VRs are UN; the dictionary may know them by their creator.
        if (element.vr() == VrCode::UN && (key.getGroup() & 1) != 0)
            element.getValueAsString(text, key, mMap.privateCreator(key));
        else
            element.getValueAsString(text);
        keepOnOneLine(text);
        if (text.size() > mLayout.longest)
            text = text.left(mLayout.whenCut) + "...";
        const bool isText = isTextVr(element.vr());
        if (isText)
            text = '[' + text + ']';
        mOut << (element.markedAsOmitted() ? ".." : vrName(element.vr())) << ' ';
        // Texts are in the character set of their image; Latin-1 hands the bytes on as they are.
        mOut << QString::fromLatin1(text.leftJustified(kTextWidth, ' '));
        mOut << "# " << element.value().size();
        if (mLayout.withMultiplicity)
            mOut << ", " << multiplicity(element, isText);
        mOut << ' ' << name << '\n';
    }

    /// As a dump tells it: bytes are one value however many they are.
    static int multiplicity(const TagElement& element, bool isText)
    {
        if (element.value().isEmpty())
            return 0;
        return isText                       ? element.value().count('\\') + 1
               : element.vr() == VrCode::OB ? 1
                                            : qMax(1, element.numFields());
    }

    QTextStream& mOut;
    const TagMap& mMap;
    int mIndent;
    const Layout& mLayout;
};

}  // namespace

void TagMap::dump(QTextStream& out, int indent) const
{
    Lister lister(out, *this, indent, kDump);
    const iterator last = end();
    for (iterator it = begin(); it != last; ++it)
        lister.element(it.key(), *it.value());
}

void TagMap::listContent(QTextStream& out, int indent) const
{
    Lister lister(out, *this, indent, kListing);
    const Tags& own = tagsForLevel();
    for (auto it = own.cbegin(); it != own.cend(); ++it)
        lister.element(it.key(), *it.value());
}

}  // namespace Kdd
