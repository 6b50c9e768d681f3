#pragma once

#include <atomic>
#include <condition_variable>
#include <cstddef>
#include <deque>
#include <mutex>
#include <optional>
#include <utility>

namespace VeltoHost {

// A first-in first-out queue between one thread that produces items and
// another that consumes them, holding at most `capacity` items: a producer
// that runs ahead waits for room, so memory stays bounded however far ahead
// it could get.
//
// Either side ends the exchange with close(). After it, a push takes nothing
// and says so (a producer waiting for room wakes up at once: the consumer has
// gone), while pop() still hands out what was queued before the close, in
// order, and then says there is nothing more (a consumer waiting for an item
// wakes up at once: the producer has finished).
//
// A template, so it lives in its header alone.
template <typename T>
class BoundedQueue {
public:
    // A capacity of 0 is taken as 1: a queue that can hold nothing would
    // leave its producer waiting for ever.
    explicit BoundedQueue(std::size_t capacity) : _capacity(capacity > 0 ? capacity : 1) {}
    BoundedQueue(const BoundedQueue&) = delete;
    BoundedQueue& operator=(const BoundedQueue&) = delete;

    // Waits until there is room, then appends `item`; false (and `item`
    // dropped) when the queue is closed first.
    bool push(T item)
    {
        {
            std::unique_lock lock(_mutex);
            _roomMade.wait(lock, [this] { return _items.size() < _capacity || _closed; });
            if (_closed) return false;
            _items.push_back(std::move(item));
        }
        _itemAdded.notify_one();
        return true;
    }

    // Waits until there is an item and takes the oldest; nothing once the
    // queue is closed and every item queued before has been taken.
    std::optional<T> pop()
    {
        std::optional<T> item;
        {
            std::unique_lock lock(_mutex);
            _itemAdded.wait(lock, [this] { return !_items.empty() || _closed; });
            if (_items.empty()) return std::nullopt;
            item.emplace(std::move(_items.front()));
            _items.pop_front();
        }
        _roomMade.notify_one();
        return item;
    }

    // Ends the exchange for both sides and wakes whichever of them waits.
    void close()
    {
        {
            std::lock_guard lock(_mutex);
            _closed = true;
            _closedFlag.store(true, std::memory_order_release);
        }
        _roomMade.notify_all();
        _itemAdded.notify_all();
    }

    // Without the lock, so that a producer may ask as often as it likes.
    bool closed() const noexcept { return _closedFlag.load(std::memory_order_acquire); }

    std::size_t capacity() const noexcept { return _capacity; }
    std::size_t size() const
    {
        std::lock_guard lock(_mutex);
        return _items.size();
    }

private:
    const std::size_t _capacity;
    mutable std::mutex _mutex;
    std::condition_variable _roomMade;
    std::condition_variable _itemAdded;
    // Guarded by _mutex.
    std::deque<T> _items;
    bool _closed = false;
    // _closed, for readers that do not take the lock.
    std::atomic<bool> _closedFlag{false};
};

}  // namespace VeltoHost
