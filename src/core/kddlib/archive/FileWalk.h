#pragma once

#include "platform/base/Export.h"

#include <QByteArray>
#include <QList>
#include <QStringList>

namespace Kdd
{

// Finding files. Paths are bytes: a name that is no text in the present locale is a file like any other.

/// The files at and below the paths, absolute and sorted within each folder. Paths that do not exist and folders that
/// cannot be entered are put into `faults` with the reason. Folders of links are not entered, since they may lead back
/// up.
KDD_EXPORT QList<QByteArray> filesBelow(const QList<QByteArray>& paths, QStringList& faults);

/// The tag files below the meta folder, sorted and in the form in which a study's own is named. Folders that cannot be
/// entered are told in the log; a meta folder that is not there has none.
KDD_EXPORT QStringList tagFilesOfArchive();

/// The path as `filesBelow` gives it; the URL of an object as it is.
KDD_EXPORT QByteArray absolutePath(const QByteArray& path);

}  // namespace Kdd
