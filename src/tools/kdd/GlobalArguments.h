#pragma once

#include "tools/kdd/Commands.h"

#include <kddlib/TagFile.h>

#include <string>

namespace Kdd
{

/// The options that every command takes, and what they set for the whole process.
class GlobalArguments
{
public:
    /// `app` reads into this object, which has to be there until the command line is parsed.
    void addTo(CLI::App& app);

    /// Puts them in force: log, database, folders, how tag files are written. To be called once, after parsing.
    const GlobalOptions& apply();

private:
    QString storeFolder() const;
    void applyLogging() const;
    void applyStore();

    GlobalOptions mOptions;
    std::string mStore;
    std::string mDatabase;
    std::string mMeta;
    TagFile::CompressionMode mCompression = TagFile::CompressionMode::Zlib;
};

}  // namespace Kdd
