#include "tools/kdd/SampleVolumes.h"

#include <QDir>
#include <QFileInfo>

#include <kddlib/OwnAttributes.h>
#include <kddlib/StackPlanner.h>
#include <kddlib/StackWriter.h>
#include <kddlib/TagElement.h>
#include <kddlib/TagFile.h>
#include <kddlib/TagMap.h>

namespace Kdd
{

namespace
{

void addImages(const QDir& seriesFolder, TagFile& file)
{
    for (const QString& name : seriesFolder.entryList({QStringLiteral("*.dcm")}, QDir::Files, QDir::Name)) {
        const QByteArray path = seriesFolder.filePath(name).toLocal8Bit();
        // filePathOf finds it there when the stack is written.
        if (TagMap* image = file.addDicomFile(path.constData(), path.constData(), false))
            image->putAndInsertValue(kFilePath, VrCode::LO, path);
    }
}

Result stackFolder(const QDir& seriesFolder, int& volumes, qint64& bytes)
{
    TagFile file;
    addImages(seriesFolder, file);
    for (auto it = file.seriesByUID().cbegin(); it != file.seriesByUID().cend(); ++it) {
        // A series of several stacks gives as many volumes, and one of none gives none.
        const StackPlan plan = planStacks(*it.value());
        for (int i = 0; i < plan.stacks.size(); ++i) {
            const QString path = seriesFolder.filePath(QString::fromLatin1(volumeFileName(it.key(), i)));
            Result result = writeStack(plan.stacks.at(i), filePathOf, path.toLocal8Bit());
            if (result.bad())
                return result;
            ++volumes;
            bytes += QFileInfo(path).size();
        }
    }
    return {};
}

}  // namespace

Result writeSampleVolumes(const QString& folder, int& volumes, qint64& bytes)
{
    const QDir root(folder);
    for (const QString& study : root.entryList({QStringLiteral("CT-*")}, QDir::Dirs, QDir::Name)) {
        const QDir studyFolder(root.filePath(study));
        for (const QString& series : studyFolder.entryList(QDir::Dirs | QDir::NoDotAndDotDot, QDir::Name)) {
            Result result = stackFolder(QDir(studyFolder.filePath(series)), volumes, bytes);
            if (result.bad())
                return result;
        }
    }
    return {};
}

}  // namespace Kdd
