#pragma once

#include "platform/base/Export.h"

// NOLINTBEGIN(modernize-deprecated-headers): C programs include this, too.
#include <stdbool.h>
#include <stdint.h>
// NOLINTEND(modernize-deprecated-headers)

#ifdef __cplusplus
extern "C" {
#endif

// NOLINTBEGIN(readability-identifier-naming): these names are the interface.

/// Objects behind URLs for programs that cannot use the library's classes: as streams of bytes, or as DICOM files
/// block by block; and where the video in a DICOM file lies.
///
/// URLs are "http://...", "https://..." or "gs://bucket/object" for the cloud storage. Texts end with a zero byte and
/// stay the caller's. A pointer that must not be null but is, or a negative number, makes a call do nothing but log
/// and report failure. No C++ exception leaves a function; it is a failure, too. The reason of every failure is a
/// line in the log.
///
/// Every function may be called on any thread; a stream or a user info is used by one thread at a time.

/// What functions with an `int` for a result give.
enum {
    KDD_STREAM_OPENED = 0,
    KDD_STREAM_FAILED = -1,
    KDD_READ = 1,            ///< done
    KDD_READ_PARTLY = 2,     ///< only from `GetVideoMetaInfo`
    KDD_NOT_READ = 4011,     ///< failed
    KDD_BLOCK_SIZE = 16384,  ///< of `ReadDicomFromUrl` [bytes]
    KDD_UID_SIZE = 65        ///< of a buffer for a UID and its zero byte [bytes]
};

/// Opens an object and waits for the first of it. `*stream` is the handle, which `CloseStream` takes back. On
/// failure, KDD_STREAM_FAILED, it is left as it was; a server's answer with an error code is a failure.
KDD_EXPORT int OpenStream(const char* url, void** stream);

/// The same for a part of the object: `range` is "first-last", "first-" or "-count", 0-based and inclusive [bytes]. A
/// server that sends something else is a failure.
KDD_EXPORT int OpenStreamRange(const char* url, const char* range, void** stream);

/// Waits for the next `count` bytes and puts them at `buffer` + `offset`; how many came. Fewer than `count` means
/// that no more will come: the object is at its end, or the transfer broke off, which only a comparison of all bytes
/// with `StreamContentLength` tells.
KDD_EXPORT int32_t ReadBytes(void* stream, void* buffer, int32_t offset, int32_t count);

/// The length of the whole object [bytes], also when a range of it is read; 0 when the server does not tell.
KDD_EXPORT uint64_t StreamContentLength(void* stream);

/// Ends the transfer and frees the stream; null is ignored.
KDD_EXPORT void CloseStream(void* stream);

/// What `ReadDicomFromUrl` works with, to be taken back by `DeleteUserInfo`. Null when memory is short.
KDD_EXPORT void*
CreateUserInfo(void);  // NOLINT(modernize-redundant-void-arg): in C it says that there is none

/// Ends a transfer and frees the user info; null is ignored.
KDD_EXPORT void DeleteUserInfo(void* userInfo);

/// Reads an object block by block. The first call has `isFirst` not 0 and opens `url`, which later calls do not look
/// at. Each call gives the next `*length` bytes, up to KDD_BLOCK_SIZE, at `*data`, which belong to the user info and
/// are valid until its next use. `*isLast` is 1 with the last block, which may be empty, and 0 before.
///
/// KDD_READ, or KDD_NOT_READ with length 0, data null and not last: the object cannot be had, or not all of it. Then
/// nothing more comes; the user info may be used for another object.
KDD_EXPORT int ReadDicomFromUrl(const char* url, void* userInfo, uint32_t* length, const char** data,
                                int32_t isFirst, uint32_t* isLast);

/// Deletes an object of the cloud storage: whether the storage says so. Any other URL is left alone, and the answer
/// is true.
KDD_EXPORT bool DeleteObject(const char* url);

/// Whether a text begins as a URL does, with "http" or "gs". False for null.
KDD_EXPORT bool StringIsUrl(const char* text);

/// Tells where in a local DICOM file its video lies (MPEG-2, MPEG-4 AVC or HEVC), so that a player can read it in
/// place.
///
/// `sopInstanceUID` has room for KDD_UID_SIZE bytes; empty when the file has none. `cineRate` is Cine Rate [frames
/// per second], 0 without. `transferSyntax` is the number N of the transfer syntax 1.2.840.10008.1.2.4.N: 100 and 101
/// MPEG-2, 102 to 106 MPEG-4 AVC, 107 and 108 HEVC. `offset` and `length` [bytes] are those of the first fragment of
/// the pixel data.
///
/// KDD_READ: that fragment is the whole video, with at most one byte of padding. KDD_READ_PARTLY: it is the first of
/// several. Each next one begins right behind the one before it with the bytes fe ff 00 e0 and its own length, 32
/// bits, little-endian; fe ff dd e0 stands behind the last. KDD_NOT_READ, with an empty text and zeros: the file
/// cannot be read, or has no video.
KDD_EXPORT int GetVideoMetaInfo(const char* path, char* sopInstanceUID, int32_t* cineRate,
                                int32_t* transferSyntax, uint64_t* offset, uint64_t* length);

// NOLINTEND(readability-identifier-naming)

#ifdef __cplusplus
}
#endif
