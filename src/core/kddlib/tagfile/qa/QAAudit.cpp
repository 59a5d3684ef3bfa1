#include "kddlib/tagfile/qa/QAAudit.h"

#include "kddlib/tagmodel/OwnAttributes.h"
#include "kddlib/tagmodel/TagMap.h"

namespace Kdd
{

namespace
{

const DcmTagKey kAuditLog(0x0071, 0x0021);
const DcmTagKey kAuditTime(0x0071, 0x0022);

constexpr int kKeyLength = 9;  // gggg-eeee

QByteArray line(const QString& text)
{
    QByteArray bytes = text.toUtf8();
    // ESC first: it would otherwise take the one that marks a line feed for one of the text.
    bytes.replace("\x1b", "\x1b\x65").replace("\n", "\x1bn");
    return bytes + '\n';
}

QString textOf(QByteArray line)
{
    line.replace("\x1bn", "\n").replace("\x1b\x65", "\x1b");
    return QString::fromUtf8(line);
}

QByteArray keyText(const DcmTagKey& key)
{
    return QString::asprintf("%04x-%04x", unsigned(key.getGroup()), unsigned(key.getElement())).toLatin1();
}

bool readKey(const QByteArray& line, DcmTagKey& key)
{
    bool isGroup = false;
    bool isElement = false;
    key = DcmTagKey(line.left(4).toUShort(&isGroup, 16), line.mid(5).toUShort(&isElement, 16));
    return line.size() == kKeyLength && line.at(4) == '-' && isGroup && isElement;
}

/// Takes the next line off a text of ended lines; false at its end.
bool takeLine(const QByteArray& text, int& position, QByteArray& line)
{
    // Every line is ended, so one that is not was cut off.
    const int end = text.indexOf('\n', position);
    if (end < 0)
        return false;
    line = text.mid(position, end - position);
    position = end + 1;
    return true;
}

/// A line of time, three lines for each change, an empty line.
bool readEntry(const QByteArray& text, int& position, AuditEntry& entry)
{
    QByteArray line;
    if (!takeLine(text, position, line))
        return false;
    entry.time = QString::fromLatin1(line);
    while (takeLine(text, position, line)) {
        if (line.isEmpty())
            return true;
        AuditChange change;
        QByteArray oldLine;
        QByteArray newLine;
        if (!readKey(line, change.key) || !takeLine(text, position, oldLine) ||
            !takeLine(text, position, newLine))
            return false;
        change.oldText = textOf(oldLine);
        change.newText = textOf(newLine);
        entry.changes.append(change);
    }
    return false;
}

}  // namespace

bool AuditLog::read(const TagMap& image)
{
    QByteArray stored;
    image.findAndGetString(kAuditLog, kOurPrivateCreator, stored);
    const auto decoded = QByteArray::fromBase64Encoding(stored, QByteArray::AbortOnBase64DecodingErrors);
    if (!decoded)
        return false;
    mText = decoded.decoded;
    return true;
}

void AuditLog::append(const AuditEntry& entry)
{
    mText += entry.time.toLatin1() + '\n';
    for (const AuditChange& change : entry.changes)
        mText += keyText(change.key) + '\n' + line(change.oldText) + line(change.newText);
    mText += '\n';
}

QVector<DcmTagKey> AuditLog::keysIn(const TagMap& image)
{
    QVector<DcmTagKey> keys;
    const DcmTagKey last(kAuditLog.getGroup(), 0xffff);
    const TagMap::iterator end = image.end();
    // Below stand the reservations of the blocks.
    for (auto it = image.lowerBound({kAuditLog.getGroup(), 0x1000}); it != end && it.key() <= last; ++it) {
        const quint16 number = it.key().getElement() & 0xff;
        const char* creator = image.privateCreator(it.key());
        if ((number == kAuditLog.getElement() || number == kAuditTime.getElement()) &&
            qstrcmp(creator, kOurPrivateCreator) == 0)
            keys.append(it.key());
    }
    return keys;
}

bool AuditLog::store(TagMap& image) const
{
    return image.putAndInsertValue(kAuditLog, kOurPrivateCreator, VrCode::UT, mText.toBase64());
}

bool AuditLog::decode(QVector<AuditEntry>& entries) const
{
    // Aside, so that a damaged log gives nothing rather than half of its entries.
    QVector<AuditEntry> read;
    for (int position = 0; position < mText.size();) {
        AuditEntry entry;
        if (!readEntry(mText, position, entry))
            return false;
        read.append(entry);
    }
    entries.swap(read);
    return true;
}

}  // namespace Kdd
