#pragma once

#include <cmath>

namespace Kdd
{

/// A point or a direction in patient space [mm]. Plans of stacks are computed in double precision and only their
/// results are floats: a slice a metre away from the origin would otherwise be placed a tenth of a micrometre off for
/// every operation.
struct Vec3d
{
    double x = 0;
    double y = 0;
    double z = 0;
};

inline Vec3d operator+(const Vec3d& a, const Vec3d& b)
{
    return {a.x + b.x, a.y + b.y, a.z + b.z};
}

inline Vec3d operator-(const Vec3d& a, const Vec3d& b)
{
    return {a.x - b.x, a.y - b.y, a.z - b.z};
}

inline Vec3d operator*(const Vec3d& a, double factor)
{
    return {a.x * factor, a.y * factor, a.z * factor};
}

inline double dot(const Vec3d& a, const Vec3d& b)
{
    return a.x * b.x + a.y * b.y + a.z * b.z;
}

inline Vec3d cross(const Vec3d& a, const Vec3d& b)
{
    return {a.y * b.z - a.z * b.y, a.z * b.x - a.x * b.z, a.x * b.y - a.y * b.x};
}

inline double length(const Vec3d& a)
{
    return std::sqrt(dot(a, a));
}

}  // namespace Kdd
