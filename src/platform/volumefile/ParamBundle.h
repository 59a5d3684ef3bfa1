#pragma once

#include "platform/base/Export.h"

#include <QByteArray>
#include <QMap>
#include <QVector>

namespace Kdd
{

/// A named value of a volume file: a text, or numbers. Each thread uses a copy of its own.
struct KDD_EXPORT Parameter
{
    enum class Kind { Text, Integers, Reals };

    Kind kind = Kind::Text;
    QByteArray text;
    QVector<qint64> integers;
    QVector<double> reals;

    static Parameter ofText(const QByteArray& text) { return {Kind::Text, text, {}, {}}; }
    static Parameter ofIntegers(const QVector<qint64>& values) { return {Kind::Integers, {}, values, {}}; }
    static Parameter ofReals(const QVector<double>& values) { return {Kind::Reals, {}, {}, values}; }

    /// The numbers, of either kind; none for a text.
    QVector<double> numbers() const;
};

/// Parameters by name, and further bundles by name below them. A value; copies share what they hold. Each thread uses
/// one of its own.
class KDD_EXPORT ParamBundle
{
public:
    bool contains(const QByteArray& name) const { return mParameters.contains(name); }
    void insert(const QByteArray& name, const Parameter& parameter) { mParameters.insert(name, parameter); }
    const QMap<QByteArray, Parameter>& parameters() const { return mParameters; }

    /// Empty when absent or no text.
    QByteArray text(const QByteArray& name) const;

    /// All numbers of a parameter; none when it is absent or a text.
    QVector<double> numbers(const QByteArray& name) const;

    /// The first number, or the fallback. Numbers outside the range of the result count as absent.
    double real(const QByteArray& name, double fallback) const;
    int integer(const QByteArray& name, int fallback) const;

    /// A bundle below this one; an empty one when it is absent.
    ParamBundle bundle(const QByteArray& name) const;
    void insertBundle(const QByteArray& name, const ParamBundle& bundle);
    const QMap<QByteArray, ParamBundle>& bundles() const { return mBundles; }

private:
    QMap<QByteArray, Parameter> mParameters;
    QMap<QByteArray, ParamBundle> mBundles;
};

}  // namespace Kdd
