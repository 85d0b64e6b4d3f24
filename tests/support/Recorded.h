// What callbacks report from any thread, kept for the test thread to read or wait for.
#pragma once

#include <chrono>
#include <condition_variable>
#include <functional>
#include <mutex>
#include <utility>
#include <vector>

namespace TavoPlayer::test {

// Generous: tests wait for events, they never time them.
constexpr std::chrono::seconds kDeadline{20};

template <typename T>
class Recorded {
public:
    // Notified under the lock: a waiter that sees the value may end the test and destroy
    // this recorder at once, so the callback's thread must be done with it by then.
    void push(T value) {
        std::lock_guard<std::mutex> lock(mMutex);
        mValues.push_back(std::move(value));
        mChanged.notify_all();
    }
    std::vector<T> snapshot() const {
        std::lock_guard<std::mutex> lock(mMutex);
        return mValues;
    }
    // What `read` finds in the values, read under the lock without copying them.
    template <typename Read>
    auto read(Read&& read) const {
        std::lock_guard<std::mutex> lock(mMutex);
        return read(mValues);
    }
    // What came so far, forgotten once taken.
    std::vector<T> take() {
        std::lock_guard<std::mutex> lock(mMutex);
        return std::exchange(mValues, {});
    }
    bool waitFor(const std::function<bool(const std::vector<T>&)>& done,
                 std::chrono::milliseconds deadline = kDeadline) const {
        std::unique_lock<std::mutex> lock(mMutex);
        return mChanged.wait_for(lock, deadline, [&] { return done(mValues); });
    }

private:
    mutable std::mutex mMutex;
    mutable std::condition_variable mChanged;
    std::vector<T> mValues;
};

}  // namespace TavoPlayer::test
