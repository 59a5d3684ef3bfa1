#include "kddlib/tagfile/SeriesLabels.h"

#include "kddlib/tagfile/StudyTree.h"
#include "kddlib/tagmodel/OwnAttributes.h"
#include "kddlib/tagmodel/TagMap.h"

#include <QHash>
#include <QMap>
#include <QSet>

#include <dcmtk/dcmdata/dcdeftag.h>

#include <algorithm>

namespace Kdd
{

namespace
{

bool showsPixels(const TagMap* image)
{
    return image->findElement(DCM_PixelData) != nullptr ||
           image->findElement(DCM_FloatPixelData) != nullptr ||
           image->findElement(DCM_DoubleFloatPixelData) != nullptr;
}

/// A series as the user knows it: its number and what it shows.
QByteArray labelOf(const TagMap& series)
{
    const bool hasPixels = std::any_of(series.children().begin(), series.children().end(), showsPixels);
    int number = 0;
    QByteArray label;
    if (series.findAndGetInt(DCM_SeriesNumber, number))
        label = QByteArray::number(number);
    for (const DcmTagKey& key :
         {DCM_SeriesDescription, DCM_ProtocolName, DCM_BodyPartExamined, DCM_Modality}) {
        QByteArray text;
        // Of a report or a plan the kind says more than what was written into its description.
        if ((hasPixels || key == DCM_Modality) && series.findAndGetString(key, text) &&
            !text.trimmed().isEmpty())
            return (label + ' ' + text.trimmed()).trimmed();
    }
    return label.isEmpty() ? QByteArrayLiteral("Series") : label;
}

}  // namespace

bool hasLabels(const StudyTree& tree)
{
    return std::any_of(tree.series().cbegin(), tree.series().cend(),
                       [](const TagMap* series) { return series->findElement(kAbstract) != nullptr; });
}

/// Series of the same label are told apart by their place among those, in the order of their UIDs.
void createLabels(StudyTree& tree)
{
    const StudyTree::Nodes& all = tree.series();
    QMap<QByteArray, QByteArray> labels;
    QHash<QByteArray, int> sharing;
    for (auto it = all.cbegin(); it != all.cend(); ++it) {
        labels.insert(it.key(), labelOf(*it.value()));
        ++sharing[labels.value(it.key())];
    }
    QSet<QByteArray> taken;
    for (auto it = sharing.cbegin(); it != sharing.cend(); ++it)
        // Labels of a single series count as well: "2 Head (2)" may be what a series is called already.
        taken.insert(it.key());
    QHash<QByteArray, int> counts;
    for (auto it = all.cbegin(); it != all.cend(); ++it) {
        QByteArray label = labels.value(it.key());
        if (sharing.value(label) > 1) {
            const QByteArray shared = label;
            do
                label = shared + " (" + QByteArray::number(++counts[shared]) + ')';
            while (taken.contains(label));
            taken.insert(label);
        }
        it.value()->putAndInsertValue(kAbstract, VrCode::LO, label);
    }
}

}  // namespace Kdd
