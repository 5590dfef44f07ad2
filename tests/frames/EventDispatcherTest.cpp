#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <utils/String8.h>

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

std::string pointer(const void* p) {
    return String8::format("%p", p).c_str();
}

class EventDispatcherTest : public testing::Test {
protected:
    void broadcast(EventType type) { EventDispatcher::broadcastEvent(mUid, type, 1, 0); }

    const uint32_t mUid = test::nextTestUid();
    const std::string mUidText = std::to_string(mUid);
};

TEST_F(EventDispatcherTest, subscriptionsWidenAndNarrowOneEntryAndAreLogged) {
    sp<RecordingReceiver> receiver = new RecordingReceiver();
    sp<RecordingReceiver> stranger = new RecordingReceiver();
    LogCapture log(2);
    EventDispatcher::unsubscribe(mUid, 1, receiver);
    EventDispatcher::subscribe(mUid, 1, receiver);
    EventDispatcher::subscribe(mUid, 2, receiver);
    broadcast(eFrameReceivedEvent);
    broadcast(eFrameReleasedEvent);
    EXPECT_THAT(receiver->types(), ElementsAre(1u, 2u));  // once each: one entry

    EventDispatcher::unsubscribe(mUid, 1, stranger);
    EventDispatcher::unsubscribe(mUid, 1, receiver);
    broadcast(eFrameReceivedEvent);
    broadcast(eFrameReleasedEvent);
    EXPECT_THAT(receiver->types(), ElementsAre(1u, 2u, 2u));

    EventDispatcher::unsubscribe(mUid, 2, receiver);
    broadcast(eFrameReleasedEvent);  // the emptied vector is erased...
    broadcast(eFrameReleasedEvent);  // ...so this one finds no entry at all
    EXPECT_THAT(receiver->types(), ElementsAre(1u, 2u, 2u));
    const std::string uid = " uid " + mUidText, r = pointer(receiver.get());
    const std::string noSubscribers =
            "EventDispatcher::broadcastEventLocked no subscribers for" + uid;
    EXPECT_THAT(log.texts(),
                ElementsAre("EventDispatcher::unsubcribe" + uid + " flag 1 subscriber " + r,
                            "EventDispatcher::unsubscribeLocked no subscribers for" + uid,
                            "EventDispatcher::subscribe" + uid + " flag 1 subscriber " + r,
                            "EventDispatcher::subscribe" + uid + " flag 2 subscriber " + r,
                            "EventDispatcher::unsubcribe" + uid + " flag 1 subscriber " +
                                    pointer(stranger.get()),
                            "EventDispatcher::unsubscribeLocked no subscriber " +
                                    pointer(stranger.get()) + " found for" + uid,
                            "EventDispatcher::unsubcribe" + uid + " flag 1 subscriber " + r,
                            "EventDispatcher::unsubcribe" + uid + " flag 2 subscriber " + r,
                            noSubscribers, noSubscribers));
}

TEST_F(EventDispatcherTest, deliversTheTypesOfEachMaskAndSkipsReceiversThatDiedSubscribed) {
    sp<RecordingReceiver> dead = new RecordingReceiver();
    sp<RecordingReceiver> all = new RecordingReceiver();
    sp<RecordingReceiver> none = new RecordingReceiver();
    sp<RecordingReceiver> composed = new RecordingReceiver();
    EventDispatcher::subscribe(mUid, EventDispatcher::ALL_EVENTS, dead);
    EventDispatcher::subscribe(mUid, EventDispatcher::ALL_EVENTS, all);
    EventDispatcher::subscribe(mUid, EventDispatcher::NO_EVENTS, none);
    EventDispatcher::subscribe(mUid, eBufferComposedEvent, composed);
    const std::string deadLine = "EventDispatcher::broadcastEventLocked subscriber " +
                                 pointer(dead.get()) +
                                 " has been deallocated. Please unsubscribe before deallocation.";
    dead.clear();

    LogCapture log(2);
    EventDispatcher::broadcastEvent(mUid, eDelayChangedEvent, 7, nsecs_t{64'000'000});
    EventDispatcher::broadcastEvent(mUid, eBufferComposedEvent, 8, RenderState{});
    EventDispatcher::broadcastEvent(mUid + 1000000, eBufferComposedEvent, 9, RenderState{});
    EXPECT_THAT(all->types(), ElementsAre(eDelayChangedEvent, eBufferComposedEvent));
    EXPECT_EQ(64'000'000, std::get<nsecs_t>(all->events()[0].data));
    EXPECT_EQ(7, all->events()[0].time);
    EXPECT_THAT(none->types(), IsEmpty());
    EXPECT_THAT(composed->types(), ElementsAre(eBufferComposedEvent));

    // An entry subscribed with no events is still an entry: unsubscribing it finds it. The dead
    // entry stays, and is reported at every broadcast that it matches.
    EventDispatcher::unsubscribe(mUid, EventDispatcher::NO_EVENTS, none);
    EXPECT_THAT(log.texts(),
                ElementsAre(deadLine, deadLine,
                            "EventDispatcher::broadcastEventLocked no subscribers for uid " +
                                    std::to_string(mUid + 1000000),
                            "EventDispatcher::unsubcribe uid " + mUidText + " flag 0 subscriber " +
                                    pointer(none.get())));
}

// Two receiver subobjects of one object share its reference block but are two receivers.
class SecondReceiver : public EventDispatcher::EventReceiver {};
class TwoFacedReceiver : public RecordingReceiver, public SecondReceiver {
public:
    void onEvent(const EventType& type, const nsecs_t& time, const EventData& data) override {
        RecordingReceiver::onEvent(type, time, data);
    }
};

TEST_F(EventDispatcherTest, subobjectsSharingAReferenceBlockAreDistinctReceivers) {
    sp<TwoFacedReceiver> receiver = new TwoFacedReceiver();
    wp<EventDispatcher::EventReceiver> first = static_cast<RecordingReceiver*>(receiver.get());
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

TEST_F(EventDispatcherTest, aUidErasedAfterABroadcastIsFoundAnewWhenSubscribedAgain) {
    sp<RecordingReceiver> first = new RecordingReceiver();
    sp<RecordingReceiver> second = new RecordingReceiver();
    EventDispatcher::subscribe(mUid, EventDispatcher::ALL_EVENTS, first);
    broadcast(eFrameReceivedEvent);
    EventDispatcher::unsubscribe(mUid, EventDispatcher::ALL_EVENTS, first);
    broadcast(eFrameReceivedEvent);  // erases the emptied entry
    EventDispatcher::subscribe(mUid, EventDispatcher::ALL_EVENTS, second);
    broadcast(eFrameReleasedEvent);
    EXPECT_THAT(first->types(), ElementsAre(1u));
    EXPECT_THAT(second->types(), ElementsAre(2u));
    EventDispatcher::unsubscribe(mUid, EventDispatcher::ALL_EVENTS, second);
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
                             mUidText));
}

TEST_F(EventDispatcherTest, receiversBeyondTheOnesABroadcastKeepsAtHandAlsoUnsubscribeAfterIt) {
    std::vector<sp<SelfUnsubscribingReceiver>> receivers(40);
    for (sp<SelfUnsubscribingReceiver>& receiver : receivers) {
        receiver = new SelfUnsubscribingReceiver(mUid, &receiver);
        EventDispatcher::subscribe(mUid, EventDispatcher::ALL_EVENTS, receiver);
    }
    std::vector<wp<SelfUnsubscribingReceiver>> weak(receivers.begin(), receivers.end());

    broadcast(eFrameReceivedEvent);

    for (const wp<SelfUnsubscribingReceiver>& receiver : weak)
        EXPECT_EQ(nullptr, receiver.promote());
    LogCapture log(1);
    broadcast(eFrameReceivedEvent);
    EXPECT_TRUE(log.contains("EventDispatcher::broadcastEventLocked no subscribers for uid " +
                             mUidText));
}

}  // namespace
}  // namespace android::Interpolation
