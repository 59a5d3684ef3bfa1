#include "kddlib/previews/QuadrantNavigation.h"

#include "kddlib/previews/BreastRegion.h"
#include "kddlib/tagmodel/OwnAttributes.h"
#include "kddlib/tagmodel/TagElement.h"
#include "kddlib/tagmodel/TagMap.h"
#include "platform/volumefile/ParamBundle.h"

#include <QImage>

#include <dcmtk/dcmdata/dcdeftag.h>
#include <dcmtk/dcmdata/dcuid.h>

#include <algorithm>

namespace Kdd
{

namespace
{

using Laterality = QuadrantNavigation::Laterality;
using Orientation = QuadrantNavigation::Orientation;
using Side = QuadrantNavigation::Side;
using View = QuadrantNavigation::View;

const DcmTagKey kQuadrantData(0x0071, 0x0070);

/// What an image or a volume file says, each empty when it says nothing.
struct Attributes
{
    QByteArray laterality;
    QByteArray viewPosition;
    QByteArray viewCode;
    QByteArray patientOrientation;
};

struct ViewName
{
    const char* name;
    View view;
};

/// View Position and the codes of View Code Sequence, of the present and the earlier coding scheme. Other oblique and
/// exaggerated views show the same halves as the ordinary ones.
const ViewName kViewNames[] = {
    {"CC", View::CranioCaudal},      {"R-10242", View::CranioCaudal}, {"399162004", View::CranioCaudal},
    {"FB", View::CranioCaudal},      {"R-10244", View::CranioCaudal}, {"399196006", View::CranioCaudal},
    {"XCCL", View::CranioCaudal},    {"R-1024A", View::CranioCaudal}, {"399192008", View::CranioCaudal},
    {"XCCM", View::CranioCaudal},    {"R-1024B", View::CranioCaudal}, {"399101009", View::CranioCaudal},
    {"XCC", View::CranioCaudal},     {"R-102CF", View::CranioCaudal}, {"Y-X1770", View::CranioCaudal},
    {"Y-X1771", View::CranioCaudal}, {"MLO", View::Oblique},          {"R-10226", View::Oblique},
    {"399368009", View::Oblique},    {"LMO", View::Oblique},          {"R-10230", View::Oblique},
    {"399099002", View::Oblique},    {"SIO", View::Oblique},          {"R-102D0", View::Oblique},
    {"399188001", View::Oblique},    {"ISO", View::Oblique},          {"R-40AAA", View::Oblique},
    {"441555000", View::Oblique},    {"ML", View::Lateral},           {"R-10224", View::Lateral},
    {"399260004", View::Lateral},    {"LM", View::Lateral},           {"R-10228", View::Lateral},
    {"399352003", View::Lateral},
};

View viewNamed(const QByteArray& name)
{
    const auto at = std::find_if(std::begin(kViewNames), std::end(kViewNames),
                                 [&](const ViewName& known) { return name == known.name; });
    return at != std::end(kViewNames) ? at->view : View::Unknown;
}

Laterality lateralityNamed(const QByteArray& name)
{
    if (name == "L")
        return Laterality::Left;
    return name == "R" ? Laterality::Right : Laterality::Unknown;
}

/// Patient Orientation names the directions in which rows run to the right and columns run down, the main one first.
/// The side of the picture that lies towards `direction`, whose opposite is `opposite`.
Side sideTowards(const QByteArray& patientOrientation, char direction, char opposite)
{
    Side end = Side::Right;
    Side start = Side::Left;
    for (const char letter : patientOrientation) {
        if (letter == direction)
            return end;
        if (letter == opposite)
            return start;
        if (letter == '\\') {
            end = Side::Bottom;
            start = Side::Top;
        }
    }
    return Side::Unknown;
}

/// Pictures from the side have the head's. Seen from above there is none, and the outer half takes its place,
/// which for the left breast lies to the left of the patient.
Side upperSide(const Orientation& orientation, const QByteArray& patientOrientation)
{
    switch (orientation.view) {
    case View::Oblique:
    case View::Lateral:
        return sideTowards(patientOrientation, 'H', 'F');
    case View::CranioCaudal:
        if (orientation.laterality == Laterality::Left)
            return sideTowards(patientOrientation, 'L', 'R');
        if (orientation.laterality == Laterality::Right)
            return sideTowards(patientOrientation, 'R', 'L');
        break;
    case View::Unknown:
        break;
    }
    return Side::Unknown;
}

Orientation orientationOf(const Attributes& attributes)
{
    Orientation orientation;
    orientation.laterality = lateralityNamed(attributes.laterality);
    orientation.view = viewNamed(attributes.viewPosition);
    if (orientation.view == View::Unknown)
        orientation.view = viewNamed(attributes.viewCode);
    orientation.chestWall = sideTowards(attributes.patientOrientation, 'P', 'A');
    orientation.upper = upperSide(orientation, attributes.patientOrientation);
    return orientation;
}

QByteArray textOf(const TagElement* element)
{
    QByteArray text;
    if (element != nullptr)
        element->getValueAsString(text);
    return text.trimmed();
}

/// The text without the VR that stands before it.
QByteArray textOf(const ParamBundle& dicom, const char* name)
{
    const QByteArray value = dicom.text(name);
    return value.mid(value.indexOf(':') + 1).trimmed();
}

QByteArray firstOf(const QByteArray& first, const QByteArray& second)
{
    return first.isEmpty() ? second : first;
}

/// Image Laterality is the image's own, Laterality that of the series. A tomosynthesis may have neither:
/// its frames share what their anatomy says.
QByteArray lateralityOf(const TagMap& image)
{
    QByteArray laterality =
        firstOf(textOf(image.findElement(DCM_ImageLaterality)), textOf(image.findElement(DCM_Laterality)));
    if (!laterality.isEmpty())
        return laterality;
    const QString anatomy = QStringLiteral("SharedFunctionalGroupsSequence[0].FrameAnatomySequence[0]");
    return textOf(image.findElement(anatomy, DCM_FrameLaterality));
}

bool isMammogram(const TagMap& image)
{
    const QByteArray sopClass = textOf(image.findElement(DCM_SOPClassUID));
    return textOf(image.findElement(DCM_Modality)) == "MG" ||
           sopClass == UID_DigitalMammographyXRayImageStorageForPresentation ||
           sopClass == UID_DigitalMammographyXRayImageStorageForProcessing ||
           sopClass == UID_BreastTomosynthesisImageStorage;
}

/// The side that the breast touches along the greatest length; if none, the one at which this breast is usually shown.
Side chestWallOf(const BreastRegion& breast, Laterality laterality)
{
    const int contacts[] = {breast.column(0).count, breast.column(breast.frame().width() - 1).count,
                            breast.row(0).count, breast.row(breast.frame().height() - 1).count};
    const auto* const longest = std::max_element(std::begin(contacts), std::end(contacts));
    if (*longest > 0)
        // The contacts stand in the order of the sides, which begin after Unknown.
        return static_cast<Side>(longest - contacts + 1);
    if (laterality == Laterality::Unknown)
        return Side::Unknown;
    return laterality == Laterality::Left ? Side::Left : Side::Right;
}

/// The mean position of all pixels of the breast, row by row.
QPointF centreOf(const BreastRegion& breast)
{
    double count = 0;
    double sumX = 0;
    double sumY = 0;
    for (int y = breast.box().top(); y <= breast.box().bottom(); ++y) {
        const BreastRegion::Line row = breast.row(y);
        count += row.count;
        sumX += row.mean * row.count;
        sumY += double(y) * row.count;
    }
    return {sumX / count, sumY / count};
}

/// The middle of the row or column of the breast that lies farthest from the chest wall.
QPointF tipOf(const BreastRegion& breast, Side chestWall)
{
    const QRect& box = breast.box();
    switch (chestWall) {
    case Side::Left:
        return {qreal(box.right()), breast.column(box.right()).mean};
    case Side::Right:
        return {qreal(box.left()), breast.column(box.left()).mean};
    case Side::Top:
        return {breast.row(box.bottom()).mean, qreal(box.bottom())};
    case Side::Bottom:
        return {breast.row(box.top()).mean, qreal(box.top())};
    case Side::Unknown:
        break;
    }
    return centreOf(breast);
}

QImage reducedToGrey(const QImage& preview)
{
    const int size = BreastRegion::kMaxSize;
    const bool fits = preview.width() <= size && preview.height() <= size;
    return (fits ? preview : preview.scaled(size, size, Qt::KeepAspectRatio, Qt::SmoothTransformation))
        .convertToFormat(QImage::Format_Grayscale8);
}

}  // namespace

bool QuadrantNavigation::isSupported(const TagMap& image)
{
    return isMammogram(image) && lateralityNamed(lateralityOf(image)) != Laterality::Unknown;
}

QuadrantNavigation::Orientation QuadrantNavigation::checkOrientation(const TagMap& image)
{
    return orientationOf({lateralityOf(image), textOf(image.findElement(DCM_ViewPosition)),
                          textOf(image.findElement(QStringLiteral("ViewCodeSequence[0]"), DCM_CodeValue)),
                          textOf(image.findElement(DCM_PatientOrientation))});
}

QuadrantNavigation::Orientation QuadrantNavigation::checkOrientation(const ParamBundle& dicom)
{
    // The bundle holds single attributes and no sequences, so there is no view code.
    return orientationOf({firstOf(textOf(dicom, "G0020-0062"), textOf(dicom, "G0020-0060")),
                          textOf(dicom, "G0018-5101"), QByteArray(), textOf(dicom, "G0020-0020")});
}

QVector<float> QuadrantNavigation::computeImageBoxAndCenter(const QImage& preview,
                                                            const Orientation& orientation)
{
    if (preview.isNull())
        return {};
    const QImage picture = reducedToGrey(preview);
    const BreastRegion breast(picture);
    if (breast.isEmpty())
        return {};
    const Side chestWall = orientation.chestWall != Side::Unknown
                               ? orientation.chestWall
                               : chestWallOf(breast, orientation.laterality);

    QVector<float> values;
    const auto addPosition = [&](const QPointF& position) {
        values << static_cast<float>((breast.frame().left() + position.x()) / picture.width())
               << static_cast<float>((breast.frame().top() + position.y()) / picture.height());
    };
    const QPointF middleOfPixel(0.5, 0.5);
    addPosition(breast.box().topLeft());
    // The last pixel inside is part of the breast as a whole, so its far edge counts.
    addPosition(breast.box().bottomRight() + QPoint(1, 1));
    addPosition(centreOf(breast) + middleOfPixel);
    addPosition(tipOf(breast, chestWall) + middleOfPixel);
    values << static_cast<float>(chestWall) << static_cast<float>(orientation.upper);
    return values;
}

bool QuadrantNavigation::process(const QImage& preview, TagMap& image)
{
    if (!isSupported(image))
        return false;
    const QVector<float> values = computeImageBoxAndCenter(preview, checkOrientation(image));
    return !values.isEmpty() && store(values, image);
}

bool QuadrantNavigation::store(const QVector<float>& values, TagMap& image)
{
    const QByteArray bytes(reinterpret_cast<const char*>(values.constData()),
                           values.size() * static_cast<int>(sizeof(float)));
    return image.putAndInsertValue(kQuadrantData, kOurPrivateCreator, VrCode::FL, bytes);
}

}  // namespace Kdd
