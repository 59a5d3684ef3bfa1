#include "server/browser/CorrectionJson.h"

#include "server/browser/ShownValue.h"

#include <QHash>
#include <QJsonArray>

#include <kddlib/QAAudit.h>
#include <kddlib/TagElement.h>
#include <kddlib/TagFile.h>
#include <kddlib/TagMap.h>

#include <vector>

namespace Kdd::Browser
{
namespace
{

constexpr int kMaxNamedImages = 20;
constexpr int kMaxChanges = 200;

// Where the log stands in our private block; the time of its last entry stands beside it.
constexpr int kLogElement = 0x21;

/// One correction as it stands in the logs of the images that it concerned.
struct Correction
{
    AuditEntry entry;
    std::vector<QByteArray> images;
    int count = 0;
};

/// Logs are the same for most images of a study, and then stand once in its tree: each is taken apart once.
class CorrectionList
{
public:
    void add(const QByteArray& key, const TagMap& image)
    {
        const TagElement* element = logOf(image);
        if (element == nullptr)
            return;
        auto found = mKnown.find(element);
        if (found == mKnown.end())
            found = mKnown.insert(element, read(image));
        for (const int correction : found.value()) {
            if (correction < 0) {
                ++mUnreadable;
                continue;
            }
            Correction& noted = mCorrections[static_cast<size_t>(correction)];
            if (noted.count++ < kMaxNamedImages)
                noted.images.push_back(publicKey(key));
        }
    }

    QJsonObject json() const
    {
        QJsonArray list;
        for (const Correction& correction : mCorrections)
            list.append(json(correction));
        return {{QStringLiteral("corrections"), list},
                {QStringLiteral("complete"), mIsComplete},
                {QStringLiteral("unreadable"), mUnreadable}};
    }

private:
    /// Null for an image that was never corrected.
    static const TagElement* logOf(const TagMap& image)
    {
        for (const DcmTagKey& key : AuditLog::keysIn(image))
            if ((key.getElement() & 0xff) == kLogElement)
                return image.findElement(key);
        return nullptr;
    }

    /// Indexes of the corrections that the log tells of; -1 for one that tells nothing.
    QVector<int> read(const TagMap& image)
    {
        QVector<int> indexes;
        AuditLog log;
        QVector<AuditEntry> entries;
        if (!log.read(image) || !log.decode(entries))
            return {-1};
        for (const AuditEntry& entry : entries) {
            const int index = indexOf(entry);
            // Twice in one log is twice done.
            if (index >= 0)
                indexes.append(index);
        }
        return indexes;
    }

    int indexOf(const AuditEntry& entry)
    {
        for (size_t i = 0; i < mCorrections.size(); ++i)
            if (mCorrections[i].entry.time == entry.time && mCorrections[i].entry.changes == entry.changes)
                return static_cast<int>(i);
        if (mCorrections.size() >= kMaxCorrections) {
            mIsComplete = false;
            return -1;
        }
        mCorrections.push_back({entry, {}, 0});
        return static_cast<int>(mCorrections.size()) - 1;
    }

    static QJsonObject json(const Correction& correction)
    {
        QJsonArray images;
        for (const QByteArray& image : correction.images)
            images.append(QString::fromLatin1(image));
        QJsonArray changes;
        for (const AuditChange& change : correction.entry.changes.mid(0, kMaxChanges)) {
            changes.append(QJsonObject{{QStringLiteral("tag"), keyDigits(change.key)},
                                       {QStringLiteral("name"), keywordOf(TagMap(), change.key)},
                                       {QStringLiteral("old"), change.oldText.left(kMaxValueLength)},
                                       {QStringLiteral("new"), change.newText.left(kMaxValueLength)}});
        }
        return {{QStringLiteral("time"), correction.entry.time},
                {QStringLiteral("count"), correction.count},
                {QStringLiteral("images"), images},
                {QStringLiteral("changes"), changes}};
    }

    std::vector<Correction> mCorrections;
    QHash<const TagElement*, QVector<int>> mKnown;
    bool mIsComplete = true;
    int mUnreadable = 0;
};

}  // namespace

QJsonObject correctionsOf(const TagFile& file)
{
    CorrectionList list;
    const auto& images = file.imagesByUID();
    for (auto it = images.begin(); it != images.end(); ++it)
        list.add(it.key(), *it.value());
    return list.json();
}

}  // namespace Kdd::Browser
