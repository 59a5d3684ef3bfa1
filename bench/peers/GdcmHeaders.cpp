// All attributes but the pixels of all files below a folder, by GDCM.

#include "FilesBelow.h"

#include <gdcmReader.h>

#include <cstdio>
#include <set>

int main(int argc, char* argv[])
{
    if (argc < 2)
        return 0;
    std::size_t elements = 0;
    for (const std::string& path : filesBelow(argv[1])) {
        gdcm::Reader reader;
        reader.SetFileName(path.c_str());
        if (reader.ReadUpToTag(gdcm::Tag(0x7fe0, 0x0010), std::set<gdcm::Tag>()))
            elements += reader.GetFile().GetDataSet().Size();
    }
    std::printf("%zu elements\n", elements);
    return elements == 0 ? 1 : 0;
}
