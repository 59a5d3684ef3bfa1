#include "server/Handled.h"
#include "server/http/MultipartWriter.h"
#include "server/http/RangeHeader.h"
#include "server/http/ZipStream.h"
#include "support/FileContent.h"

#include <QProcess>

using namespace Kdd;
using namespace Kdd::Http;

namespace
{

/// What stands in Range, and what is meant of ten bytes: "offset+length", "all" or "none".
const std::pair<const char*, const char*> kRanges[] = {
    {"", "all"},
    {"bytes=0-3", "0+4"},
    {"bytes=4-", "4+6"},
    {"bytes=8-99999999999999999999999", "8+2"},
    {"bytes=-3", "7+3"},
    {"bytes=-30", "0+10"},
    {"bytes=-0", "none"},
    {"bytes=10-", "none"},
    {"bytes=99999999999999999999999-", "none"},
    {"bytes=3-2", "all"},
    {"bytes=0-1,3-4", "all"},
    {"bytes=a-b", "all"},
    {"bytes=-", "all"},
    {"bytes=", "all"},
    {"bytes=--1", "all"},
    {"items=0-1", "all"},
};

QByteArray textOf(const WantedBytes& wanted)
{
    if (wanted.kind == WantedBytes::Kind::Part)
        return QByteArray::number(wanted.offset) + '+' + QByteArray::number(wanted.length);
    return wanted.kind == WantedBytes::Kind::All ? "all" : "none";
}

TEST(RangeHeader, IsHeldAgainstTheLengthOfTheBody)
{
    for (const auto& [range, wanted] : kRanges) {
        EXPECT_EQ(textOf(wantedBytes(requestFor("", {{"range", range}}), 10, "\"a\"")), wanted) << range;
    }
}

TEST(RangeHeader, CountsOnlyForTheStateThatIfRangeNames)
{
    const Request request = requestFor("", {{"range", "bytes=0-3"}, {"if-range", "\"a\""}});
    EXPECT_EQ(textOf(wantedBytes(request, 10, "\"a\"")), "0+4");
    EXPECT_EQ(textOf(wantedBytes(request, 10, "\"b\"")), "all");
    EXPECT_EQ(textOf(wantedBytes(request, 10, "")), "all");
}

TEST(MultipartWriter, FramesPartsByABoundaryThatNobodyGuesses)
{
    MultipartWriter packing("image/jpeg");
    const QByteArray boundary = packing.mediaType().mid(packing.mediaType().indexOf("boundary=") + 9);
    EXPECT_EQ(packing.mediaType(), "multipart/related; type=\"image/jpeg\"; boundary=" + boundary);
    EXPECT_EQ(packing.begin({}, "a/b") + "body" + packing.end() + packing.finish(),
              "--" + boundary + "\r\nContent-Type: a/b\r\n\r\nbody\r\n--" + boundary + "--\r\n");
    EXPECT_EQ(boundary.size(), 40);
    EXPECT_FALSE(MultipartWriter("image/jpeg").mediaType().contains(boundary));
}

TEST(ZipStream, IsUnpackedByOthers)
{
    const QTemporaryDir folder;
    ZipStream zip;
    QByteArray bytes;
    for (const char* name : {"1.2/a.dcm", "1.2/b.dcm", "1.2/empty.dcm"}) {
        const QByteArray content(QByteArray(name).contains("empty") ? 0 : 100000, name[4]);
        bytes += zip.begin(name, {});
        zip.pass(content);
        bytes += content + zip.end();
    }
    bytes += zip.finish();
    const QString file = folder.filePath(QStringLiteral("a.zip"));
    putFile(file, bytes);
    QProcess python;
    python.start(QStringLiteral("python3"),
                 {QStringLiteral("-c"),
                  QStringLiteral("import sys,zipfile; z=zipfile.ZipFile(sys.argv[1]); print(z.testzip(), "
                                 "[(i.filename,i.file_size) for i in z.infolist()])"),
                  file});
    ASSERT_TRUE(python.waitForFinished());
    EXPECT_EQ(python.readAllStandardOutput().trimmed(),
              "None [('1.2/a.dcm', 100000), ('1.2/b.dcm', 100000), ('1.2/empty.dcm', 0)]");
}

}  // namespace
