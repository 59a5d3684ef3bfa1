#include "server/dicomweb/MediaTypes.h"

#include <gtest/gtest.h>

using namespace Kdd;
using namespace Kdd::DicomWeb;

namespace
{

TEST(MediaTypes, AreToldOfEverySyntaxByItsOwnName)
{
    for (const SyntaxMedia& row : syntaxMedia()) {
        const Http::AcceptHeader byName(QByteArray("multipart/related; type=\"") + row.mediaType +
                                        "\"; transfer-syntax=" + row.uid);
        const Http::AcceptHeader byAny(
            "multipart/related; type=\"application/octet-stream\"; transfer-syntax=\"*\"");
        for (const Http::AcceptHeader& accept : {byName, byAny}) {
            PixelForm form;
            ASSERT_TRUE(choosePixelForm(accept, {row.uid, true, true, false, {}}, form)) << row.uid;
            EXPECT_TRUE(form.isStored && !form.isSinglePart);
            EXPECT_EQ(form.contentType(), QByteArray(row.mediaType) + "; transfer-syntax=" + row.uid);
        }
    }
    EXPECT_EQ(mediaTypeOf("1.2.3"), "application/octet-stream");
}

/// What a client takes, what is stored, and what it gets: "1" is a single part, "D" decoded; empty: nothing.
constexpr const char* kJpeg = "1.2.840.10008.1.2.4.50";
constexpr const char* kJls = "1.2.840.10008.1.2.4.80";
constexpr const char* kVideo = "1.2.840.10008.1.2.4.102";
constexpr const char* kNative = "1.2.840.10008.1.2.1";

const std::tuple<const char*, const char*, const char*> kRows[] = {
    {"", kJpeg, "image/jpeg"},
    {"*/*", kJpeg, "image/jpeg"},
    {"*/*", kNative, "application/octet-stream"},
    {"*/*", kVideo, "video/mp4"},
    {"multipart/related", kJpeg, "D application/octet-stream"},
    {"multipart/related; type=application/octet-stream", kJpeg, "D application/octet-stream"},
    {"multipart/related; type=\"application/octet-stream\"", kNative, "application/octet-stream"},
    {"multipart/related; type=application/octet-stream; transfer-syntax=1.2.840.10008.1.2.1", kJls,
     "D application/octet-stream"},
    {"multipart/related; type=application/octet-stream; transfer-syntax=*", kJls, "image/jls"},
    {"multipart/related; type=application/octet-stream; transfer-syntax=1.2.840.10008.1.2.4.80", kJls,
     "image/jls"},
    {"multipart/related; type=application/octet-stream; transfer-syntax=1.2.840.10008.1.2.4.90", kJls, ""},
    {"multipart/related; type=application/octet-stream", kVideo, ""},
    {"multipart/related; type=video/mp4", kVideo, "video/mp4"},
    {"multipart/related; type=video/*", kVideo, "video/mp4"},
    {"multipart/related; type=image/jpeg", kJpeg, "image/jpeg"},
    {"multipart/related; type=image/jp2, multipart/related; type=application/octet-stream", kJls,
     "D application/octet-stream"},
    {"multipart/related; type=image/jls;q=0.1, application/octet-stream", kJls,
     "1 D application/octet-stream"},
    {"application/octet-stream", kNative, "1 application/octet-stream"},
    {"application/octet-stream", kJpeg, "1 D application/octet-stream"},
    {"image/jpeg", kJpeg, "1 image/jpeg"},
    {"image/*", kJls, "1 image/jls"},
    {"application/json", kNative, ""},
    {"image/jpeg;q=0", kJpeg, ""},
    {"multipart/*", kJpeg, "D application/octet-stream"},
    // Another compression for those who name it.
    {"image/jpeg", kNative, "1 E image/jpeg; transfer-syntax=1.2.840.10008.1.2.4.70"},
    {"image/jls", kNative, "1 E image/jls; transfer-syntax=1.2.840.10008.1.2.4.80"},
    {"image/dicom-rle", kJpeg, "1 E image/dicom-rle; transfer-syntax=1.2.840.10008.1.2.5"},
    {"multipart/related; type=image/jpeg", kJls, "E image/jpeg; transfer-syntax=1.2.840.10008.1.2.4.70"},
    {"multipart/related; type=\"image/jpeg\"; transfer-syntax=1.2.840.10008.1.2.4.70", kJpeg,
     "E image/jpeg; transfer-syntax=1.2.840.10008.1.2.4.70"},
    {"multipart/related; type=application/octet-stream; transfer-syntax=1.2.840.10008.1.2.4.80", kNative,
     "E image/jls; transfer-syntax=1.2.840.10008.1.2.4.80"},
    {"image/jpeg; transfer-syntax=1.2.840.10008.1.2.4.50", kNative, ""},
    {"image/jpeg; transfer-syntax=1.2.840.10008.1.2.4.80", kNative, ""},
    {"image/jp2", kNative, ""},
    {"image/*", kNative, ""},
    {"image/jpeg", kVideo, ""},
    // The cheapest of what is liked alike, as stored before all others; but what is liked better before that.
    {"multipart/related; type=application/octet-stream, multipart/related; type=image/jls", kJls,
     "image/jls"},
    {"image/jls, image/dicom-rle, application/octet-stream", kJpeg, "1 D application/octet-stream"},
    {"image/jls, image/dicom-rle", kJpeg, "1 E image/dicom-rle; transfer-syntax=1.2.840.10008.1.2.5"},
    {"application/octet-stream;q=0.5, image/jls;q=0.9, image/*;q=0.1", kJpeg,
     "1 E image/jls; transfer-syntax=1.2.840.10008.1.2.4.80"},
    // What is named more closely counts.
    {"*/*, image/jls;q=0, multipart/related; type=image/jls;q=0", kJls, "D application/octet-stream"},
    {"image/*;q=0, */*;q=0.1, multipart/related; type=image/*;q=0", kJpeg, "D application/octet-stream"},
};

/// All that are written here, beside the stored one.
QVector<QByteArray> encodingsOf(const QByteArray& stored)
{
    QVector<QByteArray> uids = {"1.2.840.10008.1.2.5", "1.2.840.10008.1.2.4.70", kJls};
    uids.removeOne(stored);
    return stored == kVideo ? QVector<QByteArray>() : uids;
}

TEST(MediaTypes, OfPixelsAreWhatTheClientLikesBest)
{
    for (const auto& [header, stored, expected] : kRows) {
        const QByteArray accept = *header == '\0' ? QByteArray("*/*") : QByteArray(header);
        PixelForm form;
        QByteArray given;
        const PixelOffer offer{stored, stored != kVideo, true, false, encodingsOf(stored)};
        if (choosePixelForm(Http::AcceptHeader(accept), offer, form)) {
            const bool isEncoded = !form.isStored && form.transferSyntax != kExplicitLittleEndian;
            const char* const kind = form.isStored ? "" : isEncoded ? "E " : "D ";
            given = QByteArray(form.isSinglePart ? "1 " : "") + kind +
                    (isEncoded ? form.contentType() : form.mediaType);
        }
        EXPECT_EQ(given, expected) << header << " of " << stored;
    }
}

TEST(MediaTypes, OfEverySyntaxHaveOneUsualOne)
{
    QVector<QByteArray> usual;
    for (const SyntaxMedia& row : syntaxMedia()) {
        if (row.isUsual)
            usual.append(row.mediaType);
    }
    EXPECT_EQ(usual, QVector<QByteArray>({"image/jpeg", "image/jls", "image/dicom-rle"}));
}

/// What a client takes, and of an object stored as JPEG: how it is packed and in which syntax; empty: not at all.
const std::tuple<const char*, const char*, const char*> kInstanceRows[] = {
    {"*/*", "", "multipart 1.2.840.10008.1.2.1"},
    {"multipart/related", "", "multipart 1.2.840.10008.1.2.1"},
    {"multipart/related; type=\"application/dicom\"", "", "multipart 1.2.840.10008.1.2.1"},
    {"multipart/related; type=application/dicom; transfer-syntax=*", "", "multipart 1.2.840.10008.1.2.4.50"},
    {"application/dicom; transfer-syntax=1.2.840.10008.1.2.4.50", "", "single 1.2.840.10008.1.2.4.50"},
    {"application/dicom; transfer-syntax=1.2.840.10008.1.2", "", "single 1.2.840.10008.1.2"},
    {"application/dicom; transfer-syntax=1.2.840.10008.1.2.4.91, application/dicom;q=0.5", "",
     "single 1.2.840.10008.1.2.1"},
    {"application/dicom; transfer-syntax=1.2.840.10008.1.2.4.91", "", "single "},
    {"application/zip; transfer-syntax=*", "", "zip 1.2.840.10008.1.2.4.50"},
    {"application/dicom; transfer-syntax=1.2.840.10008.1.2.4.80", "", "single 1.2.840.10008.1.2.4.80"},
    {"application/dicom; transfer-syntax=1.2.840.10008.1.2.1.99", "", "single 1.2.840.10008.1.2.1.99"},
    {"application/dicom; transfer-syntax=1.2.840.10008.1.2.4.80, application/dicom", "",
     "single 1.2.840.10008.1.2.1"},
    {"application/dicom, application/dicom; transfer-syntax=*", "", "single 1.2.840.10008.1.2.4.50"},
    {"application/dicom;q=0.4, application/dicom; transfer-syntax=1.2.840.10008.1.2.4.80;q=0.5", "",
     "single 1.2.840.10008.1.2.4.80"},
    {"application/dicom; transfer-syntax=*, application/dicom; transfer-syntax=1.2.840.10008.1.2.4.50;q=0",
     "", "single "},
    {"multipart/related; type=application/octet-stream", "", ""},
    {"image/jpeg", "", ""},
};

const QVector<QByteArray> kGivable = {
    kNative, "1.2.840.10008.1.2", "1.2.840.10008.1.2.1.99", "1.2.840.10008.1.2.5", "1.2.840.10008.1.2.4.70",
    kJls};

TEST(MediaTypes, OfInstancesAreWhatTheClientLikesBest)
{
    for (const auto& [header, stored, expected] : kInstanceRows) {
        InstanceForm form;
        QByteArray given;
        const char* const names[] = {"multipart ", "single ", "zip "};
        if (chooseInstanceForm(Http::AcceptHeader(header), true, form))
            given = names[static_cast<int>(form.packing)] + form.syntaxFor(kJpeg, kGivable);
        EXPECT_EQ(given, expected) << header;
    }
    InstanceForm form;
    EXPECT_FALSE(chooseInstanceForm(Http::AcceptHeader("application/dicom"), false, form))
        << "several in one";
    ASSERT_TRUE(chooseInstanceForm(Http::AcceptHeader("*/*"), false, form));
    EXPECT_EQ(form.syntaxFor(kVideo, {}), "") << "without a decoder";
}

}  // namespace
