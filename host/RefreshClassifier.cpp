#include "host/RefreshClassifier.h"

#include <algorithm>

namespace verolux::host {

using android::Interpolation::RenderItem;
using android::Interpolation::RenderState;

RefreshClassifier::Outcome RefreshClassifier::classify(bool presented, const RenderState& state,
                                                       bool latchedByHost) {
    Outcome outcome;
    std::array<ShownItem, MAX_ITEMS> picture{};
    size_t count = 0;
    uint64_t oldestFrame = 0;
    uint64_t newestFrame = 0;
    bool unready = false;
    if (presented) {
        for (const RenderItem& item : state.items) {
            if (item.frame.isEmpty() || count == MAX_ITEMS) continue;
            unready = unready || !item.frame.isReady();
            picture[count++] = {item.frame.mIndex, item.alpha, item.blend};
            oldestFrame =
                    oldestFrame == 0 ? item.frame.mIndex : std::min(oldestFrame, item.frame.mIndex);
            newestFrame = std::max(newestFrame, item.frame.mIndex);
        }
    }
    if (mShownCount == 0 && count == 0) return outcome;  // nothing on screen yet
    outcome.counted = true;

    if (unready) {
        outcome.counter = Counter::eMissedFrames;
        return outcome;
    }
    if (count == 0 || (count == mShownCount &&
                       std::equal(picture.begin(), picture.begin() + count, mShown.begin()))) {
        outcome.counter = Counter::eRepeatedFrames;
        return outcome;
    }
    if (count > 1) {
        outcome.counter = Counter::eInterpolatedFrames;
    } else {
        outcome.counter = latchedByHost ? Counter::eUninterpolatedFrames : Counter::eOriginalFrames;
    }
    if (oldestFrame > mNewestShownFrame + 1) {
        outcome.skippedFrames = oldestFrame - mNewestShownFrame - 1;
    }
    mNewestShownFrame = std::max(mNewestShownFrame, newestFrame);
    mShown = picture;
    mShownCount = count;
    return outcome;
}

}  // namespace verolux::host
