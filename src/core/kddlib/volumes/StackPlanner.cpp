#include "kddlib/volumes/StackPlanner.h"

#include "kddlib/tagmodel/TagMap.h"
#include "kddlib/volumes/StackFrameReader.h"
#include "kddlib/volumes/StackSplit.h"
#include "platform/base/Result.h"

#include <dcmtk/dcmdata/dcdeftag.h>

#include <algorithm>
#include <cmath>

namespace Kdd
{

namespace
{

// Cosines are often written with three digits, spacings with four.
constexpr double kSameDirection = 2e-3;
constexpr double kSameSpacing = 1e-3;
// Positions rounded to a tenth make steps that differ by a tenth.
constexpr double kStepTolerance = 0.11;  // [mm]

// A series in which every image has an orientation of its own would take a comparison for each pair of them.
constexpr int kMaxGroups = 1000;

/// By Instance Number and then by UID, as the images of a volume are sorted.
QVector<const TagMap*> imagesInOrder(const TagMap& series)
{
    struct Numbered
    {
        int number;
        QByteArray uid;
        const TagMap* image;
    };
    QVector<Numbered> numbered;
    for (const TagMap* image : series.children()) {
        int number = 0;
        image->findAndGetInt(DCM_InstanceNumber, number);
        numbered.append({number, image->uid(TagMap::ImageLevel), image});
    }
    std::sort(numbered.begin(), numbered.end(), [](const Numbered& a, const Numbered& b) {
        return a.number != b.number ? a.number < b.number : a.uid < b.uid;
    });
    QVector<const TagMap*> images;
    for (const Numbered& entry : qAsConst(numbered))
        images.append(entry.image);
    return images;
}

bool isNear(const Vec3d& a, const Vec3d& b)
{
    const Vec3d d = a - b;
    return qMax(std::fabs(d.x), qMax(std::fabs(d.y), std::fabs(d.z))) <= kSameDirection;
}

bool isNear(double a, double b)
{
    return std::fabs(a - b) <= kSameSpacing * a;
}

/// A volume file names its slices either by images or by frames, so the two are never in one stack.
bool areOfOneKind(const StackFrame& a, const StackFrame& b)
{
    return a.columns == b.columns && a.rows == b.rows && a.isMultiFrame == b.isMultiFrame &&
           a.photometric == b.photometric && isNear(a.columnSpacing, b.columnSpacing) &&
           isNear(a.rowSpacing, b.rowSpacing) && isNear(a.alongRow, b.alongRow) &&
           isNear(a.alongColumn, b.alongColumn);
}

void leaveOut(const StackFrames& frames, const QString& reason, QVector<LeftOutFrame>& leftOut)
{
    for (const StackFrame* frame : frames)
        leftOut.append(leftOutFrame(*frame, reason));
}

QVector<StackFrames> groupedByKind(const QVector<StackFrame>& frames, QVector<LeftOutFrame>& leftOut)
{
    QVector<StackFrames> groups;
    for (const StackFrame& frame : frames) {
        // With the first of a group, so that small differences do not add up from slice to slice.
        const auto isOfKind = [&](const StackFrames& group) { return areOfOneKind(*group.first(), frame); };
        const auto group = std::find_if(groups.begin(), groups.end(), isOfKind);
        if (group != groups.end())
            group->append(&frame);
        else if (groups.size() < kMaxGroups)
            groups.append(StackFrames{&frame});
        else
            leaveOut({&frame}, QStringLiteral("The series has more than %1 geometries").arg(kMaxGroups),
                     leftOut);
    }
    return groups;
}

/// Parts too small for a stack are told here, where it is known that there are more slices like them.
QVector<StackFrames> partedByReference(const QVector<StackFrames>& groups, QVector<LeftOutFrame>& leftOut)
{
    QVector<StackFrames> result;
    for (const StackFrames& group : groups) {
        const QVector<StackFrames> parts =
            partedBy(group, [](const StackFrame& frame) { return frame.frameOfReference; });
        const bool areCut = parts.size() > 1 && group.size() >= kLeastSlices;
        for (const StackFrames& part : parts) {
            if (areCut && part.size() < kLeastSlices) {
                leaveOut(
                    part,
                    QStringLiteral("Its Frame of Reference is not that of the other slices of its geometry"),
                    leftOut);
            } else {
                result.append(part);
            }
        }
    }
    // As the frames lie in the series.
    std::sort(result.begin(), result.end(),
              [](const StackFrames& a, const StackFrames& b) { return a.first() < b.first(); });
    return result;
}

/// Of at least two frames. Single steps are rounded; over a run that evens out.
Vec3d meanStep(const StackFrames& run)
{
    return (run.last()->position - run.first()->position) * (1.0 / (run.size() - 1));
}

/// Never more than a quarter of the step: of thin slices one may be missing without being farther off than a tenth.
double toleranceFor(const Vec3d& step)
{
    return qMin(kStepTolerance, length(step) / 4);
}

bool continues(const StackFrames& run, const StackFrame& next)
{
    // One frame goes on with any other: the second makes the step that the third is held against.
    if (run.size() < 2)
        return true;
    const Vec3d step = meanStep(run);
    return length(next.position - (run.last()->position + step)) <= toleranceFor(step);
}

/// Cuts frames in different planes where the step between them changes.
QVector<StackFrames> runsOf(StackFrames frames)
{
    const StackFrame& like = *frames.first();
    std::sort(frames.begin(), frames.end(), [&](const StackFrame* a, const StackFrame* b) {
        return positionAlong(like, *a) < positionAlong(like, *b);
    });
    QVector<StackFrames> runs{StackFrames()};
    for (const StackFrame* frame : qAsConst(frames)) {
        if (!continues(runs.last(), *frame)) {
            // Two slices are no run yet: the gap may lie between them, and the second begin the next run.
            const bool sharesLast = runs.last().size() == 2;
            const StackFrames begin = sharesLast ? StackFrames{runs.last().takeLast()} : StackFrames();
            runs.append(begin);
        }
        runs.last().append(frame);
    }
    return runs;
}

/// Steps that are each nearly right may still add up.
Result checkSpacing(const StackFrames& run)
{
    const Vec3d step = meanStep(run);
    for (int i = 0; i < run.size(); ++i) {
        const double off = length(run.at(i)->position - (run.first()->position + step * i));
        if (off > toleranceFor(step))
            return Result::failure(QStringLiteral("The slices are not evenly spaced: %1 lies off by %2 mm")
                                       .arg(QString::fromLatin1(run.at(i)->imageUID))
                                       .arg(off));
    }
    return {};
}

Result checkRun(const StackFrames& run)
{
    if (run.size() < kLeastSlices)
        return Result::failure(QStringLiteral("A stack needs %1 slices at equal distances, here are %2")
                                   .arg(kLeastSlices)
                                   .arg(run.size()));
    return checkSpacing(run);
}

/// The columns are the steps along each axis and the origin; they are stored row by row.
Mat4f matrixOf(const Vec3d& x, const Vec3d& y, const Vec3d& z, const Vec3d& origin)
{
    const auto f = [](double value) { return static_cast<float>(value); };
    return {{f(x.x), f(y.x), f(z.x), f(origin.x), f(x.y), f(y.y), f(z.y), f(origin.y), f(x.z), f(y.z), f(z.z),
             f(origin.z), 0, 0, 0, 1}};
}

/// From a value to that value plus each of three extents.
void widen(double from, double a, double b, double c, float& min, float& max)
{
    min = static_cast<float>(from + qMin(a, 0.0) + qMin(b, 0.0) + qMin(c, 0.0));
    max = static_cast<float>(from + qMax(a, 0.0) + qMax(b, 0.0) + qMax(c, 0.0));
}

/// The first slice gives size, spacing and directions, in which all of
/// them agree as far as their group demands.
Stack stackOf(const StackFrames& run)
{
    const StackFrame& first = *run.first();
    const Vec3d x = first.alongRow * first.columnSpacing;
    const Vec3d y = first.alongColumn * first.rowSpacing;
    const Vec3d z = meanStep(run);
    const Vec3d width = x * (first.columns - 1);
    const Vec3d height = y * (first.rows - 1);
    const Vec3d depth = z * (run.size() - 1);

    Stack stack;
    for (const StackFrame* frame : run)
        stack.slices.append(*frame);
    stack.dims = {first.columns, first.rows, run.size()};
    // Along the normal: with a tilted gantry the steps are longer than the slices are apart.
    stack.sliceSpacing = dot(z, first.normal());
    stack.transformation = matrixOf(x, y, z, first.position);
    Box3f& box = stack.boundingBox;
    widen(first.position.x, width.x, height.x, depth.x, box.xmin, box.xmax);
    widen(first.position.y, width.y, height.y, depth.y, box.ymin, box.ymax);
    widen(first.position.z, width.z, height.z, depth.z, box.zmin, box.zmax);
    return stack;
}

void planGroup(const StackFrames& group, StackPlan& plan)
{
    const QVector<StackFrames> parts = splitByPlane(group, plan.leftOut);
    for (const StackFrames& part : parts) {
        const QVector<StackFrames> runs = runsOf(part);
        for (const StackFrames& run : runs) {
            const Result checked = checkRun(run);
            if (checked.good())
                plan.stacks.append(stackOf(run));
            else
                leaveOut(run, checked.text(), plan.leftOut);
        }
    }
}

}  // namespace

/// Groups the frames of all images by geometry, parts the groups by Frame of Reference and then so that no
/// two frames of a part lie in one plane, and cuts what is left into runs of equal steps. Each run that is
/// long enough is a stack; whatever falls out on the way is told with its reason.
StackPlan planStacks(const TagMap& series, FrameOfReference reference)
{
    StackPlan plan;
    QVector<StackFrame> frames;
    const QVector<const TagMap*> images = imagesInOrder(series);
    for (const TagMap* image : images)
        frames += stackFramesOf(*image, plan.leftOut);
    QVector<StackFrames> groups = groupedByKind(frames, plan.leftOut);
    if (reference == FrameOfReference::Shared)
        groups = partedByReference(groups, plan.leftOut);
    for (const StackFrames& group : qAsConst(groups))
        planGroup(group, plan);
    return plan;
}

}  // namespace Kdd
