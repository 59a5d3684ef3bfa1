#include "server/dicomweb/search/SearchRequest.h"

#include <QHash>

#include <dcmtk/dcmdata/dcdeftag.h>
#include <dcmtk/dcmdata/dcdicent.h>
#include <dcmtk/dcmdata/dcdict.h>
#include <dcmtk/dcmdata/dctag.h>

#include <algorithm>
#include <mutex>

namespace Kdd::DicomWeb
{
namespace
{

// What a request may ask for at most. Each is far beyond what viewers and scripts do, and small enough that the largest
// question is answered.
constexpr int kMaxConditions = 64;
constexpr int kMaxValues = 2000;      // of one list; viewers ask for the prior studies of a patient so
constexpr int kMaxValueSize = 65536;  // [bytes] of one parameter
constexpr int kMaxFields = 1000;
constexpr int kMaxPath = 8;  // attributes on the way to one, itself included
constexpr int kMaxOrders = 4;

// A page of the list has some hundred studies; of the images of one series a viewer wants all. The whole answer is in
// memory until it is sent, half a kilobyte for each image.
constexpr int kDefaultLimit = 1000;
constexpr int kGreatestLimit = 10000;
constexpr int kGreatestImageLimit = 20000;
constexpr int kGreatestOffset = 100 * 1000 * 1000;

/// Names that are not those of attributes and are somebody else's: the media type, and what intermediaries add.
const char* const kForeign[] = {"accept", "charset", "_"};

struct KnownOrder
{
    DcmTagKey key;
    Kxg::SearchColumn column;
};

const KnownOrder kOrders[] = {
    {DCM_StudyDate, Kxg::SearchColumn::StudyDate},
    {DCM_StudyTime, Kxg::SearchColumn::StudyTime},
    {DCM_AccessionNumber, Kxg::SearchColumn::AccessionNumber},
    {DCM_PatientName, Kxg::SearchColumn::PatientName},
    {DCM_PatientID, Kxg::SearchColumn::PatientID},
    {DCM_PatientBirthDate, Kxg::SearchColumn::PatientBirthDate},
    {DCM_PatientSex, Kxg::SearchColumn::PatientSex},
    {DCM_StudyID, Kxg::SearchColumn::StudyID},
    {DCM_StudyInstanceUID, Kxg::SearchColumn::StudyUID},
};

bool isHex(const QByteArray& text)
{
    return text.size() == 8 && std::all_of(text.begin(), text.end(), [](char each) {
               return (each >= '0' && each <= '9') || (each >= 'a' && each <= 'f') ||
                      (each >= 'A' && each <= 'F');
           });
}

QString quoted(const QByteArray& text)
{
    constexpr int kShown = 60;
    return QLatin1Char('"') + QString::fromUtf8(text.left(kShown)) + QLatin1Char('"');
}

bool parseTruth(const QByteArray& text, bool& truth)
{
    truth = text == "true";
    return truth || text == "false";
}

bool parseNumber(const QByteArray& text, int greatest, int& number)
{
    bool isNumber = false;
    const qlonglong value = text.toLongLong(&isNumber);
    if (!isNumber || value < 0 || text.startsWith('+') || text.startsWith('-'))
        return false;
    number = static_cast<int>(std::min<qlonglong>(value, greatest));
    return true;
}

bool parseZone(const QByteArray& value, std::optional<int>& zone, QString& reason)
{
    zone = zoneMinutes(value);
    if (!zone)
        reason = QStringLiteral("%1 is no offset from UTC").arg(quoted(value));
    return zone.has_value();
}

/// Those of a list, each once; else the value itself.
QVector<QString> valuesOf(const SearchCondition& condition, bool hasLists)
{
    const bool isUID = condition.vr == EVR_UI;
    const bool isModality = condition.key() == DCM_ModalitiesInStudy || condition.key() == DCM_Modality;
    QString text = condition.value;
    if (isUID || isModality)
        text.replace(QLatin1Char(','), QLatin1Char('\\'));
    if (!isUID && !isModality && !hasLists)
        return {text};
    QVector<QString> values;
    for (const QString& each : text.split(QLatin1Char('\\'))) {
        const QString value = each.trimmed();
        if (!value.isEmpty() && !values.contains(value))
            values.append(value);
    }
    return values;
}

/// The dictionary's VR, where the dictionary leaves a choice the one that is searched.
DcmEVR vrOf(const DcmTagKey& key)
{
    return DcmTag(key).getEVR();
}

/// Reads one parameter after the other into a request.
class Parser
{
public:
    Parser(SearchRequest& request, QString& reason)
        : mRequest(request)
        , mReason(reason)
    {
    }

    bool run(const QVector<Http::Field>& query)
    {
        const bool isImages = mRequest.level == SearchLevel::Instances;
        mGreatest = isImages ? kGreatestImageLimit : kGreatestLimit;
        mRequest.limit = isImages && !mRequest.study.isEmpty() ? kGreatestImageLimit : kDefaultLimit;
        // How values are to be read is known before the first of them.
        for (const Http::Field& field : query) {
            if (!takeSwitch(field))
                return false;
        }
        return std::all_of(query.begin(), query.end(),
                           [this](const Http::Field& field) { return take(field); });
    }

private:
    bool fail(const QString& reason)
    {
        mReason = reason;
        return false;
    }

    bool takeSwitch(const Http::Field& field)
    {
        bool* truth = nullptr;
        if (field.name == "fuzzymatching")
            truth = &mRequest.isFuzzy;
        else if (field.name == "emptyvaluematching")
            truth = &mForm.findsEmpty;
        else if (field.name == "multiplevaluematching")
            truth = &mForm.hasLists;
        if (truth == nullptr || parseTruth(field.value, *truth))
            return true;
        return fail(QStringLiteral("%1 is \"true\" or \"false\"").arg(QString::fromLatin1(field.name)));
    }

    bool take(const Http::Field& field)
    {
        const QByteArray& name = field.name;
        if (field.value.size() > kMaxValueSize)
            return fail(QStringLiteral("The value of %1 is too long").arg(quoted(name)));
        const bool isForeign = std::any_of(std::begin(kForeign), std::end(kForeign),
                                           [&](const char* each) { return name == each; });
        if (isForeign || name == "fuzzymatching" || name == "emptyvaluematching" ||
            name == "multiplevaluematching")
            return true;
        if (name == "limit")
            return parseNumber(field.value, mGreatest, mRequest.limit) ||
                   fail(QStringLiteral("limit is no number"));
        if (name == "offset")
            return parseNumber(field.value, kGreatestOffset, mRequest.offset) ||
                   fail(QStringLiteral("offset is no number"));
        if (name == "includefield")
            return takeFields(field.value);
        if (name == "orderby")
            return takeOrder(field.value);
        if (name == "timezone")
            return takeZone(field.value);
        return takeCondition(field);
    }

    bool takeFields(const QByteArray& value)
    {
        for (const QByteArray& each : value.split(',')) {
            const QByteArray name = each.trimmed();
            DcmTagKey key;
            DcmEVR vr = EVR_UNKNOWN;
            if (name.isEmpty())
                continue;
            if (name == "all") {
                mRequest.showsAll = true;
                continue;
            }
            // Of an attribute in a sequence the whole sequence is shown.
            if (!resolveAttribute(name.split('.').first(), key, vr))
                return fail(QStringLiteral("includefield: there is no attribute %1").arg(quoted(name)));
            if (mRequest.fields.size() >= kMaxFields)
                return fail(QStringLiteral("Too many fields are asked for"));
            mRequest.fields.append(key);
        }
        return true;
    }

    bool takeOrder(const QByteArray& value)
    {
        for (QByteArray name : value.split(',')) {
            name = name.trimmed();
            const bool isDescending = name.startsWith('-');
            DcmTagKey key;
            DcmEVR vr = EVR_UNKNOWN;
            const bool isKnown = resolveAttribute(isDescending ? name.mid(1) : name, key, vr);
            const auto* const found = std::find_if(std::begin(kOrders), std::end(kOrders),
                                                   [&](const KnownOrder& each) { return each.key == key; });
            if (!isKnown || found == std::end(kOrders))
                return fail(QStringLiteral("orderby: nothing is ordered by %1").arg(quoted(name)));
            if (mRequest.order.size() >= kMaxOrders)
                return fail(QStringLiteral("orderby: too many attributes"));
            mRequest.order.push_back({found->column, isDescending});
        }
        return true;
    }

    bool takeZone(const QByteArray& value)
    {
        return value.isEmpty() || parseZone(value, mRequest.zone, mReason);
    }

    bool takeCondition(const Http::Field& field)
    {
        SearchCondition condition;
        for (const QByteArray& name : field.name.split('.')) {
            DcmTagKey key;
            if (condition.path.size() >= kMaxPath || !resolveAttribute(name, key, condition.vr))
                return fail(QStringLiteral("There is no attribute or parameter %1").arg(quoted(field.name)));
            condition.path.append(key);
        }
        condition.value = QString::fromUtf8(field.value);
        return mRequest.require(condition, mForm, mReason);
    }

    SearchRequest& mRequest;
    QString& mReason;
    int mGreatest = kGreatestLimit;
    ValueForm mForm;
};

/// The dictionary is walked from its beginning for each keyword; few are ever asked for, and no more than it has.
bool findKeyword(const QByteArray& keyword, DcmTagKey& key)
{
    static std::mutex sMutex;
    static QHash<QByteArray, quint32> sKnown;
    {
        const std::lock_guard<std::mutex> lock(sMutex);
        const auto found = sKnown.constFind(keyword);
        if (found != sKnown.cend()) {
            key.set(static_cast<Uint16>(*found >> 16), static_cast<Uint16>(*found & 0xFFFF));
            return true;
        }
    }
    const DcmDataDictionary& dictionary = dcmDataDict.rdlock();
    const DcmDictEntry* const entry = dictionary.findEntry(keyword.constData());
    const bool isKnown = entry != nullptr && entry->getPrivateCreator() == nullptr;
    if (isKnown)
        key = *entry;
    dcmDataDict.rdunlock();
    if (!isKnown)
        return false;
    const std::lock_guard<std::mutex> lock(sMutex);
    sKnown.insert(keyword, (quint32(key.getGroup()) << 16) | key.getElement());
    return true;
}

}  // namespace

bool resolveAttribute(const QByteArray& name, DcmTagKey& key, DcmEVR& vr)
{
    if (isHex(name)) {
        const quint32 number = name.toUInt(nullptr, 16);
        key.set(static_cast<Uint16>(number >> 16), static_cast<Uint16>(number & 0xFFFF));
    } else if (name.isEmpty() || name.contains(' ') || !findKeyword(name, key)) {
        return false;
    }
    vr = vrOf(key);
    return true;
}

std::optional<int> zoneMinutes(const QByteArray& offset)
{
    // A "+" that was not encoded arrives as a blank.
    QByteArray text = offset;
    if (text.startsWith(' '))
        text[0] = '+';
    bool isNumber = false;
    const int number = text.mid(1).toInt(&isNumber);
    const bool isSigned = text.startsWith('+') || text.startsWith('-');
    if (text.size() != 5 || !isSigned || !isNumber || text.at(1) == '-' || text.at(1) == '+' ||
        number % 100 >= 60 || number > 1400)
        return {};
    const int minutes = number / 100 * 60 + number % 100;
    return text.startsWith('-') ? -minutes : minutes;
}

bool SearchRequest::takePath(const ResourcePath& path, SearchRequest& request)
{
    request = {};
    request.study = path.study;
    request.series = path.series;
    if (!path.rest.isEmpty() || !path.instance.isEmpty())
        return false;
    const bool isBelowStudy = !path.study.isEmpty();
    const bool isBelowSeries = !path.series.isEmpty();
    if (isBelowSeries && !isBelowStudy)
        return false;
    if (path.resource == "instances") {
        request.level = SearchLevel::Instances;
        return true;
    }
    if (path.resource == "series") {
        request.level = SearchLevel::Series;
        return !isBelowSeries;
    }
    request.level = path.resource == "patients" ? SearchLevel::Patients : SearchLevel::Studies;
    return !isBelowStudy && (path.resource == "studies" || path.resource == "patients");
}

bool SearchRequest::parse(const QVector<Http::Field>& query, SearchRequest& request, QString& reason)
{
    return Parser(request, reason).run(query);
}

bool SearchRequest::require(SearchCondition condition, const ValueForm& form, QString& reason)
{
    const QString name = QString::fromLatin1(DcmTag(condition.key()).getTagName());
    // The classes in a study are those of its images.
    if (condition.key() == DCM_SOPClassesInStudy)
        condition.path = {DCM_SOPClassUID};
    if (condition.value.isEmpty() || condition.key() == DCM_SpecificCharacterSet)
        return true;
    // It says how others are to be read, and nothing matches it itself.
    if (condition.key() == DCM_TimezoneOffsetFromUTC && !condition.isInItems())
        return parseZone(condition.value.toUtf8(), zone, reason);
    if (condition.vr == EVR_SQ) {
        reason = QStringLiteral("%1 is a sequence: name an attribute of its items").arg(name);
        return false;
    }
    condition.isEmpty = form.findsEmpty && condition.value == QLatin1String("\"\"");
    condition.list = valuesOf(condition, form.hasLists);
    if (condition.list.size() > kMaxValues) {
        reason = QStringLiteral("%1 has too many values").arg(name);
        return false;
    }
    if (!condition.list.isEmpty() && conditions.size() >= kMaxConditions) {
        reason = QStringLiteral("Too many attributes are asked for");
        return false;
    }
    if (!condition.list.isEmpty())
        conditions.push_back(condition);
    return true;
}

}  // namespace Kdd::DicomWeb
