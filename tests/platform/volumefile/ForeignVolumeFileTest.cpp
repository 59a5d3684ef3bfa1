#include "platform/volumefile/ChunkCoding.h"
#include "platform/volumefile/OrlanMesh.h"
#include "platform/volumefile/SOPInstanceUtility.h"
#include "platform/volumefile/VolumeFileBuilder.h"
#include "platform/volumefile/VolumeFileFormat.h"

#include <gtest/gtest.h>
#include <hdf5.h>

#include <functional>
#include <random>

using namespace Kdd;

// The library itself loses some memory with every damaged object header. What we leave open is counted below.
extern "C" __attribute__((visibility("default"))) const char* __lsan_default_suppressions()
{
    return "leak:libhdf5";
}

namespace
{

constexpr char kLevel0[] = "Lattices/Level0";
constexpr char kHistogram[] = "DataSections/Histogram";

/// Reads all there is. What is accepted has to be the truth.
Result readAll(const QByteArray& bytes)
{
    Result result;
    const auto mesh = OrlanMesh::read(bytes, "damaged.vol", result);
    const Lattice* lattice = mesh ? mesh->findLattice("Level0", 3) : nullptr;
    QVector<quint64> counts;
    if (lattice != nullptr)
        result = mesh->readDataSection("Histogram", counts);
    for (int i = 0; result.good() && i < qMin(lattice->dims.at(2), 5); ++i) {
        TypedData2D pixels;
        result = mesh->readSlice(*lattice, i, pixels);
        EXPECT_TRUE(result.bad() || pixels.pixels == sliceOf(*lattice, i).pixels);
    }
    EXPECT_TRUE(result.good() || result.text().startsWith(QLatin1String("Volume file damaged.vol: ")));
    return result;
}

QByteArray smallFile()
{
    ParamBundle parameters;
    parameters.insert("BoundingBox", Parameter::ofReals({0, 1, 0, 1, 0, 1}));
    parameters.insertBundle("SOPInstanceUIDs", SOPInstanceUtility::bundleOf({"1.2.1", "1.2.2", "1.2.3"}));
    const VolumeFileBuilder file;
    file.write(aLattice(), parameters);
    return file.bytes();
}

TEST(DamagedVolumeFile, IsRefusedOrGivesTheTruePixels)
{
    const QByteArray whole = smallFile();
    ASSERT_TRUE(readAll(whole).good());
    for (int size = 0; size < whole.size(); size += 7)
        EXPECT_TRUE(readAll(whole.left(size)).bad()) << size;
    std::minstd_rand random(1);
    for (int i = 0; i < 1'500; ++i) {
        QByteArray damaged = whole;
        for (int flip = 0; flip <= i % 3; ++flip) {
            const int at = static_cast<int>(random() % static_cast<unsigned>(damaged.size()));
            damaged[at] = static_cast<char>(damaged.at(at) ^ (1 << random() % 8));
        }
        readAll(damaged);
    }
    EXPECT_EQ(H5Fget_obj_count(static_cast<hid_t>(H5F_OBJ_ALL), H5F_OBJ_ALL), 0);
}

using Change = std::function<void(hid_t file)>;
using Dims = std::vector<hsize_t>;

void putDataset(hid_t file, const char* name, hid_t type, const Dims& dims, hid_t properties)
{
    if (H5Lexists(file, name, H5P_DEFAULT) > 0)
        H5Ldelete(file, name, H5P_DEFAULT);
    const hid_t space = H5Screate_simple(static_cast<int>(dims.size()), dims.data(), nullptr);
    H5Dclose(H5Dcreate2(file, name, type, space, H5P_DEFAULT, properties, H5P_DEFAULT));
    H5Sclose(space);
    H5Pclose(properties);
}

hid_t chunked(const Dims& chunk)
{
    const hid_t properties = H5Pcreate(H5P_DATASET_CREATE);
    H5Pset_chunk(properties, static_cast<int>(chunk.size()), chunk.data());
    return properties;
}

hid_t compressed(const Dims& chunk)
{
    const hid_t properties = chunked(chunk);
    H5Pset_deflate(properties, 1);
    return properties;
}

/// Puts a stream of zeros into the place of slice 2.
void putChunk(hid_t file, int size)
{
    const QByteArray stream = VolumeFile::deflated(QByteArray(size, '\0'));
    const hsize_t start[] = {2, 0, 0};
    const hid_t dataset = H5Dopen2(file, kLevel0, H5P_DEFAULT);
    H5Dwrite_chunk(dataset, H5P_DEFAULT, 0, start, static_cast<size_t>(stream.size()), stream.constData());
    H5Dclose(dataset);
}

hid_t virtualStorage()
{
    const hid_t properties = H5Pcreate(H5P_DATASET_CREATE);
    const hsize_t dims[] = {1, 2, 3};
    const hid_t space = H5Screate_simple(3, dims, nullptr);
    H5Pset_virtual(properties, space, "other.vol", "Lattices/Level0", space);
    H5Sclose(space);
    return properties;
}

hid_t variableText()
{
    const hid_t type = H5Tcopy(H5T_C_S1);
    H5Tset_size(type, H5T_VARIABLE);
    return type;
}

void putAttribute(hid_t file, const char* group, hid_t type, hsize_t count)
{
    const hid_t space = H5Screate_simple(1, &count, nullptr);
    H5Aclose(H5Acreate_by_name(file, group, "Bad", type, space, H5P_DEFAULT, H5P_DEFAULT, H5P_DEFAULT));
    H5Sclose(space);
}

/// Another lattice in place of the one that is there.
Change lattice(hid_t type, const Dims& dims, hid_t properties)
{
    return [=](hid_t file) { putDataset(file, kLevel0, type, dims, properties); };
}

Change pixels(hid_t type, const Dims& dims, const Dims& chunk)
{
    return lattice(type, dims, compressed(chunk));
}

/// A dataset of one dimension.
Change row(const char* name, hid_t type, hsize_t count, hsize_t chunk)
{
    return [=](hid_t file) { putDataset(file, name, type, {count}, compressed({chunk})); };
}

Change parameter(hid_t type, hsize_t count)
{
    return [=](hid_t file) { putAttribute(file, "Parameters", type, count); };
}

constexpr hsize_t kMany = 1 << 22;

/// More members of a group than there may be, all of them one empty bundle.
Change members(QByteArray group, int count)
{
    return [=](hid_t file) {
        const hid_t one = H5Gcreate2(file, "Empty", H5P_DEFAULT, H5P_DEFAULT, H5P_DEFAULT);
        for (int i = 0; i < count; ++i)
            H5Lcreate_hard(file, "Empty", file, group + "/M" + QByteArray::number(i), H5P_DEFAULT,
                           H5P_DEFAULT);
        H5Gclose(one);
        H5Ldelete(file, "Empty", H5P_DEFAULT);
    };
}

/// Pixels of so many numbers, which say the same of themselves.
void putComponents(hid_t file, std::int64_t count)
{
    const Dims dims = {2, 4, 4, static_cast<hsize_t>(count)};
    putDataset(file, kLevel0, H5T_STD_U8LE, dims, compressed({1, 4, 4, dims[3]}));
    const hid_t space = H5Screate(H5S_SCALAR);
    const hid_t said = H5Acreate_by_name(file, kLevel0, VolumeFile::kComponentsAttribute, H5T_STD_I64LE,
                                         space, H5P_DEFAULT, H5P_DEFAULT, H5P_DEFAULT);
    H5Awrite(said, H5T_NATIVE_INT64, &count);
    H5Aclose(said);
    H5Sclose(space);
}

/// One number under more names than there may be parameters.
void putParameters(hid_t file)
{
    const std::int64_t value = 7;
    putDataset(file, "Parameters/Long", H5T_STD_I64LE, {1}, compressed({1}));
    const hid_t dataset = H5Dopen2(file, "Parameters/Long", H5P_DEFAULT);
    H5Dwrite(dataset, H5T_NATIVE_INT64, H5S_ALL, H5S_ALL, H5P_DEFAULT, &value);
    H5Dclose(dataset);
    for (int i = 0; i < VolumeFile::kMaxParameters; ++i)
        H5Lcreate_hard(file, "Parameters/Long", file, "Parameters/P" + QByteArray::number(i), H5P_DEFAULT,
                       H5P_DEFAULT);
}

/// A sound file in which one thing is replaced through the library itself, checksums and all, and why it is refused then.
const std::tuple<const char*, const char*, Change> kHostile[] = {
    {"ClaimsPixelsThatAreNotThere", "slice 0: is not in the file",
     pixels(H5T_STD_U16LE, {9, 20'000, 20'000}, {1, 20'000, 20'000})},
    {"ChunkInflatesToAnotherLength", "slice 2: is damaged", [](hid_t f) { putChunk(f, 401); }},
    {"ChunkTooLarge", "chunks of more than", pixels(H5T_STD_U16LE, {1, 40'000, 20'000}, {1, 40'000, 20'000})},
    {"TooManySlices", "dimension 0 is 1099511627776", pixels(H5T_STD_U8LE, {1ULL << 40, 1, 1}, {1, 1, 1})},
    {"ChunkIsNotASlice", "dimension 0 is 2 in chunks of 2", pixels(H5T_STD_U8LE, {2, 4, 4}, {2, 4, 4})},
    {"BigEndian", "unknown type", pixels(H5T_STD_U16BE, {2, 4, 4}, {1, 4, 4})},
    {"VariableTexts", "neither numbers nor characters",
     [](hid_t f) {
         pixels(variableText(), {1, 2, 3}, {1, 2, 3})(f);
     }},
    {"NotCompressed", "is not compressed", lattice(H5T_STD_U8LE, {2, 4, 4}, chunked({1, 4, 4}))},
    {"OtherFilter", "has filter",
     [](hid_t f) {
         const hid_t properties = compressed({1, 4, 4});
         H5Pset_fletcher32(properties);
         putDataset(f, kLevel0, H5T_STD_U16LE, {2, 4, 4}, properties);
     }},
    {"VirtualPixels", "not stored in chunks", lattice(H5T_STD_U8LE, {1, 2, 3}, virtualStorage())},
    {"LinkToAnotherFile", "is a link to elsewhere",
     [](hid_t f) { H5Lcreate_external("o.vol", "/", f, "Parameters/Link", H5P_DEFAULT, H5P_DEFAULT); }},
    {"BundleInsideItself", "nested too deep",
     [](hid_t f) { H5Lcreate_hard(f, "Parameters", f, "Parameters/Self", H5P_DEFAULT, H5P_DEFAULT); }},
    {"ParameterOfAnotherType", "neither a fixed-length text", parameter(H5T_STD_I32LE, 1)},
    {"ListOfTexts", "wrong shape", parameter(H5T_C_S1, 3)},
    {"LongParameterInPieces", "not one chunk", row("Parameters/Long", H5T_STD_I64LE, 9, 3)},
    {"ParameterClaimsMoreThanThereIs", "is not in the file",
     row("Parameters/Long", H5T_STD_I64LE, kMany, kMany)},
    {"TooManyCounts", "has 4194304 counts", row(kHistogram, H5T_STD_U64LE, kMany, kMany)},
    {"CountsOfAnotherType", "not one chunk of 64-bit counts", row(kHistogram, H5T_STD_I64LE, 9, 9)},
    {"TooManyRootMembers", "64 are the most", members(".", 65)},
    {"TooManyLattices", "64 are the most", members(VolumeFile::kLatticesGroup, 64)},
    {"TooManyDataSections", "64 are the most", members(VolumeFile::kDataSectionsGroup, 65)},
    {"TooManyBundles", "bundles are too many", members(VolumeFile::kParametersGroup, 1000)},
    {"TooManyParameters", "is one of more than 20000 parameters", putParameters},
    {"TooLongParameters", "makes the parameters longer than 67108864 bytes",
     row("Parameters/Long", H5T_STD_I64LE, 1 << 24, 1 << 24)},
    {"TooManyComponents", "has a wrong number of components", [](hid_t f) { putComponents(f, 17); }},
    {"LongName", "has no proper name",
     [](hid_t f) { H5Lcreate_hard(f, "Parameters", f, QByteArray(256, 'n'), H5P_DEFAULT, H5P_DEFAULT); }},
    {"StoredChunkTooLong", "slice 2: claims 2000 bytes for 400",
     [](hid_t f) {
         const hsize_t start[] = {2, 0, 0};
         const hid_t dataset = H5Dopen2(f, kLevel0, H5P_DEFAULT);
         H5Dwrite_chunk(dataset, H5P_DEFAULT, 0, start, 2000, QByteArray(2000, 'x').constData());
         H5Dclose(dataset);
     }},
    {"LaterVersion", "format version",
     [](hid_t f) {
         H5Arename(f, "FormatVersion", "FormerVersion");
         putAttribute(f, "/", H5T_STD_I64LE, 1);
         H5Arename(f, "Bad", "FormatVersion");
     }},
};

hid_t openForChange(const VolumeFileBuilder& builder)
{
    const hid_t access = H5Pcreate(H5P_FILE_ACCESS);
    H5Pset_libver_bounds(access, H5F_LIBVER_LATEST, H5F_LIBVER_LATEST);
    const hid_t file = H5Fopen(builder.path().constData(), H5F_ACC_RDWR, access);
    H5Pclose(access);
    return file;
}

TEST(HostileVolumeFile, IsRefusedWithTheReason)
{
    for (const auto& [name, reason, change] : kHostile) {
        const VolumeFileBuilder builder;
        ASSERT_TRUE(builder.write(aLattice()).good());
        const hid_t file = openForChange(builder);
        change(file);
        ASSERT_GE(H5Fclose(file), 0);
        const Result result = readAll(builder.bytes());
        EXPECT_TRUE(result.text().contains(QLatin1String(reason)))
            << name << ": " << qPrintable(result.text());
    }
}

// Both ways: the library decodes our slices with its own filters, and we decode those that it compresses, or stores as
// they are because they cannot be compressed.
TEST(ForeignVolumeFile, HasTheFiltersOfTheLibrary)
{
    const VolumeFileBuilder builder;
    const Lattice lattice = aLattice();
    ASSERT_TRUE(builder.write(lattice).good());
    const hid_t file = openForChange(builder);
    const hid_t dataset = H5Dopen2(file, kLevel0, H5P_DEFAULT);
    QByteArray all(3 * 400, '\0');
    H5Dread(dataset, H5T_STD_U16LE, H5S_ALL, H5S_ALL, H5P_DEFAULT, all.data());
    EXPECT_EQ(all, sliceOf(lattice, 0).pixels + sliceOf(lattice, 1).pixels + sliceOf(lattice, 2).pixels);
    const QByteArray smooth = QByteArray("abcdefgh").repeated(50);
    const QByteArray changed = sliceOf(lattice, 2).pixels + smooth + sliceOf(lattice, 0).pixels;
    H5Dwrite(dataset, H5T_STD_U16LE, H5S_ALL, H5S_ALL, H5P_DEFAULT, changed.constData());
    H5Dclose(dataset);
    H5Fclose(file);

    const auto mesh = builder.open();
    QByteArray found;
    for (int i = 0; i < 3; ++i) {
        TypedData2D pixels;
        EXPECT_TRUE(mesh->readSlice(lattice, i, pixels).good());
        found += pixels.pixels;
    }
    EXPECT_EQ(found, changed);
}

}  // namespace
