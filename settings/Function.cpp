#include "Function.h"

#include "Log.h"

namespace android::Interpolation {

Function::Function(std::vector<float> values, bool bound) {
    mPoints.reserve(values.size() / 2 + 2);
    if (bound) mPoints.push_back({0.0f, 0.0f});

    // A corrected point does not become prev: later points are checked against the last point
    // that was accepted unchanged. Callers rely on exactly this repair.
    float prevX = 0.0f;
    float prevY = 0.0f;
    for (size_t i = 0; i < values.size(); i += 2) {
        if (i + 1 == values.size()) {
            ILOG(1,
                 "Warning: odd number (%d) of X-Y values used in alpha function settings! "
                 "Ignoring last value (%f)",
                 static_cast<int>(values.size()), values[i]);
            break;
        }
        const float x = values[i];
        const float y = values[i + 1];
        // Ordered comparisons: a NaN x is never out of order and a NaN y never corrected.
        if (i == 0) {
            mPoints.push_back({x, y});
            prevX = x;
            prevY = y;
        } else if (x <= prevX) {
            ILOG(1, "Warning: alpha function point is out of order! Ignoring (%f, %f)", x, y);
        } else if (y < prevY) {
            ILOG(1,
                 "Warning: correction applied to non-increasing sequence of Y values used in "
                 "alpha function settings! (%f, %f) -> (%f, %f)",
                 x, y, x, prevY);
            mPoints.push_back({x, prevY});
        } else {
            mPoints.push_back({x, y});
            prevX = x;
            prevY = y;
        }
    }

    if (bound && mPoints.back().x <= 1.0f && mPoints.back().y <= 1.0f) {
        mPoints.push_back({1.0f, 1.0f});
    }
}

float Function::getY(float x) const {
    if (mPoints.empty()) return x;
    // Half-open segments with a strictly greater right end: duplicated x values never divide by 0.
    for (size_t k = 0; k + 1 < mPoints.size(); k++) {
        const Point& left = mPoints[k];
        const Point& right = mPoints[k + 1];
        if (left.x <= x && right.x > x) {
            const float t = (x - left.x) / (right.x - left.x);
            return right.y * t + left.y * (1.0f - t);
        }
    }
    const Point& nearest = mPoints.front().x > x ? mPoints.front() : mPoints.back();
    ILOG(1,
         "Warning: alpha input %f out of range in alpha function settings! Returning clamped "
         "value %f",
         x, nearest.y);
    return nearest.y;
}

}  // namespace android::Interpolation
