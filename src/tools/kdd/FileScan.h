#pragma once

#include "platform/database/Catalogue.h"
#include "tools/kdd/Commands.h"
#include "tools/kdd/DicomInput.h"

#include <functional>

namespace Kdd
{

/// Looks through files and folders for what the database does not know yet, or knows otherwise: files whose path, size
/// and time of change are known are not opened.
class FileScan
{
public:
    FileScan(Kxg::Catalogue& database, const GlobalOptions& options, Damage damage)
        : mDatabase(database)
        , mOptions(options)
        , mDamage(damage)
    {
    }

    /// Reads the files at and below the paths, several at a time, and hands on what each one is in their order until
    /// `take` returns false. Files that cannot be read are logged and counted as failed instead; those of which
    /// something is left out are warned about. False when the
    /// database failed or `take` ended it.
    bool run(const QList<QByteArray>& paths, const std::function<bool(DicomInput)>& take);

    int unchanged() const { return mUnchanged; }
    int skipped() const { return mSkipped; }
    int failed() const { return mFailed; }

private:
    bool findChanged(const QList<QByteArray>& paths, QList<QByteArray>& changed);
    bool handOn(DicomInput input, const std::function<bool(DicomInput)>& take);

    Kxg::Catalogue& mDatabase;
    const GlobalOptions& mOptions;
    Damage mDamage;
    int mUnchanged = 0;
    int mSkipped = 0;
    int mFailed = 0;
};

}  // namespace Kdd
