#pragma once

#include <vector>

namespace android::Interpolation {

struct Point {
    float x;
    float y;

    bool operator==(const Point& other) const { return x == other.x && y == other.y; }
};

// The piecewise-linear alpha curve: maps the position of a display time between two game frames
// (0 to 1) to the weight with which the later frame is blended over the earlier one.
class Function {
public:
    // The identity curve: no points.
    Function() = default;
    // Values are x0, y0, x1, y1, ... and are repaired as they are read: points out of order are
    // dropped, a falling y is raised to the y of the last point accepted unchanged, and `bound`
    // pins the curve to (0, 0) and, when it ends inside the unit square, to (1, 1).
    Function(std::vector<float> values, bool bound);

    // Evaluated on every blended composition; logs (and clamps) an x outside the curve.
    float getY(float x) const;

    const std::vector<Point>& getPoints() const { return mPoints; }

private:
    std::vector<Point> mPoints;
};

}  // namespace android::Interpolation
