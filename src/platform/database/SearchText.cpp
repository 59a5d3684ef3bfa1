#include "platform/database/SearchText.h"

#include <QStringList>

#include <algorithm>

namespace Kxg
{
namespace
{

// Folded texts have no capital letters, so these are ours: A to P are the digits of a character beyond ASCII, Z stands
// before them; the others mark the parts of names.
constexpr char kOther = 'Z';
constexpr char kFirstDigit = 'A';
constexpr char kFirstComponent = 'Q';  // behind the "^" at a component's end
constexpr char kFirstGroup = 'V';      // before the "=" at a group's beginning

constexpr int kComponents = 5;
constexpr int kGroups = 3;

/// `*` and `?` stay as they are.
QByteArray coded(const QString& folded)
{
    QByteArray out;
    out.reserve(folded.size() * 2);
    for (const QChar each : folded) {
        const ushort unit = each.unicode();
        // Outside of our own marks there are no capital letters, also where folding left one of an odd script.
        if (unit < 0x80 && (unit < 'A' || unit > 'Z')) {
            out += static_cast<char>(unit);
            continue;
        }
        out += kOther;
        for (int shift = 12; shift >= 0; shift -= 4)
            out += static_cast<char>(kFirstDigit + ((unit >> shift) & 0xF));
    }
    return out;
}

QByteArray componentEnd(int component)
{
    return QByteArray("^") + static_cast<char>(kFirstComponent + qMin(component, kComponents - 1));
}

bool hasInner(const QByteArray& pattern)
{
    return pattern.size() > 2 && pattern.mid(1, pattern.size() - 2).contains('*');
}

/// Coded, `?` widened, without runs of `*`.
QByteArray codedPattern(const QString& query)
{
    QByteArray pattern = coded(foldedText(query));
    pattern.replace('?', '*');
    while (pattern.contains("**"))
        pattern.replace("**", "*");
    return pattern;
}

/// A component as it stands in names between the marks before and after it, which are left out where anything may come.
QByteArray componentPattern(const QString& component, const QByteArray& begin, const QByteArray& end)
{
    const QByteArray body = codedPattern(component);
    return (body.startsWith('*') ? QByteArray() : begin) + body + (body.endsWith('*') ? QByteArray() : end);
}

/// Without the stars at its ends; empty when everything matches. `group` is the mark at its beginning.
QByteArray groupPattern(const QString& query, const QByteArray& group)
{
    if (query.isEmpty())
        return {};
    if (!query.contains(QLatin1Char('^'))) {
        const bool hasWildcard = query.contains(QLatin1Char('*')) || query.contains(QLatin1Char('?'));
        return componentPattern(query, group, hasWildcard ? QByteArray("^") : componentEnd(0));
    }
    const QStringList components = query.split(QLatin1Char('^'));
    QByteArray pattern;
    bool isAdjacent = false;
    for (int i = 0; i < components.size(); ++i) {
        const QString component = components.at(i).trimmed();
        if (component.isEmpty() || component == QLatin1String("*")) {
            isAdjacent = false;
            continue;
        }
        const QByteArray begin = i == 0 ? group : componentEnd(i - 1);
        const QByteArray part = componentPattern(component, begin, componentEnd(i));
        // The end of one component is the beginning of the next.
        const bool joins = isAdjacent && pattern.endsWith(begin) && part.startsWith(begin);
        pattern += joins ? part.mid(begin.size()) : (pattern.isEmpty() ? part : '*' + part);
        isAdjacent = true;
    }
    return pattern;
}

bool isDigits(const QByteArray& text)
{
    return std::all_of(text.begin(), text.end(), [](char each) { return each >= '0' && each <= '9'; });
}

/// With what is left out filled up by the characters of `rest`.
QByteArray filledTime(QByteArray time, const char* rest)
{
    time = time.trimmed();
    time.replace(':', "");
    const int point = time.indexOf('.');
    const QByteArray whole = point < 0 ? time : time.left(point);
    const QByteArray fraction = point < 0 ? QByteArray() : time.mid(point + 1);
    const bool isWhole = whole.size() == 2 || whole.size() == 4 || whole.size() == 6;
    if (!isWhole || !isDigits(whole) || !isDigits(fraction) || fraction.size() > 6 ||
        (point >= 0 && whole.size() != 6))
        return "";
    const QByteArray filled = (whole.size() == 6 && point >= 0) ? whole + '.' + fraction : whole;
    return filled + QByteArray(rest).mid(filled.size());
}

}  // namespace

QByteArray searchDate(const QByteArray& date)
{
    QByteArray text = date.trimmed();
    if (text.size() == 10 && text.at(4) == '.' && text.at(7) == '.')
        text.replace('.', "");
    return text.size() == 8 && isDigits(text) ? text : QByteArray("");
}

QByteArray searchTime(const QByteArray& time)
{
    return filledTime(time, "000000.000000");
}

QByteArray lastTime(const QByteArray& time)
{
    return filledTime(time, "235959.999999");
}

QString foldedText(const QString& text)
{
    const QString parts = text.normalized(QString::NormalizationForm_KD);
    QString folded;
    folded.reserve(parts.size());
    for (const QChar each : parts) {
        const bool isMark = each.category() == QChar::Mark_NonSpacing;
        const bool isControl = each.category() == QChar::Other_Control;
        if (!isMark && !isControl)
            folded += each;
    }
    folded = folded.toCaseFolded();
    // Qt folds character by character, and this one is two.
    folded.replace(QChar(0xDF), QLatin1String("ss"));
    return folded.normalized(QString::NormalizationForm_C).trimmed();
}

QByteArray searchText(const QString& text)
{
    return coded(foldedText(text));
}

QByteArray searchName(const QString& name)
{
    QByteArray out;
    const QStringList groups = name.split(QLatin1Char('='));
    for (int i = 0; i < qMin(groups.size(), kGroups); ++i) {
        if (groups.at(i).trimmed().isEmpty())
            continue;
        QStringList components = groups.at(i).split(QLatin1Char('^'));
        while (components.size() < kComponents)
            components.append(QString());
        out += static_cast<char>(kFirstGroup + i);
        out += '=';
        for (int c = 0; c < components.size(); ++c)
            out += coded(foldedText(components.at(c))) + componentEnd(c);
    }
    return out;
}

QByteArray sortName(const QString& name)
{
    const QStringList groups = name.split(QLatin1Char('='));
    for (const QString& group : groups) {
        const QString folded = foldedText(group);
        if (!folded.isEmpty())
            return folded.toUtf8();
    }
    return "";
}

SearchPatterns textPatterns(const QString& query)
{
    const QByteArray pattern = codedPattern(query);
    if (pattern == "*")
        return {};
    return {{pattern}, !query.contains(QLatin1Char('?'))};
}

SearchPatterns namePatterns(const QString& query)
{
    SearchPatterns made;
    made.isExact = !query.contains(QLatin1Char('?'));
    const QStringList groups = query.split(QLatin1Char('='));
    for (int i = 0; i < groups.size(); ++i) {
        const bool isAnyGroup = groups.size() == 1;
        QByteArray mark = "=";
        if (!isAnyGroup)
            mark.prepend(static_cast<char>(kFirstGroup + qMin(i, kGroups - 1)));
        const QByteArray body = groupPattern(groups.at(i).trimmed(), mark);
        if (body.isEmpty() || body == "*")
            continue;
        QByteArray pattern = body;
        if (!pattern.startsWith('*'))
            pattern.prepend('*');
        if (!pattern.endsWith('*'))
            pattern.append('*');
        // A run of anything may reach into the next group, and what has no beginning may stand in any of them.
        if (hasInner(pattern) || (!isAnyGroup && !body.startsWith(mark)))
            made.isExact = false;
        made.patterns.append(pattern);
    }
    return made;
}

}  // namespace Kxg
