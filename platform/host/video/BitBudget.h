#pragma once

#include <cstddef>
#include <cstdint>

namespace platform {
namespace host {

// The host encoder's rate control: a budget of bytes that fills at the asked bit rate and is
// spent by each encoded picture. Pictures that cost more than their share raise the quantiser
// for the next ones, pictures that cost less lower it, and what a picture at the lowest
// quantiser still leaves unspent is topped up with filler data, so that the stream holds the
// asked rate whether the picture is still or in full motion.
// Thread contract: a plain value, used by the one thread that encodes.
class BitBudget {
public:
    static constexpr int kMinQp = 12;
    static constexpr int kMaxQp = 51;
    static constexpr int kStartQp = 30;

    BitBudget(int bitrate, int fps);

    // The quantiser for the next picture.
    int qp() const { return qp_; }
    // Accounts a picture of `bytes`; returns the filler bytes to send after it (0: none).
    size_t spend(size_t bytes, bool key);

    // Bytes over (positive) or under (negative) the budget so far.
    int64_t balance() const { return balance_; }
    int64_t share() const { return share_; }

private:
    int64_t share_;   // one picture's share of the rate, in bytes
    int64_t window_;  // a second of the rate, in bytes
    int64_t balance_ = 0;
    int qp_ = kStartQp;
};

}  // namespace host
}  // namespace platform
