#pragma once

#include <array>
#include <cstdint>

#include "FrameItem.h"
#include "LogOutput.h"

namespace verolux::host {

// Decides, refresh by refresh, which of a layer's frame-event counters the refresh adds to, from
// what the compositor put on screen. Each refresh after the first picture counts once:
//   - a blend of two frames: an interpolated frame (counter 1);
//   - a single frame unlike the previous picture, from the engine's state: an original frame
//     (counter 3), or, when the host latched it itself because interpolation is off, an
//     uninterpolated frame (counter 4);
//   - the previous picture again, whether the state repeated it, the engine gave an empty state
//     (the compositor keeps what it shows) or the render-rate agent refused the presentation: a
//     repeated frame (counter 5);
//   - a state whose chosen frame was not ready (not acquired, its fence not signalled): a missed
//     frame (counter 2); the previous picture stays.
// Counters 1, 3 and 4 are thus the distinct pictures shown, which getActualFPS adds up. Frames
// that a newer one overtook before they were ever shown are skipped frames (counter 6), counted
// when the newer one is shown. Frame numbers are those of the game's queue, rising by one per
// frame. Not thread-safe: the composition thread owns it.
class RefreshClassifier {
public:
    using Counter = android::Interpolation::EventAggregator::Counter;

    struct Outcome {
        bool counted = false;  // false before the layer has shown anything
        Counter counter = Counter::eRepeatedFrames;
        uint64_t skippedFrames = 0;

        // Whether something new reached the screen.
        bool newPicture() const {
            return counted && (counter == Counter::eInterpolatedFrames ||
                               counter == Counter::eOriginalFrames ||
                               counter == Counter::eUninterpolatedFrames);
        }
    };

    // `presented`: the layer presented at this refresh (the render-rate agent allowed it);
    // `state`: what was composed, empty when it did not present; `latchedByHost`: the host chose
    // the frame itself rather than the engine.
    Outcome classify(bool presented, const android::Interpolation::RenderState& state,
                     bool latchedByHost);

private:
    struct ShownItem {
        uint64_t frame = 0;
        float alpha = 0.0f;
        uint32_t blend = 0;

        bool operator==(const ShownItem& o) const {
            return frame == o.frame && alpha == o.alpha && blend == o.blend;
        }
    };
    static constexpr size_t MAX_ITEMS = 2;

    std::array<ShownItem, MAX_ITEMS> mShown{};  // the picture on screen, bottom first
    size_t mShownCount = 0;
    uint64_t mNewestShownFrame = 0;  // 0: none yet
};

}  // namespace verolux::host
