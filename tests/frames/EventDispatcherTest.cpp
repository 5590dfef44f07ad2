#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "EventDispatcher.h"
#include "support/Frames.h"
#include "support/LogCapture.h"
#include "support/RecordingReceiver.h"

namespace android::Interpolation {
namespace {

using test::LogCapture;
using test::RecordingReceiver;
using testing::ElementsAre;
using testing::IsEmpty;

class EventDispatcherTest : public testing::Test {
protected:
    void broadcast(EventType type) { EventDispatcher::broadcastEvent(mUid, type, 1, 0); }

    const uint32_t mUid = test::nextTestUid();
};

TEST_F(EventDispatcherTest, repeatedSubscriptionsWidenOneEntry) {
    sp<RecordingReceiver> receiver = new RecordingReceiver();
    EventDispatcher::subscribe(mUid, 1, receiver);
    EventDispatcher::subscribe(mUid, 2, receiver);
    broadcast(eFrameReceivedEvent);
    broadcast(eFrameReleasedEvent);
    EXPECT_THAT(receiver->types(), ElementsAre(1u, 2u));  // once each: one entry

    EventDispatcher::unsubscribe(mUid, 1, receiver);
    broadcast(eFrameReceivedEvent);
    broadcast(eFrameReleasedEvent);
    EXPECT_THAT(receiver->types(), ElementsAre(1u, 2u, 2u));

    EventDispatcher::unsubscribe(mUid, 2, receiver);
    LogCapture log(1);
    const std::string noSubscribers =
            "EventDispatcher::broadcastEventLocked no subscribers for uid " + std::to_string(mUid);
    broadcast(eFrameReleasedEvent);  // the emptied vector is erased...
    broadcast(eFrameReleasedEvent);  // ...so this one finds no entry at all
    EXPECT_EQ(2, log.count(noSubscribers));
    EXPECT_THAT(receiver->types(), ElementsAre(1u, 2u, 2u));
}

TEST_F(EventDispatcherTest, deliversOnlyTheTypesOfTheMaskInOrderOfSubscription) {
    sp<RecordingReceiver> all = new RecordingReceiver();
    sp<RecordingReceiver> none = new RecordingReceiver();
    sp<RecordingReceiver> composed = new RecordingReceiver();
    EventDispatcher::subscribe(mUid, EventDispatcher::ALL_EVENTS, all);
    EventDispatcher::subscribe(mUid, EventDispatcher::NO_EVENTS, none);
    EventDispatcher::subscribe(mUid, eBufferComposedEvent, composed);

    EventDispatcher::broadcastEvent(mUid, eDelayChangedEvent, 7, nsecs_t{64'000'000});
    EventDispatcher::broadcastEvent(mUid, eBufferComposedEvent, 8, RenderState{});
    EventDispatcher::broadcastEvent(mUid + 1000000, eBufferComposedEvent, 9, RenderState{});

    EXPECT_THAT(all->types(), ElementsAre(eDelayChangedEvent, eBufferComposedEvent));
    EXPECT_EQ(64'000'000, std::get<nsecs_t>(all->events()[0].data));
    EXPECT_EQ(7, all->events()[0].time);
    EXPECT_THAT(none->types(), IsEmpty());
    EXPECT_THAT(composed->types(), ElementsAre(eBufferComposedEvent));

    // An entry subscribed with no events is still an entry: unsubscribing it finds it.
    LogCapture log(1);
    EventDispatcher::unsubscribe(mUid, EventDispatcher::NO_EVENTS, none);
    EXPECT_THAT(log.texts(), IsEmpty());
}

TEST_F(EventDispatcherTest, skipsAndReportsReceiversThatDiedSubscribed) {
    sp<RecordingReceiver> dead = new RecordingReceiver();
    sp<RecordingReceiver> alive = new RecordingReceiver();
    EventDispatcher::subscribe(mUid, EventDispatcher::ALL_EVENTS, dead);
    EventDispatcher::subscribe(mUid, EventDispatcher::ALL_EVENTS, alive);
    void* deadPointer = dead.get();
    dead.clear();

    LogCapture log(2);
    broadcast(eFrameReceivedEvent);
    broadcast(eFrameReceivedEvent);
    char expected[200];
    snprintf(expected, sizeof(expected),
             "EventDispatcher::broadcastEventLocked subscriber %p has been deallocated. Please "
             "unsubscribe before deallocation.",
             deadPointer);
    EXPECT_EQ(2, log.count(expected));  // the dead entry stays
    EXPECT_THAT(alive->types(), ElementsAre(1u, 1u));
}

TEST_F(EventDispatcherTest, logsSubscriptionsAndUnknownReceivers) {
    sp<RecordingReceiver> receiver = new RecordingReceiver();
    sp<RecordingReceiver> stranger = new RecordingReceiver();
    LogCapture log(2);
    EventDispatcher::unsubscribe(mUid, 1, receiver);
    EventDispatcher::subscribe(mUid, 5, receiver);
    EventDispatcher::unsubscribe(mUid, 1, stranger);
    EventDispatcher::unsubscribe(mUid, 5, receiver);

    char pointer[32], strangerPointer[32];
    snprintf(pointer, sizeof(pointer), "%p", receiver.get());
    snprintf(strangerPointer, sizeof(strangerPointer), "%p", stranger.get());
    const std::string uid = std::to_string(mUid);
    EXPECT_THAT(
            log.texts(),
            ElementsAre("EventDispatcher::unsubcribe uid " + uid + " flag 1 subscriber " + pointer,
                        "EventDispatcher::unsubscribeLocked no subscribers for uid " + uid,
                        "EventDispatcher::subscribe uid " + uid + " flag 5 subscriber " + pointer,
                        "EventDispatcher::unsubcribe uid " + uid + " flag 1 subscriber " +
                                strangerPointer,
                        std::string("EventDispatcher::unsubscribeLocked no subscriber ") +
                                strangerPointer + " found for uid " + uid,
                        "EventDispatcher::unsubcribe uid " + uid + " flag 5 subscriber " + pointer));
}

// Two receiver subobjects of one object share its reference block but are two receivers.
class FirstReceiver : public RecordingReceiver {};
class SecondReceiver : public EventDispatcher::EventReceiver {};
class TwoFacedReceiver : public FirstReceiver, public SecondReceiver {
public:
    void onEvent(const EventType& type, const nsecs_t& time, const EventData& data) override {
        FirstReceiver::onEvent(type, time, data);
    }
};

TEST_F(EventDispatcherTest, subobjectsSharingAReferenceBlockAreDistinctReceivers) {
    sp<TwoFacedReceiver> receiver = new TwoFacedReceiver();
    wp<EventDispatcher::EventReceiver> first = static_cast<FirstReceiver*>(receiver.get());
    wp<EventDispatcher::EventReceiver> second = static_cast<SecondReceiver*>(receiver.get());
    ASSERT_EQ(first.get_refs(), second.get_refs());

    EventDispatcher::subscribe(mUid, eFrameReceivedEvent, first);
    EventDispatcher::subscribe(mUid, eFrameReceivedEvent, second);
    broadcast(eFrameReceivedEvent);
    EXPECT_THAT(receiver->types(), ElementsAre(1u, 1u));

    EventDispatcher::unsubscribe(mUid, eFrameReceivedEvent, second);
    broadcast(eFrameReceivedEvent);
    EXPECT_THAT(receiver->types(), ElementsAre(1u, 1u, 1u));
    EventDispatcher::unsubscribe(mUid, eFrameReceivedEvent, first);
}

// A receiver that unsubscribes when its last strong reference goes, as every component does.
class SelfUnsubscribingReceiver : public EventDispatcher::EventReceiver {
public:
    SelfUnsubscribingReceiver(uint32_t uid, sp<SelfUnsubscribingReceiver>* owner)
        : mUid(uid), mOwner(owner) {}
    void onEvent(const EventType&, const nsecs_t&, const EventData&) override {
        mOwner->clear();  // as if the owner let go on another thread during the broadcast
    }
    void onLastStrongRef(const void*) override {
        EventDispatcher::unsubscribe(mUid, EventDispatcher::ALL_EVENTS, this);
    }

private:
    const uint32_t mUid;
    sp<SelfUnsubscribingReceiver>* mOwner;
};

TEST_F(EventDispatcherTest, receiverReleasedDuringABroadcastUnsubscribesAfterIt) {
    sp<SelfUnsubscribingReceiver> receiver;
    receiver = new SelfUnsubscribingReceiver(mUid, &receiver);
    EventDispatcher::subscribe(mUid, EventDispatcher::ALL_EVENTS, receiver);
    wp<SelfUnsubscribingReceiver> weak = receiver;

    broadcast(eFrameReceivedEvent);  // would deadlock if the reference were dropped under the lock

    EXPECT_EQ(nullptr, weak.promote());
    LogCapture log(1);
    broadcast(eFrameReceivedEvent);
    EXPECT_TRUE(log.contains("EventDispatcher::broadcastEventLocked no subscribers for uid " +
                             std::to_string(mUid)));
}

}  // namespace
}  // namespace android::Interpolation
