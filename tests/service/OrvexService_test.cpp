#include "service/OrvexService.h"

#include <gtest/gtest.h>

#include <memory>
#include <string>
#include <vector>

#include "config/GlobalConfig.h"
#include "platform/fake/FakePlatform.h"
#include "rtp/RtpPackets.h"
#include "rtsp/RtspTransport.h"
#include "server/RtspService_t.h"
#include "server/skyvo_rtsp.h"
#include "server/skyvo_service.h"
#include "tools/AccessUnitSplitter.h"

namespace {

using Bytes = std::vector<unsigned char>;

class OrvexServiceTest : public ::testing::Test {
protected:
    void SetUp() override {
        RtspTransport::SetSelectWaitMs(20);
        skyvo_rtsp_sever_init();
        ASSERT_EQ(skyvo_rtsp_sever_open(0), 0);
        ASSERT_EQ(android::OrvexService::instantiate(), 0);
        service = fake.binder.service("orvex.rtp");
        ASSERT_NE(service, nullptr);
    }
    void TearDown() override {
        skyvo_rtsp_sever_close();
        RtspTransport::SetSelectWaitMs(2000);
    }
    int Transact(uint32_t code, const platform::ParcelWriter& p) {
        platform::ParcelReader r(p.data().data(), p.data().size());
        return service->onTransact(code, r, 0);
    }
    static platform::ParcelWriter Frame(const Bytes& frame) {
        platform::ParcelWriter p;
        p.writeInt32(static_cast<int32_t>(frame.size()));
        p.writeInplace(frame.data(), frame.size());
        p.writeInt32(0);
        return p;
    }
    std::vector<Bytes> Items() {
        std::vector<Bytes> out;
        auto item = std::make_unique<Buffer_Item>();
        while (skyvo_rtsp_service()->listener()->video_ring().newread(*item)) {
            out.emplace_back(item->data, item->data + item->length);
        }
        return out;
    }

    platform::fake::FakePlatform fake;
    std::shared_ptr<platform::BinderService> service;
};

const Bytes kSps = {0, 0, 0, 1, 0x67, 0x42, 0xC0, 0x1E, 0x00, 0x00, 0x01, 0x02};  // 00 00 01 inside
const Bytes kPps = {0, 0, 0, 1, 0x68, 0xCE, 0x3C, 0x80};
const Bytes kIdr = {0, 0, 0, 1, 0x65, 0x88, 0x84, 0x00, 0x33};
const Bytes kSlice = {0, 0, 0, 1, 0x41, 0x9A, 0x02};

Bytes Cat(std::initializer_list<Bytes> parts) {
    Bytes out;
    for (const Bytes& p : parts) out.insert(out.end(), p.begin(), p.end());
    return out;
}

TEST_F(OrvexServiceTest, FramesBecomeRingItemsParameterSetsSplitByFourByteStartCodes) {
    struct Case {
        const char* name;
        uint32_t code;
        Bytes frame;
        int status;
        std::vector<Bytes> items;
    };
    const Case cases[] = {
        {"SPS+PPS: two items", 101, Cat({kSps, kPps}), 0, {kSps, kPps}},
        {"SPS+PPS+IDR: three items", 101, Cat({kSps, kPps, kIdr}), 0, {kSps, kPps, kIdr}},
        {"IDR alone: one item", 101, kIdr, 0, {kIdr}},
        {"code 0 is a frame too", 0, kSlice, 0, {kSlice}},
        {"code 2 goes to the base class", 2, kSlice, platform::kBinderUnknownTransaction, {}},
        {"PPS then slice", 101, Cat({kPps, kSlice}), 0, {kPps, kSlice}},
    };
    for (const Case& c : cases) {
        EXPECT_EQ(Transact(c.code, Frame(c.frame)), c.status) << c.name;
        EXPECT_EQ(Items(), c.items) << c.name;
    }
}

TEST_F(OrvexServiceTest, LyingOrShortParcelsNeverReadPastTheData) {
    struct Case {
        const char* name;
        platform::ParcelWriter parcel;
    };
    std::vector<Case> cases;
    {
        platform::ParcelWriter p;
        p.writeInt32(100000);  // claims far more than follows
        p.writeInplace(kIdr.data(), kIdr.size());
        cases.push_back({"length larger than the data", p});
    }
    {
        platform::ParcelWriter p;
        p.writeInt32(-5);
        cases.push_back({"negative length", p});
    }
    cases.push_back({"empty parcel", platform::ParcelWriter()});
    {
        platform::ParcelWriter p;
        p.writeInt32(2);
        p.writeInplace("\x00\x00", 2);
        cases.push_back({"two bytes", p});
    }
    for (const Case& c : cases) {
        std::vector<uint8_t> exact = c.parcel.data();  // exact size: ASan sees any overread
        platform::ParcelReader r(exact.data(), exact.size());
        EXPECT_EQ(service->onTransact(101, r, 0), platform::kBinderOk) << c.name;
    }
    std::vector<Bytes> items = Items();
    ASSERT_EQ(items.size(), 1u);  // only the two-byte frame was whole
    EXPECT_EQ(items[0], (Bytes{0, 0}));
}

// A picture from a stock encoder (delimiter, SEI, two slices), fed as orvex-feed feeds it: each
// NAL unit reaches the clients as its own packets, typed as itself.
TEST_F(OrvexServiceTest, FeedSendsEachNalUnitOfAnAccessUnitAsItsOwnFrame) {
    const Bytes aud = {0, 0, 0, 1, 0x09, 0xF0};
    const Bytes sei = {0, 0, 1, 0x06, 0x05, 0x02, 0xAA, 0xBB, 0x80};  // 3-byte start code
    const Bytes first = {0, 0, 0, 1, 0x41, 0x9A, 0x11, 0x22};         // first_mb_in_slice 0
    const Bytes second = {0, 0, 0, 1, 0x41, 0x3A, 0x33};              // first_mb_in_slice 2
    const Bytes next = {0, 0, 0, 1, 0x09, 0xF0};
    Bytes stream = Cat({aud, sei, first, second, next});
    std::vector<std::vector<uint8_t>> units = tools::SplitAccessUnits(stream.data(), stream.size());
    ASSERT_EQ(units.size(), 2u);
    for (const tools::Span& nal : tools::NalUnitSpans(units[0].data(), units[0].size())) {
        Bytes frame(units[0].begin() + static_cast<std::ptrdiff_t>(nal.begin),
                    units[0].begin() + static_cast<std::ptrdiff_t>(nal.end));
        ASSERT_EQ(Transact(101, Frame(frame)), platform::kBinderOk);
    }

    struct Packets : PacketSink {
        void Send(const unsigned char* packet, unsigned length) override {
            sent.emplace_back(packet + kRtpHeaderSize, packet + length);
        }
        std::vector<Bytes> sent;
    } packets;
    uint16_t sequence = 0;
    for (const Bytes& item : Items()) {
        PacketiseH264Item(item.data(), static_cast<unsigned>(item.size()), 0, 96, &sequence,
                          packets);
    }
    const std::vector<Bytes> payloads = {
        {0x09, 0xF0},
        {0x06, 0x05, 0x02, 0xAA, 0xBB, 0x80},
        {0x41, 0x9A, 0x11, 0x22},
        {0x41, 0x3A, 0x33},
    };
    EXPECT_EQ(packets.sent, payloads);
}

TEST(ParcelTest, ReaderTableStaysInsideItsData) {
    const uint8_t data[] = {1, 0, 0, 0, 'a', 'b', 'c', 0, 7, 0};
    platform::ParcelReader r(data, sizeof data);
    EXPECT_EQ(r.readInt32(), 1);
    const uint8_t* in_place = r.readInplace(3);
    ASSERT_NE(in_place, nullptr);
    EXPECT_EQ(in_place[2], 'c');
    EXPECT_EQ(r.dataAvail(), 2u);  // padded to four
    EXPECT_EQ(r.readInt32(), 0);   // two bytes left: missing reads as 0
    EXPECT_EQ(r.dataAvail(), 0u);
    EXPECT_EQ(r.readInplace(1), nullptr);
    platform::ParcelReader big(data, sizeof data);
    EXPECT_EQ(big.readInplace(SIZE_MAX), nullptr);
}

}  // namespace
