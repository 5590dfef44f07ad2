#include "LogOutput.h"

namespace android {

const uint32_t INTERPOLATION_MAJOR_VERSION = 1;
const uint32_t INTERPOLATION_MINOR_VERSION = 5;
const uint32_t INTERPOLATION_REVISION = 39;
const char* INTERPOLATION_BRANCH = "release";

}  // namespace android
