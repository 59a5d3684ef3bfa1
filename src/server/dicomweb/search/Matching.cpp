#include "server/dicomweb/search/Matching.h"

#include <QDateTime>

#include <dcmtk/dcmdata/dcdeftag.h>
#include <kddlib/SearchText.h>

#include <algorithm>

namespace Kdd::DicomWeb
{
namespace
{

const std::pair<DcmTagKey, DcmTagKey> kMoments[] = {
    {DCM_StudyDate, DCM_StudyTime},
    {DCM_SeriesDate, DCM_SeriesTime},
    {DCM_AcquisitionDate, DCM_AcquisitionTime},
    {DCM_ContentDate, DCM_ContentTime},
    {DCM_PerformedProcedureStepStartDate, DCM_PerformedProcedureStepStartTime},
    {DCM_PerformedProcedureStepEndDate, DCM_PerformedProcedureStepEndTime},
};

// ---- texts

/// Goes back to the last star when it comes to nothing, and to no earlier one: the time is bounded by the product of the
/// lengths.
bool matchesStars(const QString& text, const QString& pattern)
{
    int t = 0;
    int p = 0;
    int star = -1;
    int resume = 0;
    while (t < text.size()) {
        if (p < pattern.size() && pattern.at(p) == QLatin1Char('*')) {
            star = p++;
            resume = t;
        } else if (p < pattern.size() && (pattern.at(p) == QLatin1Char('?') || pattern.at(p) == text.at(t))) {
            ++p;
            ++t;
        } else if (star >= 0) {
            p = star + 1;
            t = ++resume;
        } else {
            return false;
        }
    }
    while (p < pattern.size() && pattern.at(p) == QLatin1Char('*'))
        ++p;
    return p == pattern.size();
}

bool matchesText(const QString& value, const QString& wanted, DcmEVR vr)
{
    if (!hasWildcard(wanted))
        return value == wanted.trimmed();
    // Codes are capital letters by definition.
    const bool isCode = vr == EVR_CS || vr == EVR_AE;
    return isCode ? matchesStars(value, wanted)
                  : matchesStars(Kxg::foldedText(value), Kxg::foldedText(wanted));
}

// ---- names

QString component(const QStringList& components, int index)
{
    return index < components.size() ? components.at(index).trimmed() : QString();
}

/// A text without "^" asks for the first component, with wildcards for any run of components.
bool matchesGroup(const QString& value, const QString& wanted)
{
    const QStringList have = value.split(QLatin1Char('^'));
    if (wanted.contains(QLatin1Char('^'))) {
        const QStringList want = wanted.split(QLatin1Char('^'));
        for (int i = 0; i < want.size(); ++i) {
            const QString each = component(want, i);
            if (!each.isEmpty() && !matchesStars(Kxg::foldedText(component(have, i)), Kxg::foldedText(each)))
                return false;
        }
        return true;
    }
    if (!hasWildcard(wanted))
        return Kxg::foldedText(component(have, 0)) == Kxg::foldedText(wanted);
    QString pattern = Kxg::foldedText(wanted);
    const bool isOpen = pattern.endsWith(QLatin1Char('*'));
    // What is asked for ends where a component ends.
    for (int count = 1; count <= have.size(); ++count) {
        QStringList folded;
        for (const QString& each : have.mid(0, isOpen ? have.size() : count))
            folded << Kxg::foldedText(each);
        if (matchesStars(folded.join(QLatin1Char('^')), pattern))
            return true;
        if (isOpen)
            return false;
    }
    return false;
}

bool isUniversalName(const QString& wanted)
{
    return std::all_of(wanted.begin(), wanted.end(),
                       [](QChar each) { return QStringLiteral("*^= ").contains(each); });
}

bool matchesName(const QString& value, const QString& wanted)
{
    const QStringList have = value.split(QLatin1Char('='));
    const QStringList want = wanted.split(QLatin1Char('='));
    if (want.size() == 1)
        return std::any_of(have.begin(), have.end(), [&](const QString& group) {
            return !group.trimmed().isEmpty() && matchesGroup(group, wanted.trimmed());
        });
    for (int i = 0; i < want.size(); ++i) {
        if (!isUniversalName(want.at(i)) && !matchesGroup(component(have, i), want.at(i).trimmed()))
            return false;
    }
    return true;
}

// ---- dates, times, numbers

/// Seconds and offset of a DT value of any precision, as the first or last moment that it may mean.
bool momentOf(QString text, bool isLast, std::optional<int> zone, QByteArray& moment)
{
    std::optional<int> own;
    const int sign = qMax(text.indexOf(QLatin1Char('+')), text.indexOf(QLatin1Char('-')));
    if (sign >= 0) {
        own = zoneMinutes(text.mid(sign).toLatin1());
        text.truncate(sign);
        if (!own)
            return false;
    }
    static const QByteArray kFirst = "00000101000000.000000";
    static const QByteArray kLast = "99991231235959.999999";
    QByteArray filled = text.trimmed().toLatin1();
    if (filled.size() < 4 || filled.size() > kFirst.size())
        return false;
    filled += (isLast ? kLast : kFirst).mid(filled.size());
    QDateTime at =
        QDateTime::fromString(QString::fromLatin1(filled.left(14)), QStringLiteral("yyyyMMddHHmmss"));
    // The last day of a month is not always the 31st.
    if (!at.isValid() && isLast && text.trimmed().size() == 6) {
        const QDate first =
            QDate::fromString(text.trimmed() + QStringLiteral("01"), QStringLiteral("yyyyMMdd"));
        at = QDateTime(first.addMonths(1).addDays(-1), QTime(23, 59, 59));
    }
    if (!at.isValid())
        return false;
    at.setTimeSpec(Qt::UTC);
    const std::optional<int> meant = own ? own : zone;
    at = at.addSecs(-60 * meant.value_or(0));
    moment = at.toString(QStringLiteral("yyyyMMddHHmmss")).toLatin1() + filled.mid(14);
    return true;
}

bool matchesMoment(const QString& value, const QString& wanted, std::optional<int> zone)
{
    // A "-" stands in offsets too; the one of a range has a moment or nothing on both sides.
    QByteArray at;
    QByteArray from;
    QByteArray to;
    if (!momentOf(value, false, zone, at))
        return false;
    if (momentOf(wanted, false, zone, from) && momentOf(wanted, true, zone, to))
        return at >= from && at <= to;
    for (int dash = wanted.indexOf(QLatin1Char('-')); dash >= 0;
         dash = wanted.indexOf(QLatin1Char('-'), dash + 1)) {
        const QString first = wanted.left(dash).trimmed();
        const QString last = wanted.mid(dash + 1).trimmed();
        const bool isFrom = first.isEmpty() || momentOf(first, false, zone, from);
        const bool isTo = last.isEmpty() || momentOf(last, true, zone, to);
        if (isFrom && isTo)
            return (first.isEmpty() || at >= from) && (last.isEmpty() || at <= to);
    }
    return false;
}

QByteArray comparable(DcmEVR vr, const QString& value)
{
    return vr == EVR_DA ? Kxg::searchDate(value.toLatin1()) : Kxg::searchTime(value.toLatin1());
}

bool isWithin(const QByteArray& value, const ValueRange& range)
{
    return !value.isEmpty() && (range.from.isEmpty() || value >= range.from) &&
           (range.to.isEmpty() || value <= range.to);
}

bool isNumber(DcmEVR vr)
{
    switch (vr) {
    case EVR_DS:
    case EVR_FD:
    case EVR_FL:
    case EVR_IS:
    case EVR_SL:
    case EVR_SS:
    case EVR_SV:
    case EVR_UL:
    case EVR_US:
    case EVR_UV:
    case EVR_xs:
        return true;
    default:
        return false;
    }
}

bool matchesNumber(const QString& value, const QString& wanted, DcmEVR vr)
{
    bool isValue = false;
    bool isWanted = false;
    const double number = value.toDouble(&isValue);
    const double asked = wanted.trimmed().toDouble(&isWanted);
    // Few digits are enough to tell numbers of this VR apart, and nobody knows how many somebody writes.
    const bool isNear = vr == EVR_FL && static_cast<float>(number) == static_cast<float>(asked);
    return isValue && isWanted && (number == asked || isNear);
}

bool matchesOne(const QString& value, const QString& wanted, DcmEVR vr, std::optional<int> zone)
{
    ValueRange range;
    if (vr == EVR_DA || vr == EVR_TM)
        return parseRange(vr, wanted, range) && isWithin(comparable(vr, value), range);
    if (vr == EVR_DT)
        return matchesMoment(value, wanted, zone);
    if (vr == EVR_PN)
        return matchesName(value, wanted);
    if (isNumber(vr))
        return matchesNumber(value, wanted, vr);
    if (takesWildcards(vr))
        return matchesText(value, wanted, vr);
    return value == wanted.trimmed();
}

bool holds(const SearchCondition& condition, const QStringList& values, std::optional<int> zone)
{
    const bool isEmpty =
        std::all_of(values.begin(), values.end(), [](const QString& each) { return each.isEmpty(); });
    if (condition.isEmpty)
        return isEmpty;
    if (isUniversal(condition))
        return true;
    return std::any_of(values.begin(), values.end(), [&](const QString& value) {
        return !value.isEmpty() &&
               std::any_of(condition.list.begin(), condition.list.end(), [&](const QString& wanted) {
                   return matchesOne(value, wanted, condition.vr, zone);
               });
    });
}

// ---- moments of two attributes

/// A date and its time as the source has them, moved into the zone that is asked in.
struct Moment
{
    QByteArray date;
    QByteArray time;
};

Moment momentIn(const AttributeSource& source, const DcmTagKey& dateKey, const DcmTagKey& timeKey,
                std::optional<int> zone)
{
    Moment moment = {Kxg::searchDate(source.values({dateKey}).value(0).toLatin1()),
                     Kxg::searchTime(source.values({timeKey}).value(0).toLatin1())};
    if (!zone || moment.date.isEmpty() || moment.time.isEmpty())
        return moment;
    const std::optional<int> own =
        zoneMinutes(source.values({DCM_TimezoneOffsetFromUTC}).value(0).toLatin1());
    if (!own)
        return moment;
    QDateTime at = QDateTime::fromString(QString::fromLatin1(moment.date + moment.time.left(6)),
                                         QStringLiteral("yyyyMMddHHmmss"));
    if (!at.isValid())
        return moment;
    at.setTimeSpec(Qt::UTC);
    at = at.addSecs(60 * (*zone - *own));
    return {at.toString(QStringLiteral("yyyyMMdd")).toLatin1(),
            at.toString(QStringLiteral("HHmmss")).toLatin1() + moment.time.mid(6)};
}

bool isIn(const Moment& moment, const ValueRange& dates, const ValueRange& times)
{
    if (moment.date.isEmpty() || !isWithin(moment.date, dates))
        return false;
    const bool isAfter =
        dates.from.isEmpty() || times.from.isEmpty() || moment.date > dates.from || moment.time >= times.from;
    const bool isBefore =
        dates.to.isEmpty() || times.to.isEmpty() || moment.date < dates.to || moment.time <= times.to;
    return isAfter && isBefore;
}

const SearchCondition* findOwn(const Conditions& conditions, const DcmTagKey& key)
{
    const auto found = std::find_if(conditions.begin(), conditions.end(), [&](const SearchCondition* each) {
        return !each->isInItems() && each->key() == key && !each->isEmpty && each->list.size() == 1;
    });
    return found == conditions.end() ? nullptr : *found;
}

bool holdsMoment(const SearchCondition* date, const SearchCondition* time, const Moment& moment, bool joins)
{
    ValueRange dates;
    ValueRange times;
    if ((date != nullptr && !parseRange(EVR_DA, date->list.front(), dates)) ||
        (time != nullptr && !parseRange(EVR_TM, time->list.front(), times)))
        return false;
    if (joins && date != nullptr && time != nullptr && dates.isRange && times.isRange)
        return isIn(moment, dates, times);
    return (date == nullptr || isWithin(moment.date, dates)) &&
           (time == nullptr || isWithin(moment.time, times));
}

}  // namespace

bool hasWildcard(const QString& text)
{
    return text.contains(QLatin1Char('*')) || text.contains(QLatin1Char('?'));
}

bool takesWildcards(DcmEVR vr)
{
    switch (vr) {
    case EVR_AE:
    case EVR_CS:
    case EVR_LO:
    case EVR_LT:
    case EVR_SH:
    case EVR_ST:
    case EVR_UC:
    case EVR_UR:
    case EVR_UT:
        return true;
    default:
        return false;
    }
}

bool isUniversal(const SearchCondition& condition)
{
    if (condition.isEmpty)
        return false;
    return std::any_of(condition.list.begin(), condition.list.end(), [&](const QString& value) {
        if (condition.vr == EVR_PN)
            return isUniversalName(value);
        return takesWildcards(condition.vr) && !value.isEmpty() &&
               value.count(QLatin1Char('*')) == value.size();
    });
}

bool parseRange(DcmEVR vr, const QString& text, ValueRange& range)
{
    const QByteArray value = text.trimmed().toLatin1();
    const int dash = value.indexOf('-');
    range.isRange = dash >= 0;
    const QByteArray first = (dash < 0 ? value : value.left(dash)).trimmed();
    const QByteArray last = (dash < 0 ? value : value.mid(dash + 1)).trimmed();
    const bool isDate = vr == EVR_DA;
    range.from = isDate ? Kxg::searchDate(first) : Kxg::searchTime(first);
    range.to = isDate ? Kxg::searchDate(last) : Kxg::lastTime(last);
    return (first.isEmpty() == range.from.isEmpty()) && (last.isEmpty() == range.to.isEmpty()) &&
           (!first.isEmpty() || !last.isEmpty());
}

bool timeOfDate(const DcmTagKey& date, DcmTagKey& time)
{
    for (const auto& moment : kMoments) {
        if (moment.first == date) {
            time = moment.second;
            return true;
        }
    }
    return false;
}

bool holdAll(const Conditions& conditions, const AttributeSource& source, const SearchRequest& request)
{
    Conditions single = conditions;
    for (const auto& moment : kMoments) {
        const SearchCondition* date = findOwn(conditions, moment.first);
        const SearchCondition* time = findOwn(conditions, moment.second);
        if (date == nullptr && time == nullptr)
            continue;
        if (!holdsMoment(date, time, momentIn(source, moment.first, moment.second, request.zone),
                         request.joinsMoments))
            return false;
        single.erase(
            std::remove_if(single.begin(), single.end(),
                           [&](const SearchCondition* each) { return each == date || each == time; }),
            single.end());
    }
    return std::all_of(single.begin(), single.end(), [&](const SearchCondition* each) {
        return holds(*each, source.values(each->path), request.zone);
    });
}

}  // namespace Kdd::DicomWeb
