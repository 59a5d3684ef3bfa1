#pragma once

#include <algorithm>
#include <filesystem>
#include <string>
#include <vector>

/// The regular files below a folder, in order.
inline std::vector<std::string> filesBelow(const char* folder)
{
    std::vector<std::string> files;
    for (const auto& entry : std::filesystem::recursive_directory_iterator(folder)) {
        if (entry.is_regular_file())
            files.push_back(entry.path().string());
    }
    std::sort(files.begin(), files.end());
    return files;
}
