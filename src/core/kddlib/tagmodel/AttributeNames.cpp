#include "kddlib/tagmodel/AttributeNames.h"

#include "kddlib/tagmodel/FormerKeywords.h"

#include <QHash>
#include <QMutex>
#include <QRegularExpression>

#include <dcmtk/dcmdata/dcdicent.h>
#include <dcmtk/dcmdata/dcdict.h>

namespace Kdd
{

namespace
{

/// Names come from callers' requests, so the memory that they may take has a bound.
constexpr int kMaxRemembered = 4096;

struct Resolution
{
    bool found = false;
    DcmTagKey key;
};

/// Holds DCMTK's dictionary for reading.
class DictionaryLock
{
public:
    DictionaryLock()
        : mDictionary(dcmDataDict.rdlock())
    {
    }
    ~DictionaryLock() { dcmDataDict.rdunlock(); }
    DictionaryLock(const DictionaryLock&) = delete;
    DictionaryLock& operator=(const DictionaryLock&) = delete;

    const DcmDataDictionary& operator*() const { return mDictionary; }
    const DcmDataDictionary* operator->() const { return &mDictionary; }

private:
    const DcmDataDictionary& mDictionary;
};

/// A private entry of the same name must not answer for a public one: the dictionary would find it first.
bool findByName(const DcmDataDictionary& dictionary, const QByteArray& name, Resolution& resolution)
{
    const DcmDictEntry* entry = dictionary.findEntry(name.constData());
    if (entry == nullptr || entry->getPrivateCreator() != nullptr)
        return false;
    resolution = {true, entry->getKey()};
    return true;
}

/// The pattern ends in \z and not in $, which would also match before a line feed at the end of the name.
bool isNumbers(const QString& name, DcmTagKey& key)
{
    static const QRegularExpression pattern(QStringLiteral("^\\(([0-9A-Fa-f]{4}),([0-9A-Fa-f]{4})\\)\\z"));
    const QRegularExpressionMatch match = pattern.match(name);
    if (!match.hasMatch())
        return false;
    key.set(static_cast<Uint16>(match.captured(1).toUInt(nullptr, 16)),
            static_cast<Uint16>(match.captured(2).toUInt(nullptr, 16)));
    return true;
}

Resolution resolve(const QString& name)
{
    const DictionaryLock dictionary;
    Resolution resolution;
    DcmTagKey key;
    if (isNumbers(name, key)) {
        // Without a creator no private entry answers, so the numbers of a private value name nothing.
        if (dictionary->findEntry(key, nullptr) != nullptr)
            resolution = {true, key};
        return resolution;
    }
    // DCMTK's keyword of an attribute that DICOM has given up begins with RETIRED_; callers name it without.
    // Former keywords come last, because a name that the dictionary still knows means just that.
    const QByteArray text = name.toUtf8();
    if (findByName(*dictionary, text, resolution) || findByName(*dictionary, "RETIRED_" + text, resolution))
        return resolution;
    const char* current = currentKeyword(text);
    if (current != nullptr)
        findByName(*dictionary, current, resolution);
    return resolution;
}

}  // namespace

bool resolveAttributeName(const QString& name, DcmTagKey& key)
{
    static QMutex mutex;
    static QHash<QString, Resolution> remembered;
    const QMutexLocker lock(&mutex);
    auto known = remembered.constFind(name);
    if (known == remembered.constEnd()) {
        // All at once: who asks for thousands of names asks for names that do not exist, and the few others come back.
        if (remembered.size() >= kMaxRemembered)
            remembered.clear();
        // Failures are remembered as well: to find nothing the
        // dictionary is walked to its end, several times.
        known = remembered.insert(name, resolve(name));
    }
    if (known->found)
        key = known->key;
    return known->found;
}

QByteArray attributeName(const DcmTagKey& key, const char* privateCreator)
{
    const DictionaryLock dictionary;
    const DcmDictEntry* entry = dictionary->findEntry(key, privateCreator);
    return entry != nullptr ? QByteArray(entry->getTagName()) : QByteArray();
}

}  // namespace Kdd
