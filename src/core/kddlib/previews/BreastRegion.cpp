#include "kddlib/previews/BreastRegion.h"

#include <QImage>

#include <algorithm>
#include <array>
#include <cmath>

namespace Kdd
{

namespace
{

using Histogram = std::array<int, 256>;

constexpr int kWhite = 250;
constexpr unsigned kLevelsAlike = 16;
constexpr int kFramePart = 16;   // a white frame takes at most this part of a side
constexpr int kBridgePart = 64;  // a bridge is up to twice this part of the picture wide
constexpr int kLeastPart = 50;   // a breast fills at least this part of the picture
constexpr double kLeastContrast = 16;

bool isWhite(const QImage& picture, const QRect& line)
{
    for (int y = line.top(); y <= line.bottom(); ++y) {
        const uchar* row = picture.constScanLine(y);
        if (!std::all_of(row + line.left(), row + line.right() + 1, [](uchar v) { return v >= kWhite; }))
            return false;
    }
    return true;
}

/// Bounded on each side, so that a picture that is white all over still has a middle.
QRect withoutWhiteFrame(const QImage& picture)
{
    QRect inner = picture.rect();
    const int across = inner.width() / kFramePart;
    const int down = inner.height() / kFramePart;
    for (int i = 0; i < down && isWhite(picture, QRect(inner.topLeft(), QSize(inner.width(), 1))); ++i)
        inner.setTop(inner.top() + 1);
    for (int i = 0; i < down && isWhite(picture, QRect(inner.bottomLeft(), QSize(inner.width(), 1))); ++i)
        inner.setBottom(inner.bottom() - 1);
    for (int i = 0; i < across && isWhite(picture, QRect(inner.topLeft(), QSize(1, inner.height()))); ++i)
        inner.setLeft(inner.left() + 1);
    for (int i = 0; i < across && isWhite(picture, QRect(inner.topRight(), QSize(1, inner.height()))); ++i)
        inner.setRight(inner.right() - 1);
    return inner;
}

double meanOf(const QImage& picture, const QRect& area)
{
    qint64 sum = 0;
    for (int y = area.top(); y <= area.bottom(); ++y) {
        const uchar* row = picture.constScanLine(y);
        for (int x = area.left(); x <= area.right(); ++x)
            sum += row[x];
    }
    return double(sum) / area.width() / area.height();
}

/// The brightness that is most frequent along the border, rounded down to one of sixteen.
int borderLevel(const QImage& picture, const QRect& area)
{
    std::array<int, 256 / kLevelsAlike> counts{};
    const auto count = [&](int x, int y) { ++counts[picture.constScanLine(y)[x] / kLevelsAlike]; };
    for (int y = area.top(); y <= area.bottom(); ++y) {
        count(area.left(), y);
        count(area.right(), y);
    }
    for (int x = area.left(); x <= area.right(); ++x) {
        count(x, area.top());
        count(x, area.bottom());
    }
    const auto most = std::max_element(counts.begin(), counts.end()) - counts.begin();
    return static_cast<int>(most * kLevelsAlike);
}

/// A background brighter than the picture as a whole is an inverted one. The background is known by being even: a large
/// breast may touch more of the border, but in many shades.
bool isInverted(const QImage& picture, const QRect& area)
{
    return borderLevel(picture, area) > meanOf(picture, area);
}

/// Stretches what is dark. Fat under the skin is only a little brighter than the background; unstretched, the most
/// marked step in brightness is often that between fat and gland.
std::array<quint8, 256> brightnessLevels(bool inverted)
{
    std::array<quint8, 256> levels{};
    for (int i = 0; i < 256; ++i)
        levels[std::size_t(inverted ? 255 - i : i)] = static_cast<quint8>(std::lround(std::sqrt(255.0 * i)));
    return levels;
}

/// The level above which pixels are bright: the one that makes the two classes differ most (Otsu's criterion). 255
/// when they hardly differ.
int splitLevel(const QVector<quint8>& pixels)
{
    Histogram histogram{};
    for (const quint8 level : pixels)
        ++histogram[level];
    double total = 0;
    for (std::size_t i = 0; i < histogram.size(); ++i)
        total += double(i) * histogram[i];

    int split = 255;
    double best = 0;
    double darkCount = 0;
    double darkSum = 0;
    for (int i = 0; i < 255; ++i) {
        darkCount += histogram[std::size_t(i)];
        darkSum += double(i) * histogram[std::size_t(i)];
        const double brightCount = pixels.size() - darkCount;
        if (darkCount == 0 || brightCount == 0)
            continue;
        const double contrast = (total - darkSum) / brightCount - darkSum / darkCount;
        // But for a constant factor the variance between the two classes.
        const double spread = contrast * contrast * darkCount * brightCount;
        if (contrast >= kLeastContrast && spread > best) {
            best = spread;
            split = i;
        }
    }
    return split;
}

enum class Keep { All, Any };

/// Sets each pixel of a line to whether all (any) of those at most `radius` away are set. Beyond the ends nothing
/// counts: the breast goes on there.
void filterLine(quint8* pixels, int step, int count, int radius, Keep keep)
{
    // Sums up to each pixel: how many are set in a window is then one subtraction, whatever its radius.
    QVector<int> before(count + 1, 0);
    for (int i = 0; i < count; ++i)
        before[i + 1] = before.at(i) + pixels[i * step];
    for (int i = 0; i < count; ++i) {
        const int from = std::max(i - radius, 0);
        const int to = std::min(i + radius + 1, count);
        const int set = before.at(to) - before.at(from);
        pixels[i * step] = keep == Keep::All ? set == to - from : set > 0;
    }
}

/// First along the rows, then along the columns: together the square of that radius around each pixel.
void filter(QVector<quint8>& mask, const QSize& size, int radius, Keep keep)
{
    for (int y = 0; y < size.height(); ++y)
        filterLine(mask.data() + y * size.width(), 1, size.width(), radius, keep);
    for (int x = 0; x < size.width(); ++x)
        filterLine(mask.data() + x, size.width(), size.height(), radius, keep);
}

/// Moves the pixels of the area that `start` belongs to out of the mask; neighbours share a side.
QVector<int> takeArea(QVector<quint8>& mask, int width, int start)
{
    QVector<int> area{start};
    mask[start] = 0;
    for (int next = 0; next < area.size(); ++next) {
        const int at = area.at(next);
        const int neighbours[] = {at % width > 0 ? at - 1 : -1, at % width < width - 1 ? at + 1 : -1,
                                  at - width, at + width};
        for (const int neighbour : neighbours) {
            // Beyond the first and the last row value() answers 0, as it does for -1.
            if (mask.value(neighbour, 0) == 0)
                continue;
            mask[neighbour] = 0;
            area.append(neighbour);
        }
    }
    return area;
}

}  // namespace

BreastRegion::BreastRegion(const QImage& picture)
    : mFrame(withoutWhiteFrame(picture))
{
    // Inside the frame, because the border that tells the background is that of the picture itself.
    const auto levels = brightnessLevels(isInverted(picture, mFrame));
    mMask.reserve(mFrame.width() * mFrame.height());
    for (int y = mFrame.top(); y <= mFrame.bottom(); ++y) {
        const uchar* row = picture.constScanLine(y);
        for (int x = mFrame.left(); x <= mFrame.right(); ++x)
            mMask.append(levels[row[x]]);
    }
    const int split = splitLevel(mMask);
    for (quint8& pixel : mMask)
        pixel = pixel > split;
    cutBridges(std::min(mFrame.width(), mFrame.height()) / kBridgePart);
    findBox();
}

/// What is left of the largest area after everything narrow is worn away grows back to its outline, not across what was
/// cut.
void BreastRegion::cutBridges(int radius)
{
    filter(mMask, mFrame.size(), radius, Keep::All);
    keepLargestArea();
    filter(mMask, mFrame.size(), radius, Keep::Any);
}

/// Takes every area out of the mask and puts the largest back, unless that is too small to be a breast.
void BreastRegion::keepLargestArea()
{
    QVector<int> largest;
    for (int i = 0; i < mMask.size(); ++i) {
        if (mMask.at(i) == 0)
            continue;
        const QVector<int> area = takeArea(mMask, mFrame.width(), i);
        if (area.size() > largest.size())
            largest = area;
    }
    if (largest.size() < mMask.size() / kLeastPart)
        return;
    for (const int at : qAsConst(largest))
        mMask[at] = 1;
}

void BreastRegion::findBox()
{
    for (int y = 0; y < mFrame.height(); ++y) {
        if (row(y).count > 0)
            mBox |= QRect(0, y, 1, 1);
    }
    if (mBox.isEmpty())
        return;
    int left = 0;
    int right = mFrame.width() - 1;
    while (column(left).count == 0)
        ++left;
    while (column(right).count == 0)
        --right;
    mBox = QRect(QPoint(left, mBox.top()), QPoint(right, mBox.bottom()));
}

/// A row or a column; `step` is how far its pixels lie apart in the mask.
BreastRegion::Line BreastRegion::line(int start, int step, int count) const
{
    Line line;
    double sum = 0;
    for (int i = 0; i < count; ++i) {
        if (mMask.at(start + i * step) == 0)
            continue;
        ++line.count;
        sum += i;
    }
    if (line.count > 0)
        line.mean = sum / line.count;
    return line;
}

}  // namespace Kdd
