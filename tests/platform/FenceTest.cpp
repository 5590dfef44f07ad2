#include <fcntl.h>
#include <gtest/gtest.h>
#include <gui/InterpolationGui.h>
#include <poll.h>
#include <ui/Fence.h>
#include <ui/FenceTime.h>
#include <ui/GraphicBuffer.h>
#include <unistd.h>

namespace android {
namespace {

TEST(FenceTest, signalsOnceAndClosesItsDescriptorWithTheLastReference) {
    sp<Fence> fence = Fence::createPending();
    auto fenceTime = std::make_shared<FenceTime>(fence);
    EXPECT_EQ(TIMED_OUT, fence->wait(0));
    EXPECT_EQ(Fence::SIGNAL_TIME_PENDING, fenceTime->getSignalTime());

    fence->signal(1234);
    EXPECT_EQ(NO_ERROR, fence->wait(0));
    EXPECT_EQ(NO_ERROR, fence->wait(-1));
    EXPECT_EQ(1234, fenceTime->getSignalTime());
    fence->signal(5678);  // a fence signals once
    EXPECT_EQ(1234, fence->getSignalTime());

    const int fd = fence->get();
    fence.clear();
    EXPECT_NE(-1, fcntl(fd, F_GETFD));  // the FenceTime still holds the fence
    fenceTime.reset();
    EXPECT_EQ(-1, fcntl(fd, F_GETFD));
}

// The descriptor is made on demand, readable when the fence signalled before; from then on a wait
// polls it, as on a device: a drained descriptor reads as not signalled.
TEST(FenceTest, aDescriptorMadeLateIsReadableAndIsWhatWaitsPoll) {
    sp<Fence> early = Fence::createSignalled(1);
    pollfd readable{early->get(), POLLIN, 0};
    EXPECT_EQ(1, poll(&readable, 1, 0));

    sp<Fence> fence = Fence::createPending();
    const int fd = fence->get();
    EXPECT_EQ(TIMED_OUT, fence->wait(0));
    fence->signal(5);
    EXPECT_EQ(NO_ERROR, fence->wait(0));
    uint64_t count = 0;
    ASSERT_EQ(static_cast<ssize_t>(sizeof(count)), read(fd, &count, sizeof(count)));
    EXPECT_EQ(TIMED_OUT, fence->wait(0));
    EXPECT_EQ(5, fence->getSignalTime());
}

TEST(FenceTest, noFenceCountsAsSignalledButHasNoTime) {
    EXPECT_EQ(NO_ERROR, Fence::NO_FENCE->wait(0));
    EXPECT_FALSE(Fence::NO_FENCE->isValid());
    EXPECT_EQ(Fence::SIGNAL_TIME_INVALID, FenceTime(Fence::NO_FENCE).getSignalTime());
    EXPECT_EQ(Fence::SIGNAL_TIME_INVALID, FenceTime(nullptr).getSignalTime());
    EXPECT_EQ(Fence::SIGNAL_TIME_INVALID, FenceTime::NO_FENCE->getSignalTime());
}

TEST(GraphicBufferTest, givesCpuAccessToItsPixels) {
    sp<GraphicBuffer> buffer = new GraphicBuffer(4, 2, PIXEL_FORMAT_RGBA_8888);
    ASSERT_EQ(NO_ERROR, buffer->initCheck());
    void* pixels = nullptr;
    ASSERT_EQ(NO_ERROR, buffer->lock(GraphicBuffer::USAGE_SW_WRITE_OFTEN, &pixels));
    static_cast<uint8_t*>(pixels)[4 * 2 * 4 - 1] = 0xff;  // last byte of the last pixel
    EXPECT_EQ(NO_ERROR, buffer->unlock());
    EXPECT_NE(buffer->getId(), sp<GraphicBuffer>(new GraphicBuffer(1, 1, 1))->getId());
}

TEST(InterpolationGuiTest, isOneInstance) {
    EXPECT_EQ(&InterpolationGui::getInstance(), &InterpolationGui::getInstance());
}

}  // namespace
}  // namespace android
