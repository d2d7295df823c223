#include <gtest/gtest.h>

#include <cstddef>
#include <cstdint>
#include <utility>
#include <vector>

#include "platform/host/video/BitBudget.h"

namespace {

using platform::host::BitBudget;

// 2048 kbit/s at 30 fps: a share of 8533 bytes a picture.
constexpr int kRate = 2048000;
constexpr int kFps = 30;

struct Picture {
    size_t bytes;
    bool key;
};

std::vector<Picture> Repeat(size_t bytes, int count, int key_every = 0) {
    std::vector<Picture> out;
    for (int i = 0; i < count; ++i) out.push_back({bytes, key_every > 0 && i % key_every == 0});
    return out;
}

TEST(BitBudgetTest, TheStreamHoldsTheRateWhateverThePicturesCost) {
    struct Case {
        const char* what;
        std::vector<Picture> pictures;
        int qp_after;          // the quantiser once they are spent
        bool every_share_met;  // each picture with its filler is exactly one share
    };
    std::vector<Picture> mixed;
    for (int i = 0; i < 300; ++i)
        mixed.push_back({static_cast<size_t>((i * 7919) % 20000), i % 60 == 0});
    const Case cases[] = {
        {"a still picture: the finest quantiser, the rest filler", Repeat(400, 60), 12, true},
        {"exactly the share: nothing changes", Repeat(8533, 60), BitBudget::kStartQp, true},
        {"three shares a picture: the quantiser climbs to its top", Repeat(3 * 8533, 60), 51,
         false},
        {"key frames of ten shares among still pictures: paid back, no climb to the top",
         [] {
             std::vector<Picture> v;
             for (int i = 0; i < 120; ++i) v.push_back({i % 60 == 0 ? 85330u : 400u, i % 60 == 0});
             return v;
         }(),
         12, false},
        {"pictures of every cost", mixed, -1, false},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.what);
        BitBudget budget(kRate, kFps);
        ASSERT_EQ(budget.share(), 8533);
        int64_t sent = 0;
        int previous_qp = budget.qp();
        for (const Picture& p : c.pictures) {
            size_t filler = budget.spend(p.bytes, p.key);
            EXPECT_LE(filler, 8533u);
            EXPECT_GE(budget.balance(), 0);
            if (c.every_share_met) {
                EXPECT_EQ(p.bytes + filler, 8533u);
            }
            if (p.key) {
                EXPECT_GE(budget.qp(), previous_qp) << "a key frame lowers nothing";
            }
            EXPECT_LE(budget.qp() - previous_qp, 2);
            EXPECT_GE(budget.qp() - previous_qp, -1);
            EXPECT_GE(budget.qp(), BitBudget::kMinQp);
            EXPECT_LE(budget.qp(), BitBudget::kMaxQp);
            previous_qp = budget.qp();
            sent += static_cast<int64_t>(p.bytes + filler);
        }
        // Whatever was sent beyond the shares is exactly the balance still owed.
        EXPECT_EQ(sent, static_cast<int64_t>(c.pictures.size()) * 8533 + budget.balance());
        if (c.qp_after >= 0) {
            EXPECT_EQ(budget.qp(), c.qp_after);
        }
    }
}

TEST(BitBudgetTest, NoRateOrFrameRateStillGivesAShare) {
    for (auto [rate, fps] : {std::pair{0, 0}, std::pair{-5, 30}, std::pair{8, 1000}}) {
        BitBudget budget(rate, fps);
        EXPECT_EQ(budget.share(), 1);
        EXPECT_EQ(budget.spend(0, false), 1u);
        EXPECT_EQ(budget.spend(SIZE_MAX / 4, true), 0u);
        EXPECT_EQ(budget.qp(), BitBudget::kStartQp - 1 + 2);  // one finer, then two coarser
    }
}

}  // namespace
