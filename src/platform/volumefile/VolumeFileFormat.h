#pragma once

#include "platform/base/TypedData2D.h"

#include <QByteArray>

#include <hdf5.h>

#include <optional>

// What is fixed about volume files: names, types, and the bounds that readers hold every claim of a file against.
namespace Kdd::VolumeFile
{

constexpr char kFormatName[] = "KddVolume";
constexpr int kFormatVersion = 1;

constexpr char kFormatAttribute[] = "Format";
constexpr char kVersionAttribute[] = "FormatVersion";
constexpr char kComponentsAttribute[] = "Components";
constexpr char kLatticesGroup[] = "Lattices";
constexpr char kParametersGroup[] = "Parameters";
constexpr char kDataSectionsGroup[] = "DataSections";

constexpr int kMaxRootMembers = 64;
constexpr int kMaxNameLength = 255;  ///< [bytes]

constexpr int kMaxLattices = 64;
constexpr int kMinLatticeDims = 2;
constexpr int kMaxLatticeDims = 4;
constexpr int kMaxDimension = 1'000'000;
constexpr int kMaxComponents = 16;
constexpr int kMaxRank = kMaxLatticeDims + 1;
constexpr qint64 kMaxChunkBytes = qint64(1) << 30;

constexpr int kMaxDataSections = 64;
constexpr int kMaxCounts = 1 << 20;

constexpr int kMaxBundleDepth = 8;
constexpr int kMaxBundles = 1'000;
constexpr int kMaxParameters = 20'000;
constexpr qint64 kMaxParameterBytes = qint64(64) << 20;  ///< all parameters of a file together

/// A longer parameter is kept as a dataset, because an attribute cannot grow beyond 64 KB everywhere.
constexpr int kMaxAttributeBytes = 32'000;

/// The type in the file that stands for a primitive type. Not to be closed.
hid_t fileType(PrimitiveType type);

/// The reverse; nothing when the type is none of ours to the last bit.
std::optional<PrimitiveType> findPrimitiveType(hid_t type);

/// Whether a group can have a member of that name and lead to it and nowhere else.
bool isName(const QByteArray& name);

}  // namespace Kdd::VolumeFile
