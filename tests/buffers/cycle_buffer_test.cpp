#include "buffers/cycle_buffer.h"

#include <gtest/gtest.h>

#include <atomic>
#include <chrono>
#include <cstring>
#include <memory>
#include <random>
#include <string>
#include <thread>
#include <vector>

#include "base/Clocks.h"
#include "platform/fake/FakePlatform.h"

namespace {

constexpr const char* kTag = "orvex:::cycle_buffer";

std::vector<unsigned char> Bytes(size_t n, unsigned char seed) {
    std::vector<unsigned char> v(n);
    for (size_t i = 0; i < n; ++i) v[i] = static_cast<unsigned char>(seed + i * 7);
    return v;
}

class CycleBufferTest : public ::testing::Test {
protected:
    // Buffer_Item is a megabyte: keep it on the heap.
    std::unique_ptr<Buffer_Item> item = std::make_unique<Buffer_Item>();
    platform::fake::FakePlatform fake;
};

TEST_F(CycleBufferTest, RawWriteFitsExactlyAndRefusesOneByteMore) {
    cycle_buffer ring(16);
    EXPECT_EQ(ring.free_space(), 15u);
    auto data = Bytes(16, 1);
    EXPECT_EQ(ring.write(data.data(), 16), 0);
    EXPECT_EQ(ring.used_space(), 0u);
    EXPECT_EQ(fake.log.Texts(kTag),
              (std::vector<std::string>{
                  "\n cycle_buffer::write:free_space_size < len free_space_size:15,len:16,\n"}));
    EXPECT_EQ(ring.write(data.data(), 15), 15);
    EXPECT_EQ(ring.free_space(), 0u);
    EXPECT_EQ(ring.used_space(), 15u);
    std::vector<unsigned char> out(15);
    EXPECT_EQ(ring.read(out.data(), 15), 15);
    EXPECT_EQ(0, memcmp(out.data(), data.data(), 15));
}

TEST_F(CycleBufferTest, RawReadIsAllOrNothingAndWaitsForFirstWrite) {
    cycle_buffer ring(32);
    unsigned char out[8];
    EXPECT_EQ(ring.read(out, 0), 0);  // not readable before anything was written
    auto data = Bytes(5, 9);
    ASSERT_EQ(ring.write(data.data(), 5), 5);
    EXPECT_EQ(ring.read(out, 6), 0);
    EXPECT_EQ(ring.used_space(), 5u);
    EXPECT_EQ(ring.read(out, 5), 5);
    EXPECT_EQ(ring.write(nullptr, 3), 0);
    EXPECT_EQ(ring.write(data.data(), -1), 0);
}

TEST_F(CycleBufferTest, ItemNeedsLengthPlusHeaderFree) {
    cycle_buffer ring(20);  // 19 free
    auto data = Bytes(12, 3);
    EXPECT_FALSE(ring.newwrite(data.data(), 12, 5, false));  // needs 20
    EXPECT_EQ(ring.used_space(), 0u);
    EXPECT_EQ(fake.log.Texts(kTag),
              (std::vector<std::string>{
                  "\n cycle_buffer::newwrite:free_space_size < ( len + buffer_item_header_size ) "
                  "free_space_size:19,len:12,buffer_item_header_size:8,\n"}));
    EXPECT_TRUE(ring.newwrite(data.data(), 11, 5, false));
    EXPECT_EQ(ring.free_space(), 0u);
}

// Every start position of the storage, so header and payload each straddle the end somewhere.
TEST_F(CycleBufferTest, ItemsReadBackIntactFromEveryOffset) {
    constexpr unsigned kCapacity = 37;
    for (unsigned offset = 0; offset < kCapacity; ++offset) {
        for (int len : {1, 4, 13, 20}) {
            cycle_buffer ring(kCapacity);
            auto pad = Bytes(offset, 0);
            unsigned char sink[kCapacity];
            ASSERT_EQ(ring.write(pad.data(), static_cast<int>(offset)), static_cast<int>(offset));
            ASSERT_EQ(ring.read(sink, static_cast<int>(offset)), static_cast<int>(offset));
            auto data = Bytes(len, static_cast<unsigned char>(offset));
            ASSERT_TRUE(ring.newwrite(data.data(), len, 0xA1B2C3D4u, false));
            ASSERT_TRUE(ring.newread(*item)) << "offset " << offset << " len " << len;
            EXPECT_EQ(item->length, len);
            EXPECT_EQ(item->timestamp, 0xA1B2C3D4u);
            EXPECT_EQ(0, memcmp(item->data, data.data(), len)) << "offset " << offset;
            EXPECT_EQ(ring.used_space(), 0u);
        }
    }
}

TEST_F(CycleBufferTest, FewerThanNineBytesIsNoItemAndNoMessage) {
    cycle_buffer ring(64);
    unsigned char none = 0;
    ASSERT_TRUE(ring.newwrite(&none, 0, 1, false));  // an empty item: header only, 8 bytes
    EXPECT_FALSE(ring.newread(*item));
    EXPECT_TRUE(fake.log.Texts(kTag).empty());
    unsigned char one = 0x5A;
    ASSERT_TRUE(ring.newwrite(&one, 1, 2, false));
    ASSERT_TRUE(ring.newread(*item));  // the empty item comes out once more follows
    EXPECT_EQ(item->length, 0);
    ASSERT_TRUE(ring.newread(*item));
    EXPECT_EQ(item->length, 1);
    EXPECT_EQ(item->data[0], 0x5A);
}

TEST_F(CycleBufferTest, OversizeItemInvalidatesTheStreamForGood) {
    cycle_buffer ring(2100000);
    std::vector<unsigned char> big(kFrameSizeMax + 1, 0x42);
    ASSERT_TRUE(ring.newwrite(big.data(), kFrameSizeMax, 7, false));
    ASSERT_TRUE(ring.newread(*item));
    EXPECT_EQ(item->length, kFrameSizeMax);
    EXPECT_EQ(item->data[kFrameSizeMax - 1], 0x42);

    ASSERT_TRUE(ring.newwrite(big.data(), kFrameSizeMax + 1, 7, false));
    EXPECT_FALSE(ring.newread(*item));
    EXPECT_EQ(ring.used_space(), static_cast<unsigned>(kFrameSizeMax + 1));  // payload unread
    EXPECT_FALSE(ring.item_stream_valid());

    ::testing::internal::CaptureStdout();
    EXPECT_FALSE(ring.newread(*item));
    ring.reset();
    unsigned char one = 1;
    ASSERT_TRUE(ring.newwrite(&one, 1, 7, false));
    EXPECT_FALSE(ring.newread(*item));
    EXPECT_EQ(::testing::internal::GetCapturedStdout(),
              "\n video FRAME_SIZE is not enough !--1 \n"
              "\n video FRAME_SIZE is not enough !--1 \n");
    EXPECT_EQ(fake.log.Texts(kTag),
              (std::vector<std::string>{
                  "\n video FRAME_SIZE is not enough,bufferitem.length  = 1000001,! --2 \n",
                  "\n video FRAME_SIZE is not enough !--1 \n",
                  "\n video FRAME_SIZE is not enough !--1 \n"}));
}

TEST_F(CycleBufferTest, TimestampZeroIsStampedWithMonotonicMilliseconds) {
    cycle_buffer ring(256);
    unsigned char byte = 1;
    unsigned before = GetTimeStampMillsec();
    ASSERT_TRUE(ring.newwrite(&byte, 1, 0, false));
    unsigned after = GetTimeStampMillsec();
    ASSERT_TRUE(ring.newread(*item));
    EXPECT_LE(item->timestamp - before, after - before);  // within [before, after], wrap-safe
}

// A producer and a consumer thread move 100 MB of random-sized items; every byte, length and
// time stamp is checked, in order.
TEST_F(CycleBufferTest, ProducerAndConsumerMove100MegabytesIntact) {
    constexpr size_t kTotal = 100u * 1000 * 1000;
    constexpr int kMaxItem = 60000;
    cycle_buffer ring(500000);
    // Item i carries the pattern from offset i % 251, so the consumer can check it cheaply.
    std::vector<unsigned char> pattern(kMaxItem + 256);
    for (size_t i = 0; i < pattern.size(); ++i)
        pattern[i] = static_cast<unsigned char>(i * 131 + (i >> 8));

    std::vector<int> sizes;
    std::mt19937 rng(12345);
    std::uniform_int_distribution<int> dist(1, kMaxItem);
    for (size_t sum = 0; sum < kTotal;) {
        sizes.push_back(dist(rng));
        sum += static_cast<size_t>(sizes.back());
    }

    std::thread producer([&] {
        for (size_t i = 0; i < sizes.size(); ++i) {
            // Wait for room first: a refused newwrite prints a message each time.
            while (ring.free_space() < static_cast<unsigned>(sizes[i]) + kItemHeaderSize) {
                std::this_thread::yield();
            }
            ASSERT_TRUE(ring.newwrite(pattern.data() + i % 251, sizes[i],
                                      static_cast<unsigned>(i + 1), false));
        }
    });
    size_t bad = 0;
    for (size_t i = 0; i < sizes.size(); ++i) {
        while (!ring.newread(*item)) std::this_thread::yield();
        if (item->length != sizes[i] || item->timestamp != i + 1 ||
            memcmp(item->data, pattern.data() + i % 251, static_cast<size_t>(sizes[i])) != 0) {
            ++bad;
        }
    }
    producer.join();
    EXPECT_EQ(bad, 0u);
    EXPECT_EQ(ring.used_space(), 0u);
    EXPECT_TRUE(fake.log.Texts(kTag).empty());
}

// The consumer's wait ends on the write that completes what it asked for, not on an earlier
// smaller one. The bound is an hour, so only a write (or a lost wake-up: a hang) ends it.
constexpr unsigned kHour = 3600 * 1000;

TEST_F(CycleBufferTest, WaitReadableEndsOnlyWhenEnoughIsThere) {
    cycle_buffer ring(100000);
    auto chunk = Bytes(1000, 3);
    for (uint32_t wanted : {1u, 1000u, 3840u}) {
        std::atomic<bool> waiting{false};
        unsigned seen = 0;
        bool waited = false;
        std::thread consumer([&] {
            waiting = true;
            waited = ring.wait_readable(wanted, kHour);
            seen = ring.used_space();
        });
        while (!waiting) std::this_thread::yield();
        for (uint32_t put = 0; put < wanted; put += 1000) {
            std::this_thread::sleep_for(std::chrono::milliseconds(2));  // let it sleep first
            ASSERT_EQ(ring.write(chunk.data(), 1000), 1000);
        }
        consumer.join();
        EXPECT_TRUE(waited);
        EXPECT_GE(seen, wanted);
        EXPECT_FALSE(ring.wait_readable(wanted, kHour));  // there already: no wait at all
        std::vector<unsigned char> sink(ring.used_space());
        ring.read(sink.data(), static_cast<int>(sink.size()));
    }
}

TEST_F(CycleBufferTest, WakeReaderEndsTheWaitUnderWayOrTheNextOne) {
    cycle_buffer ring(1000);
    ring.wake_reader();
    ring.wait_readable(1, kHour);  // woken before it began
    std::thread consumer([&] { ring.wait_readable(1, kHour); });
    std::this_thread::sleep_for(std::chrono::milliseconds(5));
    ring.wake_reader();
    consumer.join();
    EXPECT_EQ(ring.used_space(), 0u);
}

// A send loop's shape: take what is there, else wait for a write. 20000 items from a producer
// that sometimes pauses; a wake-up lost between the look and the wait would hang it.
TEST_F(CycleBufferTest, WaitingConsumerMissesNoItem) {
    cycle_buffer ring(4096);
    constexpr unsigned kItems = 20000;
    std::thread producer([&] {
        std::mt19937 rng(7);
        unsigned char payload[100] = {};
        for (unsigned i = 1; i <= kItems; ++i) {
            while (ring.free_space() < sizeof payload + kItemHeaderSize) std::this_thread::yield();
            ASSERT_TRUE(ring.newwrite(payload, 1 + static_cast<int>(i % 100), i, false));
            if (rng() % 8 == 0) std::this_thread::yield();
        }
    });
    unsigned next = 1;
    while (next <= kItems) {
        if (!ring.newread(*item)) {
            ring.wait_readable(kItemHeaderSize + 1, kHour);
            continue;
        }
        ASSERT_EQ(item->timestamp, next);
        ++next;
    }
    producer.join();
}

// Stress rounds for writers that run alongside each other and alongside reset. Items carry
// their own check: the time stamp is (writer << 16 | sequence + 1), the length follows from it and
// payload byte i is (stamp + i) mod 256. Each round starts with the positions one byte before
// the end of storage that is filled with junk, so a stale position points into the middle of an
// item that wrapped. Items are a few kilobytes, so writers spend their time copying.
constexpr int kStressItemMax = 3000;

struct StressItem {
    // Never 0, which would have the ring stamp the item itself.
    static unsigned Stamp(unsigned writer, unsigned seq) { return writer << 16 | (seq + 1); }
    static int Length(unsigned stamp) { return 9 + static_cast<int>(stamp * 997 % kStressItemMax); }
    static const unsigned char* Payload(unsigned stamp) {
        static const std::vector<unsigned char> ramp = [] {
            std::vector<unsigned char> v(kStressItemMax + 300);
            for (size_t i = 0; i < v.size(); ++i) v[i] = static_cast<unsigned char>(i);
            return v;
        }();
        return ramp.data() + (stamp & 0xFF);
    }
};

void WrapAtEndOverJunk(cycle_buffer& ring) {
    std::vector<unsigned char> junk(ring.capacity() - 1, 0xEE);
    int n = static_cast<int>(junk.size());
    ASSERT_EQ(ring.write(junk.data(), n), n);
    ASSERT_EQ(ring.read(junk.data(), n), n);
}

bool WriteStressItem(cycle_buffer& ring, unsigned writer, unsigned seq) {
    unsigned stamp = StressItem::Stamp(writer, seq);
    return ring.newwrite(StressItem::Payload(stamp), StressItem::Length(stamp), stamp, false);
}

// Drains the ring; true when every item is whole and each writer's items come in order.
bool DrainIsWellFormed(cycle_buffer& ring, Buffer_Item& item, unsigned writers, size_t* count) {
    std::vector<int> last(writers, -1);
    *count = 0;
    while (ring.newread(item)) {
        unsigned writer = item.timestamp >> 16;
        int seq = static_cast<int>(item.timestamp & 0xFFFF);
        if (writer >= writers || item.length != StressItem::Length(item.timestamp) ||
            seq <= last[writer]) {
            return false;
        }
        if (memcmp(item.data, StressItem::Payload(item.timestamp),
                   static_cast<size_t>(item.length)) != 0) {
            return false;
        }
        last[writer] = seq;
        ++*count;
    }
    return ring.item_stream_valid() && ring.used_space() == 0;
}

// A reset while a producer is inside newwrite must leave an empty ring or whole items behind,
// never a write position that the reset already took back.
TEST_F(CycleBufferTest, ResetDuringWritesLeavesAWellFormedRing) {
    constexpr int kRounds = 200;
    constexpr unsigned kItems = 64;
    int bad = 0;
    for (int round = 0; round < kRounds; ++round) {
        cycle_buffer ring(kItems * (kStressItemMax + 20));
        WrapAtEndOverJunk(ring);
        std::atomic<unsigned> written{0};
        std::atomic<bool> reset_done{false};
        // Writes until a few items after the reset, or until the ring is full.
        std::thread producer([&] {
            unsigned after_reset = 0;
            for (unsigned seq = 0; seq < 0xFFFF && after_reset < 4; ++seq) {
                unsigned stamp = StressItem::Stamp(0, seq);
                if (ring.free_space() < StressItem::Length(stamp) + 8u) {
                    while (!reset_done.load()) std::this_thread::yield();
                }
                WriteStressItem(ring, 0, seq);
                written.store(seq + 1);
                if (reset_done.load()) ++after_reset;
            }
        });
        while (written.load() < 1 + static_cast<unsigned>(round) % 4) std::this_thread::yield();
        ring.reset();
        reset_done.store(true);
        producer.join();
        size_t count = 0;
        if (!DrainIsWellFormed(ring, *item, 1, &count)) ++bad;
    }
    EXPECT_EQ(bad, 0) << "of " << kRounds << " rounds";
}

// Producers on several threads at once (binder pool threads): every item arrives whole.
TEST_F(CycleBufferTest, ConcurrentWritersEachItemArrivesWhole) {
    constexpr int kRounds = 100;
    constexpr unsigned kWriters = 3;
    constexpr unsigned kItems = 40;
    int bad = 0;
    for (int round = 0; round < kRounds; ++round) {
        cycle_buffer ring(kWriters * kItems * (kStressItemMax + 20));
        WrapAtEndOverJunk(ring);
        std::atomic<unsigned> ready{0};
        std::vector<std::thread> producers;
        for (unsigned w = 0; w < kWriters; ++w) {
            producers.emplace_back([&, w] {
                ready.fetch_add(1);
                while (ready.load() < kWriters) std::this_thread::yield();
                for (unsigned seq = 0; seq < kItems; ++seq) WriteStressItem(ring, w, seq);
            });
        }
        for (auto& t : producers) t.join();
        size_t count = 0;
        if (!DrainIsWellFormed(ring, *item, kWriters, &count) || count != kWriters * kItems) {
            ++bad;
        }
    }
    EXPECT_EQ(bad, 0) << "of " << kRounds << " rounds";
}

}  // namespace
