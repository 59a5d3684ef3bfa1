#include "tools/kdd/AttributeText.h"
#include "tools/kdd/Commands.h"
#include "tools/kdd/NodeLookup.h"
#include "tools/kdd/Report.h"

#include <QTextStream>

#include <dcmtk/dcmdata/dcdeftag.h>
#include <kddlib/TagMap.h>

#include <cstdio>

namespace Kdd
{

namespace
{

QString describe(const TagMap& node, int depth)
{
    const QString own = QStringLiteral("  (%1 own)").arg(node.tagsForLevel().size());
    switch (depth) {
    case 0:
        return QStringLiteral("study %1  %2  %3")
                   .arg(displayValue(node, DCM_StudyInstanceUID), displayValue(node, DCM_StudyDate),
                        displayValue(node, DCM_StudyDescription)) +
               own;
    case 1:
        return QStringLiteral("series %1  %2  %3  %4 images")
                   .arg(displayValue(node, DCM_SeriesInstanceUID), displayValue(node, DCM_Modality),
                        displayValue(node, DCM_SeriesDescription))
                   .arg(node.children().size()) +
               own;
    default:
        return QStringLiteral("image %1  number %2")
                   .arg(displayValue(node, DCM_SOPInstanceUID), displayValue(node, DCM_InstanceNumber)) +
               own;
    }
}

void printTree(const TagMap& node, int depth, int lowest)
{
    std::printf("%*s%s\n", depth * 2, "", qUtf8Printable(describe(node, depth)));
    if (depth == lowest)
        return;
    for (const TagMap* child : node.children())
        printTree(*child, depth + 1, lowest);
}

void printAttributes(const TagMap& node, bool own)
{
    QString text;
    QTextStream stream(&text);
    if (own)
        node.listContent(stream, 0);
    else
        node.dump(stream, 0);
    stream.flush();
    // The listing carries the bytes of the file's own character set; what a terminal must not get is taken out.
    for (const QByteArray& line : text.toLatin1().split('\n')) {
        if (!line.isEmpty())
            std::printf("%s\n", qUtf8Printable(displayText(node, line)));
    }
}

}  // namespace

Outcome runShow(const GlobalOptions& options, const ShowOptions& show)
{
    TagFile file;
    const TagMap* node = findNode(show.node, file);
    if (node == nullptr)
        return Outcome::Failed;
    if (show.tree)
        printTree(*node, depthOf(*node), options.verbose || depthOf(*node) > 0 ? 2 : 1);
    else
        printAttributes(*node, show.own);
    return Outcome::Done;
}

}  // namespace Kdd
