#pragma once

#include <utils/Timers.h>

#include <algorithm>
#include <cstdint>
#include <utility>
#include <vector>

namespace verolux::sim {

// Events in the order they are due: by time, and events due at the same time in the order they
// were pushed, so that a run plays the same way every time. Its memory is what is pending.
template <typename Event>
class EventQueue {
public:
    void push(nsecs_t time, Event event) {
        mHeap.push_back({time, mPushed++, std::move(event)});
        std::push_heap(mHeap.begin(), mHeap.end(), Later());
    }
    bool empty() const { return mHeap.empty(); }
    size_t size() const { return mHeap.size(); }
    // When the next event is due; the queue must not be empty.
    nsecs_t nextTime() const { return mHeap.front().time; }
    // Removes the next event; the queue must not be empty.
    std::pair<nsecs_t, Event> pop() {
        std::pop_heap(mHeap.begin(), mHeap.end(), Later());
        Entry entry = std::move(mHeap.back());
        mHeap.pop_back();
        return {entry.time, std::move(entry.event)};
    }

private:
    struct Entry {
        nsecs_t time;
        uint64_t order;
        Event event;
    };
    // The heap keeps the greatest on top: "later" is the lesser.
    struct Later {
        bool operator()(const Entry& a, const Entry& b) const {
            return a.time != b.time ? a.time > b.time : a.order > b.order;
        }
    };

    std::vector<Entry> mHeap;
    uint64_t mPushed = 0;
};

}  // namespace verolux::sim
