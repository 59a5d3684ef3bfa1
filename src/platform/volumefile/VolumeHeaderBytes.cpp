#include "platform/volumefile/VolumeHeaderBytes.h"

#include <QDataStream>

#include <algorithm>
#include <cstring>

namespace Kdd::VolumeFile
{
namespace
{

constexpr auto kStreamVersion = QDataStream::Qt_5_15;

/// Numbers as bytes: Qt takes memory for an array before it knows whether there is one, but not for bytes.
template <typename T>
QByteArray packed(const QVector<T>& values)
{
    return QByteArray(reinterpret_cast<const char*>(values.constData()), values.size() * int(sizeof(T)));
}

template <typename T>
bool unpack(QDataStream& in, QVector<T>& values)
{
    QByteArray bytes;
    in >> bytes;
    if (in.status() != QDataStream::Ok || bytes.size() % int(sizeof(T)) != 0)
        return false;
    values.resize(bytes.size() / int(sizeof(T)));
    std::memcpy(values.data(), bytes.constData(), static_cast<std::size_t>(bytes.size()));
    return true;
}

bool readCount(QDataStream& in, int most, int& count)
{
    qint32 told = -1;
    in >> told;
    count = told;
    return in.status() == QDataStream::Ok && told >= 0 && told <= most;
}

bool readName(QDataStream& in, QByteArray& name)
{
    in >> name;
    return in.status() == QDataStream::Ok && name.size() <= kMaxNameLength;
}

void writeBundle(QDataStream& out, const ParamBundle& bundle)
{
    out << qint32(bundle.parameters().size());
    for (auto it = bundle.parameters().begin(); it != bundle.parameters().end(); ++it)
        out << it.key() << qint32(it->kind) << it->text << packed(it->integers) << packed(it->reals);
    out << qint32(bundle.bundles().size());
    for (auto it = bundle.bundles().begin(); it != bundle.bundles().end(); ++it) {
        out << it.key();
        writeBundle(out, *it);
    }
}

bool readParameter(QDataStream& in, Parameter& parameter)
{
    qint32 kind = -1;
    in >> kind >> parameter.text;
    if (kind < 0 || kind > static_cast<qint32>(Parameter::Kind::Reals))
        return false;
    parameter.kind = static_cast<Parameter::Kind>(kind);
    return unpack(in, parameter.integers) && unpack(in, parameter.reals);
}

bool readBundle(QDataStream& in, int depth, int& left, ParamBundle& bundle)
{
    int count = 0;
    if (depth < 0 || --left < 0 || !readCount(in, kMaxParameters, count))
        return false;
    QByteArray name;
    for (int i = 0; i < count; ++i) {
        Parameter parameter;
        if (!readName(in, name) || !readParameter(in, parameter))
            return false;
        bundle.insert(name, parameter);
    }
    if (!readCount(in, kMaxBundles, count))
        return false;
    for (int i = 0; i < count; ++i) {
        ParamBundle below;
        if (!readName(in, name) || !readBundle(in, depth - 1, left, below))
            return false;
        bundle.insertBundle(name, below);
    }
    return true;
}

/// Whether a slice of it has a size that can be.
bool isPossible(const Lattice& lattice)
{
    const QVector<int>& dims = lattice.dims;
    const auto isDim = [](int dim) { return dim >= 1 && dim <= kMaxDimension; };
    if (dims.size() < kMinLatticeDims || dims.size() > kMaxLatticeDims ||
        !std::all_of(dims.begin(), dims.end(), isDim) || lattice.components < 1 ||
        lattice.components > kMaxComponents || sizeOf(lattice.type) == 0)
        return false;
    // All factors are small enough that their product cannot wrap.
    return qint64(dims.at(0)) * dims.at(1) * lattice.components * sizeOf(lattice.type) <= kMaxChunkBytes;
}

bool readLattice(QDataStream& in, int& placesLeft, Lattice& lattice, QVector<ChunkPlace>& places)
{
    qint32 type = -1;
    qint32 components = 0;
    if (!readName(in, lattice.name))
        return false;
    in >> type >> components;
    lattice.type = static_cast<PrimitiveType>(type);
    lattice.components = components;
    if (!unpack(in, lattice.dims) || !isPossible(lattice) || !unpack(in, places))
        return false;
    placesLeft -= places.size();
    return placesLeft >= 0 && places.size() == (lattice.dims.size() == 3 ? lattice.dims.at(2) : 0);
}

bool readSections(QDataStream& in, LocatedHeader& header)
{
    int count = 0;
    if (!readCount(in, kMaxDataSections, count))
        return false;
    for (int i = 0; i < count; ++i) {
        QByteArray name;
        QByteArray fault;
        if (!readName(in, name) || !readName(in, fault))
            return false;
        header.header.dataSections.append(name);
        header.countFaults.append(fault);
    }
    return unpack(in, header.counts) && unpack(in, header.numCounts) && header.counts.size() == count &&
           header.numCounts.size() == count &&
           std::all_of(header.numCounts.begin(), header.numCounts.end(),
                       [](int each) { return each >= 0 && each <= kMaxCounts; });
}

}  // namespace

QByteArray bytesOfHeader(const LocatedHeader& header)
{
    QByteArray bytes;
    QDataStream out(&bytes, QIODevice::WriteOnly);
    out.setVersion(kStreamVersion);
    writeBundle(out, header.header.parameters);
    out << qint32(header.header.lattices.size());
    for (int i = 0; i < header.header.lattices.size(); ++i) {
        const Lattice& lattice = header.header.lattices.at(i);
        out << lattice.name << qint32(lattice.type) << qint32(lattice.components) << packed(lattice.dims)
            << packed(header.slices.at(i));
    }
    out << qint32(header.header.dataSections.size());
    for (int i = 0; i < header.header.dataSections.size(); ++i)
        out << header.header.dataSections.at(i) << header.countFaults.at(i);
    out << packed(header.counts) << packed(header.numCounts);
    return bytes;
}

bool readHeader(const QByteArray& bytes, LocatedHeader& header)
{
    QDataStream in(bytes);
    in.setVersion(kStreamVersion);
    int bundlesLeft = kMaxBundles + 1;
    int placesLeft = kMaxPlaces;
    int count = 0;
    if (!readBundle(in, kMaxBundleDepth, bundlesLeft, header.header.parameters) ||
        !readCount(in, kMaxLattices, count))
        return false;
    for (int i = 0; i < count; ++i) {
        Lattice lattice;
        QVector<ChunkPlace> places;
        if (!readLattice(in, placesLeft, lattice, places))
            return false;
        header.header.lattices.append(lattice);
        header.slices.append(places);
    }
    return readSections(in, header) && in.status() == QDataStream::Ok && in.atEnd();
}

}  // namespace Kdd::VolumeFile
