#include "kddlib/tagfile/qa/QAValues.h"

#include <QDate>
#include <QList>
#include <QString>

#include <algorithm>
#include <cmath>

namespace Kdd
{

namespace
{

// The lengths that DICOM allows [characters].
constexpr int kLongestIntegerString = 12;
constexpr int kLongestDecimalString = 16;
constexpr int kLongestFraction = 6;
constexpr int kGreatestZone = 14;  // [h], east or west

bool areDigits(const QByteArray& text)
{
    return std::all_of(text.begin(), text.end(), [](char c) { return c >= '0' && c <= '9'; });
}

/// Two digits at a place, at most `greatest`.
bool isTwoDigits(const QByteArray& text, int at, int greatest, int least = 0)
{
    const QByteArray digits = text.mid(at, 2);
    return digits.size() == 2 && areDigits(digits) && digits.toInt() >= least && digits.toInt() <= greatest;
}

bool isDate(const QByteArray& text)
{
    return text.size() == 8 && areDigits(text) &&
           QDate(text.left(4).toInt(), text.mid(4, 2).toInt(), text.mid(6).toInt()).isValid();
}

/// HH[MM[SS[.F]]]; a leap second has the number 60.
bool isTime(const QByteArray& text)
{
    const int dot = text.indexOf('.');
    const QByteArray clock = dot < 0 ? text : text.left(dot);
    const QByteArray fraction = dot < 0 ? QByteArray("0") : text.mid(dot + 1);
    const int greatest[] = {23, 59, 60};
    if (clock.isEmpty() || clock.size() > 6 || clock.size() % 2 != 0 || (dot >= 0 && clock.size() != 6))
        return false;
    for (int at = 0; at < clock.size(); at += 2) {
        if (!isTwoDigits(clock, at, greatest[at / 2]))
            return false;
    }
    return !fraction.isEmpty() && fraction.size() <= kLongestFraction && areDigits(fraction);
}

/// YYYY[MM[DD[time]]][+-HHMM]
bool isDateTime(const QByteArray& text)
{
    const int zone = std::max(text.indexOf('+'), text.indexOf('-'));
    const QByteArray moment = zone < 0 ? text : text.left(zone);
    if (zone >= 0 && (text.size() != zone + 5 || !isTwoDigits(text, zone + 1, kGreatestZone) ||
                      !isTwoDigits(text, zone + 3, 59)))
        return false;
    if (moment.size() > 8)
        return isDate(moment.left(8)) && isTime(moment.mid(8));
    // What is left out is taken as the first of its kind.
    return (moment.size() == 4 || moment.size() == 6 || moment.size() == 8) &&
           isDate(moment + QByteArray("0101").mid(moment.size() - 4));
}

bool isAge(const QByteArray& text)
{
    return text.size() == 4 && areDigits(text.left(3)) && QByteArray("DWMY").contains(text.at(3));
}

/// Of 32 bits, as DICOM has it, and no longer than DICOM allows.
bool isIntegerString(const QByteArray& text)
{
    bool isNumber = false;
    text.toInt(&isNumber);
    return isNumber && text.size() <= kLongestIntegerString;
}

bool isDecimalString(const QByteArray& text)
{
    bool isNumber = false;
    const double value = text.toDouble(&isNumber);
    return isNumber && std::isfinite(value) && text.size() <= kLongestDecimalString;
}

struct Rule
{
    VrCode vr;
    const char* kind;
    bool (*holds)(const QByteArray&);
    bool isPadded;  // blanks around it do not matter
};

const Rule kRules[] = {
    {VrCode::AS, "age", isAge, false},
    {VrCode::DA, "date", isDate, false},
    {VrCode::DS, "number", isDecimalString, true},
    {VrCode::DT, "date and time", isDateTime, true},
    {VrCode::IS, "number", isIntegerString, true},
    {VrCode::TM, "time", isTime, true},
};

const Rule* ruleOf(VrCode vr)
{
    const auto* found =
        std::find_if(std::begin(kRules), std::end(kRules), [&](const Rule& rule) { return rule.vr == vr; });
    return found != std::end(kRules) ? found : nullptr;
}

}  // namespace

const char* kindOfValue(VrCode vr)
{
    const Rule* rule = ruleOf(vr);
    return rule != nullptr ? rule->kind : nullptr;
}

QByteArray firstOddValue(VrCode vr, const QByteArray& text)
{
    const Rule* rule = ruleOf(vr);
    if (rule == nullptr)
        return {};
    // Empty values stay: they are how an image says that it does not know.
    for (const QByteArray& value : text.split('\\')) {
        const QByteArray bare = rule->isPadded ? value.trimmed() : value;
        if (!bare.isEmpty() && !rule->holds(bare))
            return value;
    }
    return {};
}

}  // namespace Kdd
