// SPDX-License-Identifier: Apache-2.0
// Waiting by polling: pauses that grow, up to a deadline on the monotonic clock.
#pragma once

#include <algorithm>
#include <chrono>
#include <thread>

namespace veld {

using Clock = std::chrono::steady_clock;

class GrowingPause {
public:
    GrowingPause(Clock::duration first, Clock::duration longest) : next_(first), longest_(longest) {}

    // Sleeps, but never beyond the deadline. False, without sleeping, when the deadline has passed.
    bool sleepUntil(Clock::time_point deadline) {
        const auto left = deadline - Clock::now();
        if (left <= Clock::duration::zero())
            return false;
        std::this_thread::sleep_for(std::min(next_, left));
        next_ = std::min(next_ * 3 / 2, longest_);
        return true;
    }

private:
    Clock::duration next_;
    Clock::duration longest_;
};

}  // namespace veld
