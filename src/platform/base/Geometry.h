#pragma once

#include <array>
#include <cstdint>

namespace Kdd
{

struct Vec2i
{
    std::int32_t x = 0;
    std::int32_t y = 0;
};

struct Vec3i
{
    std::int32_t x = 0;
    std::int32_t y = 0;
    std::int32_t z = 0;
};

/// Limits along the three axes [mm]. A new box is empty: every minimum lies above its maximum.
struct Box3f
{
    float xmin = 0;
    float xmax = -1e10F;
    float ymin = 0;
    float ymax = -1e10F;
    float zmin = 0;
    float zmax = -1e10F;
};

/// Row by row; a new matrix is the identity.
struct Mat4f
{
    std::array<float, 16> m{1, 0, 0, 0, 0, 1, 0, 0, 0, 0, 1, 0, 0, 0, 0, 1};
};

}  // namespace Kdd
