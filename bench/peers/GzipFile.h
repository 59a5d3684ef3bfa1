#pragma once

#include <libdeflate.h>

#include <cstdint>
#include <cstdio>
#include <cstring>
#include <fstream>
#include <iterator>
#include <memory>
#include <string>

/// What a file holds.
inline std::string contentOf(const char* path)
{
    std::ifstream file(path, std::ios::binary);
    return {std::istreambuf_iterator<char>(file), std::istreambuf_iterator<char>()};
}

/// What a file of one gzip member holds, with room for `padding` bytes behind it; empty when it is damaged.
inline std::string inflatedOf(const char* path, std::size_t padding)
{
    const std::string packed = contentOf(path);
    std::uint32_t size = 0;
    if (packed.size() < 18)
        return {};
    std::memcpy(&size, packed.data() + packed.size() - sizeof(size), sizeof(size));
    std::string text;
    text.reserve(size + padding);
    text.resize(size);
    const std::unique_ptr<libdeflate_decompressor, void (*)(libdeflate_decompressor*)> reader(
        libdeflate_alloc_decompressor(), libdeflate_free_decompressor);
    if (libdeflate_gzip_decompress(reader.get(), packed.data(), packed.size(), text.data(), size, nullptr) !=
        LIBDEFLATE_SUCCESS)
        return {};
    return text;
}
