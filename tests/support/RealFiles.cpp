#include "support/RealFiles.h"

#include <QDirIterator>

namespace Kdd
{

QString realFilesFolder()
{
    return QString::fromLocal8Bit(qgetenv("KDD_TEST_DATA"));
}

QStringList realFiles(const char* folder)
{
    QStringList files;
    QDirIterator it(realFilesFolder() + QLatin1Char('/') + QLatin1String(folder), QDir::Files,
                    QDirIterator::Subdirectories);
    while (it.hasNext())
        files.append(it.next());
    files.sort();
    return files;
}

}  // namespace Kdd
