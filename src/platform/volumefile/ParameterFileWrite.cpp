#include "platform/volumefile/ChunkedData.h"
#include "platform/volumefile/ParameterFile.h"
#include "platform/volumefile/hdf5/OwnTypes.h"

namespace Kdd::VolumeFile
{
namespace
{

template <typename Number>
QByteArray bytesFrom(const QVector<Number>& numbers)
{
    return {reinterpret_cast<const char*>(numbers.constData()),
            numbers.size() * static_cast<int>(sizeof(Number))};
}

QByteArray bytesOf(const Parameter& parameter)
{
    switch (parameter.kind) {
    case Parameter::Kind::Integers:
        return bytesFrom(parameter.integers);
    case Parameter::Kind::Reals:
        return bytesFrom(parameter.reals);
    case Parameter::Kind::Text:
        break;
    }
    return parameter.text;
}

/// The type of one element, a text of `textLength` characters for a text.
Handle elementType(Parameter::Kind kind, int textLength)
{
    if (kind != Parameter::Kind::Text)
        return {
            H5Tcopy(kind == Parameter::Kind::Integers ? ownType(OwnType::Int64) : ownType(OwnType::Float64)),
            H5Tclose};
    Handle type(H5Tcopy(ownType(OwnType::Text)), H5Tclose);
    H5Tset_size(type.id(), static_cast<std::size_t>(textLength));
    // Filled up with zeros and not ended by one, so that every byte may be text.
    H5Tset_strpad(type.id(), H5T_STR_NULLPAD);
    return type;
}

Result writeDataset(hid_t group, const QByteArray& name, Parameter::Kind kind, const QByteArray& bytes)
{
    // Text as single characters, because readers take no elements that are longer than a number.
    const Handle type = elementType(kind, 1);
    const QVector<hsize_t> dims{static_cast<hsize_t>(bytes.size()) / H5Tget_size(type.id())};
    ChunkedData data;
    const Result created = data.create(group, name, type.id(), dims, dims);
    return created.bad() ? created : data.writeChunk({0}, bytes);
}

Result writeParameter(hid_t group, const QByteArray& name, ParameterBudget& budget,
                      const Parameter& parameter)
{
    const qint64 size = bytesOf(parameter).size();
    if (!isName(name))
        return Result::failure(QStringLiteral("is no name of a parameter"));
    // Readers end a text at its first zero, so what stands behind it would be lost.
    if (parameter.kind == Parameter::Kind::Text && parameter.text.contains('\0'))
        return Result::failure(QStringLiteral("has a zero in its text"));
    const Result spent = spend(budget, size);
    if (spent.bad())
        return spent;
    if (size > kMaxAttributeBytes)
        return writeDataset(group, name, parameter.kind, bytesOf(parameter));
    return writeAttribute(group, name, parameter);
}

Result writeBelow(hid_t group, const QByteArray& name, ParameterBudget& budget, const ParamBundle& bundle)
{
    if (!isName(name))
        return Result::failure(QStringLiteral("is no name of a bundle"));
    const Handle below(H5Gcreate2(group, name.constData(), H5P_DEFAULT, H5P_DEFAULT, H5P_DEFAULT), H5Gclose);
    if (!below.isOpen())
        return libraryFailure(QStringLiteral("cannot be made"));
    return writeBundle(below.id(), budget, bundle);
}

}  // namespace

Result writeAttribute(hid_t object, const QByteArray& name, const Parameter& parameter)
{
    const bool isText = parameter.kind == Parameter::Kind::Text;
    QByteArray bytes = bytesOf(parameter);
    // There are no texts without characters; a zero is the padding of an empty one.
    if (isText && bytes.isEmpty())
        bytes.append('\0');
    const Handle type = elementType(parameter.kind, bytes.size());
    const hsize_t count = isText ? 1 : static_cast<hsize_t>(bytes.size()) / H5Tget_size(type.id());
    const Handle space(isText ? H5Screate(H5S_SCALAR) : H5Screate_simple(1, &count, nullptr), H5Sclose);
    const Handle attribute(
        H5Acreate2(object, name.constData(), type.id(), space.id(), H5P_DEFAULT, H5P_DEFAULT), H5Aclose);
    // An empty list of numbers has a place and nothing to write there.
    if (!attribute.isOpen() || (count > 0 && H5Awrite(attribute.id(), type.id(), bytes.constData()) < 0))
        return libraryFailure(QStringLiteral("cannot be written"));
    return {};
}

Result writeBundle(hid_t group, ParameterBudget& budget, const ParamBundle& bundle)
{
    if (budget.depth < 1 || budget.bundles < 1)
        return Result::failure(QStringLiteral("bundles are too many or nested too deep"));
    --budget.bundles;
    --budget.depth;
    for (auto it = bundle.parameters().begin(); it != bundle.parameters().end(); ++it) {
        const Result written = writeParameter(group, it.key(), budget, it.value());
        if (written.bad())
            return written.within(QStringLiteral("parameter \"%1\"").arg(QString::fromUtf8(it.key())));
    }
    for (auto it = bundle.bundles().begin(); it != bundle.bundles().end(); ++it) {
        const Result written = writeBelow(group, it.key(), budget, it.value());
        if (written.bad())
            return written.within(QString::fromUtf8(it.key()));
    }
    ++budget.depth;
    return {};
}

}  // namespace Kdd::VolumeFile
