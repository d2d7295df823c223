#include "platform/host/video/BitBudget.h"

#include <algorithm>

namespace platform {
namespace host {

BitBudget::BitBudget(int bitrate, int fps) {
    const int64_t rate = bitrate > 0 ? bitrate / 8 : 1;
    const int64_t per_second = fps > 0 ? fps : 1;
    share_ = std::max<int64_t>(1, rate / per_second);
    window_ = share_ * per_second;
}

size_t BitBudget::spend(size_t bytes, bool key) {
    balance_ += static_cast<int64_t>(bytes) - share_;
    // Over by a quarter second: quickly up; by a little: one step. A key frame costs several
    // shares by nature and is paid back by the pictures after it, so it lowers nothing.
    if (balance_ > window_ / 4) {
        qp_ += 2;
    } else if (balance_ > window_ / 20) {
        qp_ += 1;
    } else if (!key && balance_ <= 0 && static_cast<int64_t>(bytes) * 5 < share_ * 4) {
        qp_ -= 1;
    }
    qp_ = std::min(kMaxQp, std::max(kMinQp, qp_));
    if (balance_ >= 0) return 0;
    // What this picture left of its share goes out as filler behind it (the balance never
    // stays below zero, so this is at most one share).
    const int64_t filler = -balance_;
    balance_ = 0;
    return static_cast<size_t>(filler);
}

}  // namespace host
}  // namespace platform
