#include "platform/volumefile/ChunkedData.h"
#include "platform/volumefile/ParameterFile.h"
#include "platform/volumefile/hdf5/OwnTypes.h"

#include <cstring>
#include <optional>

namespace Kdd::VolumeFile
{
namespace
{

std::optional<Parameter::Kind> findKind(hid_t type)
{
    if (H5Tget_class(type) == H5T_STRING && H5Tis_variable_str(type) == 0)
        return Parameter::Kind::Text;
    // To the last bit: a narrower or foreign number would be read into the wrong places.
    if (H5Tequal(type, ownType(OwnType::Int64)) > 0)
        return Parameter::Kind::Integers;
    if (H5Tequal(type, ownType(OwnType::Float64)) > 0)
        return Parameter::Kind::Reals;
    return {};
}

Result unknownType()
{
    return Result::failure(
        QStringLiteral("is neither a fixed-length text nor 64-bit integers nor 64-bit reals"));
}

template <typename Number>
QVector<Number> numbersFrom(const QByteArray& bytes)
{
    QVector<Number> numbers(bytes.size() / static_cast<int>(sizeof(Number)));
    // The file's byte order is this machine's, as its types were compared with.
    std::memcpy(numbers.data(), bytes.constData(), static_cast<std::size_t>(numbers.size()) * sizeof(Number));
    return numbers;
}

Parameter parameterFrom(Parameter::Kind kind, const QByteArray& bytes)
{
    if (kind == Parameter::Kind::Integers)
        return Parameter::ofIntegers(numbersFrom<qint64>(bytes));
    if (kind == Parameter::Kind::Reals)
        return Parameter::ofReals(numbersFrom<double>(bytes));
    // Texts are padded with zeros.
    const int end = bytes.indexOf('\0');
    return Parameter::ofText(end < 0 ? bytes : bytes.left(end));
}

/// The number of elements of an attribute, which has one dimension or none; -1 when it is otherwise or too long.
qint64 countElements(hid_t attribute, Parameter::Kind kind, std::size_t elementSize)
{
    const Handle space(H5Aget_space(attribute), H5Sclose);
    const H5S_class_t shape = H5Sget_simple_extent_type(space.id());
    const bool isText = kind == Parameter::Kind::Text;
    // A text is one element however long it is; a list of texts is nothing that is written.
    if (shape != H5S_SCALAR && (isText || shape != H5S_SIMPLE || H5Sget_simple_extent_ndims(space.id()) != 1))
        return -1;
    const hssize_t count = H5Sget_simple_extent_npoints(space.id());
    // Divided, because the product of a claimed count and size could wrap.
    return count > kMaxParameterBytes / static_cast<qint64>(elementSize) ? -1 : count;
}

Result readDataset(hid_t group, const QByteArray& name, ParameterBudget& budget, Parameter& parameter)
{
    ChunkedData data;
    Result opened = data.open(group, name);
    if (opened.bad())
        return opened;
    const std::optional<Parameter::Kind> kind = findKind(data.type());
    const std::size_t elementSize = H5Tget_size(data.type());
    // A long text is a dataset of single characters.
    if (!kind || (*kind == Parameter::Kind::Text && elementSize != 1))
        return unknownType();
    if (data.dims().size() != 1 || data.chunk() != data.dims())
        return Result::failure(QStringLiteral("is not one chunk of one dimension"));
    // The count was held against the bound on chunks while the dataset was opened.
    const qint64 bytes = elementCount(data.dims(), kMaxChunkBytes) * static_cast<qint64>(elementSize);
    Result result = spend(budget, bytes);
    QByteArray stored;
    if (result.good())
        result = data.readChunk({0}, stored);
    parameter = parameterFrom(*kind, stored);
    return result;
}

Result readAttributes(hid_t group, ParameterBudget& budget, ParamBundle& bundle)
{
    QVector<QByteArray> names;
    Result listed = listAttributes(group, budget.parameters, names);
    if (listed.bad())
        return listed;
    for (const QByteArray& name : qAsConst(names)) {
        Parameter parameter;
        Result read = readAttribute(group, name, budget, parameter);
        if (read.bad())
            return read;
        bundle.insert(name, parameter);
    }
    return {};
}

Result readMember(hid_t group, const QByteArray& name, ParameterBudget& budget, ParamBundle& bundle)
{
    Handle object;
    Result opened = openMember(group, name, object);
    if (opened.bad())
        return opened;
    if (H5Iget_type(object.id()) == H5I_GROUP) {
        ParamBundle below;
        Result read = readBundle(object.id(), budget, below);
        bundle.insertBundle(name, below);
        return read;
    }
    // An attribute and a dataset of one name would be one parameter with two values.
    if (bundle.contains(name))
        return Result::failure(QStringLiteral("stands there twice"));
    Parameter parameter;
    Result read = readDataset(group, name, budget, parameter);
    bundle.insert(name, parameter);
    return read;
}

}  // namespace

Result spend(ParameterBudget& budget, qint64 bytes)
{
    if (budget.parameters < 1)
        return Result::failure(QStringLiteral("is one of more than %1 parameters").arg(kMaxParameters));
    if (budget.bytes < bytes)
        return Result::failure(
            QStringLiteral("makes the parameters longer than %1 bytes").arg(kMaxParameterBytes));
    --budget.parameters;
    budget.bytes -= bytes;
    return {};
}

Result readAttribute(hid_t object, const QByteArray& name, ParameterBudget& budget, Parameter& parameter)
{
    const QString context = QStringLiteral("parameter \"%1\"").arg(QString::fromUtf8(name));
    const Handle attribute(H5Aopen(object, name.constData(), H5P_DEFAULT), H5Aclose);
    if (!attribute.isOpen())
        return libraryFailure(context);
    const Handle type(H5Aget_type(attribute.id()), H5Tclose);
    const std::optional<Parameter::Kind> kind = findKind(type.id());
    const std::size_t elementSize = H5Tget_size(type.id());
    if (!kind || elementSize < 1 || elementSize > kMaxParameterBytes)
        return unknownType().within(context);
    const qint64 count = countElements(attribute.id(), *kind, elementSize);
    if (count < 0)
        return Result::failure(QStringLiteral("has a wrong shape")).within(context);
    const qint64 size = count * static_cast<qint64>(elementSize);
    // Before memory is taken for the value.
    const Result spent = spend(budget, size);
    if (spent.bad())
        return spent.within(context);
    QByteArray bytes(static_cast<int>(size), Qt::Uninitialized);
    if (size > 0 && H5Aread(attribute.id(), type.id(), bytes.data()) < 0)
        return libraryFailure(context);
    parameter = parameterFrom(*kind, bytes);
    return {};
}

Result readBundle(hid_t group, ParameterBudget& budget, ParamBundle& bundle)
{
    if (budget.depth < 1 || budget.bundles < 1)
        return Result::failure(QStringLiteral("bundles are too many or nested too deep"));
    --budget.bundles;
    Result result = readAttributes(group, budget, bundle);
    QVector<QByteArray> names;
    // Each member is a bundle or a parameter, so a group of more than is left of both is refused before
    // it is listed.
    if (result.good())
        result = listMembers(group, budget.parameters + budget.bundles, names);
    // Depth counts the way down and is given back; what bundles and parameters cost is spent for good.
    --budget.depth;
    for (int i = 0; i < names.size() && result.good(); ++i) {
        result = readMember(group, names.at(i), budget, bundle);
        result = result.within(QString::fromUtf8(names.at(i)));
    }
    ++budget.depth;
    return result;
}

}  // namespace Kdd::VolumeFile
