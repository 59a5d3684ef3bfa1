#include "platform/volumefile/VolumeHeaderBytes.h"

#include <gtest/gtest.h>

using namespace Kdd;
using namespace Kdd::VolumeFile;

namespace
{

LocatedHeader aHeader()
{
    LocatedHeader located;
    ParamBundle below;
    below.insert("Text", Parameter::ofText("abc"));
    located.header.parameters.insert("Integers", Parameter::ofIntegers({1, -2}));
    located.header.parameters.insert("Reals", Parameter::ofReals({0.5}));
    located.header.parameters.insertBundle("DICOM", below);
    located.header.lattices.append({"Level0", {4, 3, 2}, PrimitiveType::Int16, 1});
    located.slices.append({{100, 20, 0, 1}, {120, 30, 1, 1}});
    located.header.dataSections.append("Histogram");
    located.counts.append({200, 40, 0, 1});
    located.numCounts.append(7);
    located.countFaults.append("");
    return located;
}

bool isRead(const LocatedHeader& header)
{
    LocatedHeader read;
    return readHeader(bytesOfHeader(header), read);
}

TEST(VolumeHeader, ComesBackAsItWas)
{
    LocatedHeader read;
    ASSERT_TRUE(readHeader(bytesOfHeader(aHeader()), read));
    EXPECT_EQ(bytesOfHeader(read), bytesOfHeader(aHeader()));
    EXPECT_EQ(read.header.parameters.bundle("DICOM").text("Text"), "abc");
    EXPECT_EQ(read.slices.at(0).at(1).offset, 120);
}

TEST(VolumeHeader, ThatIsCutOrChangedIsReadAsOneThatCanBeOrNotAtAll)
{
    const QByteArray bytes = bytesOfHeader(aHeader());
    for (int length = 0; length < bytes.size(); ++length) {
        LocatedHeader read;
        EXPECT_FALSE(readHeader(bytes.left(length), read)) << length;
        for (int bit = 0; bit < 8; ++bit) {
            QByteArray damaged = bytes;
            damaged[length] = static_cast<char>(damaged.at(length) ^ (1 << bit));
            LocatedHeader other;
            EXPECT_TRUE(!readHeader(damaged, other) || bytesOfHeader(other).size() == bytes.size());
        }
    }
    LocatedHeader read;
    EXPECT_FALSE(readHeader(bytes + 'x', read));
}

TEST(VolumeHeader, ThatNoFileCanHaveIsRefused)
{
    using Change = void (*)(LocatedHeader&);
    const Change changes[] = {
        [](LocatedHeader& of) { of.header.lattices[0].dims[0] = 0; },
        [](LocatedHeader& of) { of.header.lattices[0].dims[1] = kMaxDimension + 1; },
        [](LocatedHeader& of) { of.header.lattices[0].dims[0] = of.header.lattices[0].dims[1] = 100'000; },
        [](LocatedHeader& of) { of.header.lattices[0].dims[2] = 3; },
        [](LocatedHeader& of) { of.header.lattices[0].dims.append(1); },
        [](LocatedHeader& of) { of.header.lattices[0].components = kMaxComponents + 1; },
        [](LocatedHeader& of) { of.header.lattices[0].type = static_cast<PrimitiveType>(99); },
        [](LocatedHeader& of) { of.numCounts[0] = kMaxCounts + 1; },
        [](LocatedHeader& of) { of.counts.append(ChunkPlace()); },
        [](LocatedHeader& of) { of.header.dataSections[0] = QByteArray(kMaxNameLength + 1, 'x'); },
        [](LocatedHeader& of) {
            for (int i = 0; i <= kMaxBundleDepth; ++i) {
                ParamBundle above;
                above.insertBundle("below", of.header.parameters);
                of.header.parameters = above;
            }
        },
    };
    for (const Change change : changes) {
        LocatedHeader header = aHeader();
        change(header);
        EXPECT_FALSE(isRead(header)) << &change - &changes[0];
    }
}

}  // namespace
