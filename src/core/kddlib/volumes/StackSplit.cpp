#include "kddlib/volumes/StackSplit.h"

#include "kddlib/volumes/StackFrameReader.h"

#include <QHash>
#include <QMap>

#include <dcmtk/dcmdata/dcdeftag.h>

#include <algorithm>

namespace Kdd
{

namespace
{

// Far below the thinnest slices, and above what rounding makes of one position written twice.
constexpr double kSamePlane = 0.01;  // [mm]

/// An attribute by which the images of one plane may differ, and the functional group that enhanced images keep it in.
struct SplitKey
{
    DcmTagKey group;
    DcmTagKey key;
};

// What an examination varies on purpose comes first, what merely differs with it last.
const SplitKey kSplitKeys[] = {
    {DCM_FrameContentSequence, DCM_TemporalPositionIndex},
    {DCM_FrameContentSequence, DCM_TemporalPositionIdentifier},
    {DCM_MREchoSequence, DCM_EffectiveEchoTime},
    {DCM_MREchoSequence, DCM_EchoTime},
    {DCM_MREchoSequence, DCM_EchoNumbers},
    {DCM_MRDiffusionSequence, DCM_DiffusionBValue},
    {DCM_MRDiffusionSequence, DCM_DiffusionGradientOrientation},
    {DCM_MRImageFrameTypeSequence, DCM_FrameType},
    {DCM_CTImageFrameTypeSequence, DCM_FrameType},
    {DCM_MRImageFrameTypeSequence, DCM_ComplexImageComponent},
    {DCM_MRImageFrameTypeSequence, DCM_ImageType},
    {DCM_MRModifierSequence, DCM_InversionTime},
    {DCM_CardiacSynchronizationSequence, DCM_NominalCardiacTriggerDelayTime},
    {DCM_CardiacSynchronizationSequence, DCM_TriggerTime},
    {DCM_CTXRayDetailsSequence, DCM_KVP},
    {DCM_CTReconstructionSequence, DCM_ConvolutionKernel},
    {DCM_FrameContentSequence, DCM_StackID},
    {DCM_FrameContentSequence, DCM_FrameAcquisitionNumber},
    {DCM_FrameContentSequence, DCM_AcquisitionNumber},
    {DCM_FrameContentSequence, DCM_AcquisitionTime},
};

/// The plane of each frame, counted along the normal.
QVector<int> planesOf(const StackFrames& frames)
{
    // Sorted, a new plane begins where a frame lies farther from the one before than rounding explains.
    QVector<double> along;
    QVector<int> order;
    for (int i = 0; i < frames.size(); ++i) {
        along.append(positionAlong(*frames.first(), *frames.at(i)));
        order.append(i);
    }
    std::sort(order.begin(), order.end(), [&](int a, int b) { return along.at(a) < along.at(b); });

    QVector<int> planes(frames.size());
    for (int i = 1; i < order.size(); ++i) {
        const bool isNext = along.at(order.at(i)) - along.at(order.at(i - 1)) > kSamePlane;
        planes[order.at(i)] = planes.at(order.at(i - 1)) + (isNext ? 1 : 0);
    }
    return planes;
}

/// The frames of each plane, in the order given.
QVector<StackFrames> byPlane(const StackFrames& frames)
{
    const QVector<int> planes = planesOf(frames);
    QVector<StackFrames> result(planes.isEmpty() ? 0 : *std::max_element(planes.begin(), planes.end()) + 1);
    for (int i = 0; i < frames.size(); ++i)
        result[planes.at(i)].append(frames.at(i));
    return result;
}

int mostInOnePlane(const StackFrames& frames)
{
    int most = 0;
    const QVector<StackFrames> planes = byPlane(frames);
    for (const StackFrames& plane : planes)
        most = qMax(most, plane.size());
    return most;
}

/// Whether no part has more than its fair share of a plane. An attribute that differs from slice to slice, such as some
/// trigger times, makes more parts than there are frames in a plane. The last part may be incomplete.
bool isEven(const QVector<StackFrames>& parts, int most)
{
    const auto isFair = [&](const StackFrames& part) {
        return qint64(mostInOnePlane(part)) * parts.size() <= most;
    };
    return parts.size() > 1 && std::all_of(parts.begin(), parts.end(), isFair);
}

/// The k-th frame of every plane makes the k-th part; when the planes are not equally full, only the first does.
QVector<StackFrames> partedByOrder(const StackFrames& frames, int most, QVector<LeftOutFrame>& leftOut)
{
    const QVector<StackFrames> planes = byPlane(frames);
    const bool isFull = std::all_of(planes.begin(), planes.end(),
                                    [&](const StackFrames& plane) { return plane.size() == most; });
    QVector<StackFrames> parts(isFull ? most : 1);
    for (const StackFrames& plane : planes) {
        for (int i = 0; i < parts.size(); ++i)
            parts[i].append(plane.at(i));
        for (int i = parts.size(); i < plane.size(); ++i)
            leftOut.append(leftOutFrame(
                *plane.at(i),
                QStringLiteral("It lies in the plane of another slice, and nothing tells them apart")));
    }
    return parts;
}

}  // namespace

QVector<StackFrames> partedBy(const StackFrames& frames,
                              const std::function<QByteArray(const StackFrame&)>& valueOf)
{
    QHash<QByteArray, int> partOf;
    QVector<StackFrames> parts;
    for (const StackFrame* frame : frames) {
        const QByteArray value = valueOf(*frame);
        const auto known = partOf.constFind(value);
        const int part = known != partOf.constEnd() ? *known : parts.size();
        if (part == parts.size()) {
            partOf.insert(value, part);
            parts.append(StackFrames());
        }
        parts[part].append(frame);
    }
    return parts;
}

double positionAlong(const StackFrame& like, const StackFrame& frame)
{
    return dot(frame.position, like.normal());
}

/// Tries the attributes in turn. The first one that divides the frames evenly parts them, and each part is
/// split again in the same way; without one the order of the images decides.
QVector<StackFrames> splitByPlane(const StackFrames& frames, QVector<LeftOutFrame>& leftOut)
{
    const int most = mostInOnePlane(frames);
    if (most <= 1)
        return {frames};
    for (const SplitKey& key : kSplitKeys) {
        const QVector<StackFrames> parts =
            partedBy(frames, [&](const StackFrame& frame) { return frame.tags.text(key.group, key.key); });
        if (!isEven(parts, most))
            continue;
        QVector<StackFrames> result;
        // Every part holds at most half of the fullest plane, so this ends after as many levels as that has bits.
        for (const StackFrames& part : parts)
            result += splitByPlane(part, leftOut);
        return result;
    }
    return partedByOrder(frames, most, leftOut);
}

}  // namespace Kdd
