#include "tools/kdd/module/ContactSheet.h"

#include <QDir>
#include <QImage>
#include <QPainter>

#include <cmath>

namespace Kdd
{

namespace
{

// A sheet of some 7,400 x 5,000 pixels.
constexpr int kMaxPictures = 2000;
constexpr int kCell = 128;  // [pixels]
constexpr int kGap = 6;     // [pixels]
constexpr QRgb kBackground = 0xff303038;

QPoint cornerOf(int index, int columns)
{
    return {kGap + (index % columns) * (kCell + kGap), kGap + (index / columns) * (kCell + kGap)};
}

void drawCentred(QPainter& painter, const QImage& picture, const QPoint& corner)
{
    const QImage fitted = picture.scaled(kCell, kCell, Qt::KeepAspectRatio, Qt::SmoothTransformation);
    painter.drawImage(corner + QPoint((kCell - fitted.width()) / 2, (kCell - fitted.height()) / 2), fitted);
}

}  // namespace

Result writeContactSheet(const QString& folder, const QString& path)
{
    const QDir directory(folder);
    const QStringList names =
        directory.entryList({QStringLiteral("*.jpg")}, QDir::Files, QDir::Name).mid(0, kMaxPictures);
    if (names.isEmpty())
        return Result::failure(QStringLiteral("There are no pictures in %1").arg(folder));
    // A little wider than high, like a page on a screen.
    const int columns = static_cast<int>(std::ceil(std::sqrt(names.size() * 1.5)));
    const int rows = (names.size() + columns - 1) / columns;
    QImage sheet(kGap + columns * (kCell + kGap), kGap + rows * (kCell + kGap), QImage::Format_RGB32);
    sheet.fill(kBackground);
    // The painter ends before the picture is saved.
    {
        QPainter painter(&sheet);
        for (int i = 0; i < names.size(); ++i) {
            const QImage picture(directory.filePath(names.at(i)));
            if (!picture.isNull())
                drawCentred(painter, picture, cornerOf(i, columns));
        }
    }
    return sheet.save(path) ? Result() : Result::failure(QStringLiteral("Could not write %1").arg(path));
}

}  // namespace Kdd
