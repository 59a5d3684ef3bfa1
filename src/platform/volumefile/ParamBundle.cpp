#include "platform/volumefile/ParamBundle.h"

#include <limits>

namespace Kdd
{

QVector<double> Parameter::numbers() const
{
    if (kind != Kind::Integers)
        return reals;
    QVector<double> numbers;
    numbers.reserve(integers.size());
    // Above 2^53 a real does not tell neighbours apart; whoever needs that takes the integers themselves.
    for (const qint64 value : integers)
        numbers.append(static_cast<double>(value));
    return numbers;
}

QByteArray ParamBundle::text(const QByteArray& name) const
{
    // What is absent has an empty text, as a parameter of another kind has.
    return mParameters.value(name).text;
}

QVector<double> ParamBundle::numbers(const QByteArray& name) const
{
    return mParameters.value(name).numbers();
}

double ParamBundle::real(const QByteArray& name, double fallback) const
{
    const QVector<double> values = numbers(name);
    return values.isEmpty() ? fallback : values.first();
}

int ParamBundle::integer(const QByteArray& name, int fallback) const
{
    using Limits = std::numeric_limits<int>;
    // Numbers are accepted as integers and as reals alike.
    const double value = real(name, fallback);
    // Written so that a value that is no number fails it too.
    const bool fits = value >= Limits::min() && value <= Limits::max();
    return fits ? static_cast<int>(value) : fallback;
}

ParamBundle ParamBundle::bundle(const QByteArray& name) const
{
    return mBundles.value(name);
}

void ParamBundle::insertBundle(const QByteArray& name, const ParamBundle& bundle)
{
    mBundles.insert(name, bundle);
}

}  // namespace Kdd
