#pragma once

#include <QRect>
#include <QVector>

class QImage;

namespace Kdd
{

/// The pixels of a mammogram that show the breast.
///
/// The picture is split by brightness; then the largest connected bright area is the breast, after narrow bridges are
/// cut, so that a label beside the breast or the line around a white frame is an area of its own.
class BreastRegion
{
public:
    /// Pictures are at most so wide and high [pixels]; more would only cost time.
    static constexpr int kMaxSize = 256;

    /// `picture` is of eight bits grey and not larger than that.
    explicit BreastRegion(const QImage& picture);

    /// Whether there is no breast. All that follows needs one.
    bool isEmpty() const { return mBox.isEmpty(); }

    /// The part of the picture inside a white frame; what follows is in pixels from its left top corner.
    const QRect& frame() const { return mFrame; }

    const QRect& box() const { return mBox; }

    /// How many pixels of a row or a column show the breast, and the mean position of these within it.
    struct Line
    {
        int count = 0;
        double mean = 0;
    };
    Line row(int y) const { return line(y * mFrame.width(), 1, mFrame.width()); }
    Line column(int x) const { return line(x, mFrame.width(), mFrame.height()); }

private:
    Line line(int start, int step, int count) const;
    void cutBridges(int radius);
    void keepLargestArea();
    void findBox();

    QRect mFrame;
    QRect mBox;
    QVector<quint8> mMask;  // row by row, 1 where the breast is
};

}  // namespace Kdd
