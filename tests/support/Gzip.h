#pragma once

#include <QByteArray>

#include <gtest/gtest.h>
#include <libdeflate.h>

namespace Kdd
{

/// What is in a file of gzip, which has to be whole.
inline QByteArray unpacked(const QByteArray& gzip)
{
    QByteArray out(100 * gzip.size() + 65536, Qt::Uninitialized);
    size_t size = 0;
    libdeflate_decompressor* decompressor = libdeflate_alloc_decompressor();
    EXPECT_EQ(libdeflate_gzip_decompress(decompressor, gzip.constData(), static_cast<size_t>(gzip.size()),
                                         out.data(), static_cast<size_t>(out.size()), &size),
              LIBDEFLATE_SUCCESS);
    libdeflate_free_decompressor(decompressor);
    out.truncate(static_cast<int>(size));
    return out;
}

}  // namespace Kdd
