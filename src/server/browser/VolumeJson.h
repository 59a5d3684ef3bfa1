#pragma once

#include <QJsonObject>

namespace Kdd
{

class Volume;

}  // namespace Kdd

namespace Kdd::Browser
{

/// A volume with its geometry:
///
///     {"index": 0, "images": 120, "slices": 120, "preview": true, "lossy": 0, "overlays": 0,
///      "dims": [512, 512, 120],                      columns, rows, slices
///      "spacing": [0.7, 0.7, 1.5],                   [mm], along rows, along columns, from slice to slice
///      "origin": [-180, -160, 40],                   centre of the first voxel [mm]
///      "axes": [[1,0,0], [0,1,0], [0,0,1]],          directions of the three in patient space
///      "plane": "axial", "oblique": 0,               the nearest anatomical plane, and how far from it [degrees]
///      "box": [[xmin,xmax], [ymin,ymax], [zmin,zmax]],
///      "slope": 1, "intercept": -1024, "bitLoss": 0,
///      "padding": -2000, "paddingLimit": -1990,      only where the volume has them
///      "histogram": {"min": 0, "max": 4095, "total": 31457280, "bins": [...]}}
///
/// Of one of which nothing but its existence is known, {"index", "images", "preview", "bare": true}.
QJsonObject volumeJson(const Volume& volume);

}  // namespace Kdd::Browser
