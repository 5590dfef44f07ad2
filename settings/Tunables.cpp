#include "Tunables.h"

namespace android::Interpolation {

std::atomic<int32_t> logLevel{0};
std::atomic<int32_t> queueSize{-1};
std::atomic<int32_t> defaultDelay{64};
std::atomic<bool> keepTwoHwcLayers{false};
std::atomic<bool> applyDelayToFrames{false};
std::vector<String8> layerNameBlockList{String8("PopupWindow"), String8("StatusBar"),
                                        String8("NavigationBar")};

}  // namespace android::Interpolation
