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
            ASSERT_TRUE(choosePixelForm(accept, {row.uid, true, true, false}, form)) << row.uid;
            EXPECT_TRUE(form.isStored && !form.isSinglePart);
            EXPECT_EQ(form.contentType(), QByteArray(row.mediaType) + "; transfer-syntax=" + row.uid);
        }
    }
    EXPECT_EQ(mediaTypeOf("1.2.3"), "application/octet-stream");
}

/// What a client takes, what is stored, and what it gets: "1" is a single part, "D" decoded; empty: nothing.
struct Row
{
    const char* accept;
    const char* stored;
    const char* given;
};

constexpr const char* kJpeg = "1.2.840.10008.1.2.4.50";
constexpr const char* kJls = "1.2.840.10008.1.2.4.80";
constexpr const char* kVideo = "1.2.840.10008.1.2.4.102";
constexpr const char* kNative = "1.2.840.10008.1.2.1";

const Row kRows[] = {
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
    {"multipart/related; type=image/jpeg", kJls, ""},
    {"multipart/related; type=image/jpeg; transfer-syntax=1.2.840.10008.1.2.4.70", kJpeg, ""},
    {"multipart/related; type=image/jp2, multipart/related; type=application/octet-stream", kJls,
     "D application/octet-stream"},
    {"multipart/related; type=image/jls;q=0.1, application/octet-stream", kJls,
     "1 D application/octet-stream"},
    {"application/octet-stream", kNative, "1 application/octet-stream"},
    {"application/octet-stream", kJpeg, "1 D application/octet-stream"},
    {"image/jpeg", kJpeg, "1 image/jpeg"},
    {"image/*", kJls, "1 image/jls"},
    {"image/jpeg", kNative, ""},
    {"application/json", kNative, ""},
    {"image/jpeg;q=0", kJpeg, ""},
};

TEST(MediaTypes, OfPixelsAreWhatTheClientLikesBest)
{
    for (const Row& row : kRows) {
        const QByteArray accept = *row.accept == '\0' ? QByteArray("*/*") : QByteArray(row.accept);
        PixelForm form;
        QByteArray given;
        if (choosePixelForm(Http::AcceptHeader(accept), {row.stored, row.stored != kVideo, true, false},
                            form))
            given = QByteArray(form.isSinglePart ? "1 " : "") + (form.isStored ? "" : "D ") + form.mediaType;
        EXPECT_EQ(given, row.given) << row.accept << " of " << row.stored;
    }
}

/// What a client takes, and of an object stored as JPEG: how it is packed and in which syntax; empty: not at all.
const Row kInstanceRows[] = {
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
    {"multipart/related; type=application/octet-stream", "", ""},
    {"image/jpeg", "", ""},
};

TEST(MediaTypes, OfInstancesAreWhatTheClientLikesBest)
{
    for (const Row& row : kInstanceRows) {
        InstanceForm form;
        QByteArray given;
        const char* const names[] = {"multipart ", "single ", "zip "};
        if (chooseInstanceForm(Http::AcceptHeader(row.accept), true, form))
            given = names[static_cast<int>(form.packing)] + form.syntaxFor(kJpeg, true);
        EXPECT_EQ(given, row.given) << row.accept;
    }
    InstanceForm form;
    EXPECT_FALSE(chooseInstanceForm(Http::AcceptHeader("application/dicom"), false, form))
        << "several in one";
    ASSERT_TRUE(chooseInstanceForm(Http::AcceptHeader("*/*"), false, form));
    EXPECT_EQ(form.syntaxFor(kVideo, false), "") << "without a decoder";
}

}  // namespace
