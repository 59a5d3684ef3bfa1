#pragma once

#include "platform/base/Export.h"

#include <QByteArray>
#include <QString>
#include <QVector>

namespace Kxg
{

// Texts as searches compare them: without regard to case and accents, in a form of ASCII letters alone, so that every
// engine and locale finds parts of them by the same index, also of one ideograph.
//
// In patterns `*` stands for any run of characters. There is no other wildcard: `?` becomes `*`, for what is one
// character to the user may be several here; whoever asks then looks at what is found once more.

/// Small letters without accents.
KDD_EXPORT QString foldedText(const QString& text);

/// A folded text in the form that is searched.
KDD_EXPORT QByteArray searchText(const QString& text);

/// A person's name likewise: its groups (alphabetic, ideographic, phonetic) and components are marked.
KDD_EXPORT QByteArray searchName(const QString& name);

/// The alphabetic group, or the first that there is, by which lists are sorted.
KDD_EXPORT QByteArray sortName(const QString& name);

/// A date of either form ("20240131", "2024.01.31") as YYYYMMDD; empty when it is none.
KDD_EXPORT QByteArray searchDate(const QByteArray& date);

/// A time of any precision and form ("1030", "10:30:15.5") as HHMMSS.FFFFFF, what is left out being the earliest;
/// empty when it is none.
KDD_EXPORT QByteArray searchTime(const QByteArray& time);

/// The last moment that the time may mean: "1030" is until 103059.999999.
KDD_EXPORT QByteArray lastTime(const QByteArray& time);

struct SearchPatterns
{
    QVector<QByteArray> patterns;  ///< all of them hold for what is looked for; none: everything is
    bool isExact = true;           ///< else they hold for other texts too
};

/// Of a text with `*` and `?` in it or without.
KDD_EXPORT SearchPatterns textPatterns(const QString& query);

/// Of a name that is asked for, with or without wildcards. What it does not say holds for any: "Doe" asks for the first
/// component, "^John" for the second, "*o*" for any place; a text without "=" for any group.
KDD_EXPORT SearchPatterns namePatterns(const QString& query);

}  // namespace Kxg
