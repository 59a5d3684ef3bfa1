// All attributes but the pixels of all files below a folder, by DCMTK. Without a folder: what starting costs.

#include "FilesBelow.h"

#include <dcmtk/config/osconfig.h>

#include <dcmtk/dcmdata/dcfilefo.h>
#include <dcmtk/dcmdata/dctk.h>

#include <cstdio>

int main(int argc, char* argv[])
{
    if (argc < 2)
        return 0;
    unsigned long elements = 0;
    for (const std::string& path : filesBelow(argv[1])) {
        DcmFileFormat file;
        if (file.loadFileUntilTag(path.c_str(), EXS_Unknown, EGL_noChange, DCM_MaxReadLength, ERM_autoDetect,
                                  DCM_PixelData)
                .good())
            elements += file.getDataset()->card();
    }
    std::printf("%lu elements\n", elements);
    return elements == 0 ? 1 : 0;
}
