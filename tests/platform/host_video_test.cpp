#include <gtest/gtest.h>
#include <unistd.h>

#include <algorithm>
#include <atomic>
#include <chrono>
#include <cstdio>
#include <cstring>
#include <fstream>
#include <memory>
#include <mutex>
#include <string>
#include <thread>
#include <vector>

#include "codec/h264_sps.h"
#include "platform/Ports.h"
#include "platform/host/video/HostCamera.h"
#include "platform/host/video/HostMediaRecorder.h"
#include "platform/host/video/TestPattern.h"

namespace {

using platform::host::HostCamera;
using platform::host::HostCameraPort;
using platform::host::HostMediaRecorder;
using platform::host::HostMediaRecorderPort;
using platform::host::TestPattern;
using Bytes = std::vector<uint8_t>;

struct Transaction {
    std::string service;
    uint32_t code;
    Bytes data;
};

class RecordingBinder final : public platform::BinderPort {
public:
    int initWithDriver(const char*) override { return 0; }
    const void* defaultServiceManager() override { return this; }
    int addService(const char*, std::shared_ptr<platform::BinderService>) override { return 0; }
    void startThreadPool() override {}
    // Refuses the first `refusals` frames, as before the service registers.
    std::atomic<int> refusals{0};
    int transact(const char* service, uint32_t code, const platform::ParcelWriter& data) override {
        if (refusals.load() > 0 && refusals-- > 0) return -32;  // DEAD_OBJECT
        std::lock_guard<std::mutex> hold(mutex_);
        taken_.push_back({service, code, data.data()});
        return 0;
    }
    std::vector<Transaction> taken() {
        std::lock_guard<std::mutex> hold(mutex_);
        return taken_;
    }

private:
    std::mutex mutex_;
    std::vector<Transaction> taken_;
};

// NAL unit types of an Annex B buffer, in order; -1 for a unit behind a 3-byte start code.
std::vector<int> NalTypes(const Bytes& b) {
    std::vector<int> types;
    for (size_t i = 0; i + 3 < b.size(); ++i) {
        if (b[i] == 0 && b[i + 1] == 0 && b[i + 2] == 1) {
            types.push_back(i > 0 && b[i - 1] == 0 ? b[i + 3] & 0x1F : -1);
            i += 2;
        }
    }
    return types;
}

// The units without the filler data (type 12) that may follow a slice to keep the bitrate
// (split at slices, a picture's filler opens the next frame).
std::vector<int> WithoutFiller(std::vector<int> t) {
    t.erase(std::remove(t.begin(), t.end(), 12), t.end());
    return t;
}

bool IsKeyFrame(const std::vector<int>& types) {
    std::vector<int> t = WithoutFiller(types);
    return t.size() >= 3 && t[0] == 7 && t[1] == 8 &&
           std::all_of(t.begin() + 2, t.end(), [](int v) { return v == 5; });
}

bool IsPFrame(const std::vector<int>& types) {
    std::vector<int> t = WithoutFiller(types);
    return !t.empty() && std::all_of(t.begin(), t.end(), [](int v) { return v == 1; });
}

class HostVideoRecorderTest : public ::testing::Test {
protected:
    void SetUp() override {
        previous_ = platform::Installed();
        platform::Ports ports = previous_;
        ports.binder = &binder_;
        platform::Install(ports);
    }
    void TearDown() override { platform::Install(previous_); }

    // The calls capture start makes, in its order.
    static int Configure(HostMediaRecorder& r, HostCamera& camera, int w, int h, int fps) {
        int rc = 0;
        rc |= camera.unlock();
        rc |= r.setCamera(camera);
        rc |= r.setVideoSource(1);
        rc |= r.setOutputFormat(101);
        rc |= r.setVideoEncoder(2);
        rc |= r.setVideoSize(w, h);
        rc |= r.setVideoFrameRate(fps);
        rc |= r.setParameters("video-param-camera-id=5");
        rc |= r.setParameters("video-param-encoding-bitrate=2048000");
        return rc;
    }

    // Records ~`ms` of 320x240 @ 30 fps through the ports and returns the frames the binder
    // took, each checked to be a well-formed parcel to "orvex.rtp".
    std::vector<Bytes> Record(int ms) {
        auto camera = HostCameraPort().connect(0, "", -1, -1);
        recorder_ =
            std::dynamic_pointer_cast<HostMediaRecorder>(HostMediaRecorderPort().create("orvex"));
        EXPECT_TRUE(camera && recorder_);
        if (!camera || !recorder_) return {};
        EXPECT_EQ(Configure(*recorder_, static_cast<HostCamera&>(*camera), 320, 240, 30), 0);
        EXPECT_EQ(recorder_->prepare(), 0);
        EXPECT_EQ(recorder_->start(), 0);
        std::this_thread::sleep_for(std::chrono::milliseconds(ms));
        EXPECT_EQ(recorder_->stop(), 0);
        EXPECT_EQ(recorder_->release(), 0);
        EXPECT_EQ(camera->lock(), 0);

        // One NAL unit per transaction, as the platform recorder hands them over; a frame ends
        // with its slice (OpenH264 writes one slice per picture).
        std::vector<Bytes> frames(1);
        units_.clear();
        for (const Transaction& t : binder_.taken()) {
            EXPECT_EQ(t.service, "orvex.rtp");
            EXPECT_EQ(t.code, 101u);
            platform::ParcelReader in(t.data.data(), t.data.size());
            int32_t len = in.readInt32();
            const uint8_t* bytes = len > 0 ? in.readInplace(len) : nullptr;
            EXPECT_NE(bytes, nullptr) << "length " << len << " in a parcel of " << t.data.size();
            if (bytes == nullptr) continue;
            EXPECT_EQ(in.readInt32(), 0);
            EXPECT_EQ(t.data.size(), 4 + ((static_cast<size_t>(len) + 3) & ~size_t{3}) + 4);
            units_.emplace_back(bytes, bytes + len);
            frames.back().insert(frames.back().end(), bytes, bytes + len);
            int type = len > 4 ? bytes[4] & 0x1F : 0;
            if (type == 1 || type == 5) frames.emplace_back();
        }
        frames.pop_back();  // the frame not yet begun, or a cut-off one
        return frames;
    }

    RecordingBinder binder_;
    std::vector<Bytes> units_;  // what each transaction of the last Record carried
    platform::Ports previous_;
    std::shared_ptr<HostMediaRecorder> recorder_;
};

TEST_F(HostVideoRecorderTest, RefusesWrongOrderAndWrongSettings) {
    HostCamera camera;
    HostMediaRecorder r;
    EXPECT_NE(r.setCamera(camera), 0) << "the camera is still locked by its owner";
    EXPECT_NE(r.start(), 0);
    EXPECT_NE(r.prepare(), 0) << "no output format or encoder yet";
    EXPECT_NE(r.setOutputFormat(2), 0);
    EXPECT_NE(r.setVideoEncoder(3), 0);
    EXPECT_NE(r.setVideoEncoder(1), 0);
    EXPECT_NE(r.setVideoSize(321, 240), 0);
    EXPECT_NE(r.setVideoSize(0, 0), 0);
    EXPECT_NE(r.setVideoFrameRate(0), 0);
    EXPECT_NE(r.prepare(), 0) << "refused settings must not count as made";

    ASSERT_EQ(Configure(r, camera, 320, 240, 30), 0);
    EXPECT_NE(r.start(), 0) << "start before prepare";
    ASSERT_EQ(r.prepare(), 0);
    EXPECT_NE(r.setVideoSize(640, 480), 0) << "settings are frozen once prepared";
    EXPECT_NE(r.prepare(), 0);
    EXPECT_EQ(r.stop(), 0);
    EXPECT_EQ(r.stop(), 0);
    EXPECT_EQ(r.prepare(), 0) << "a stopped recorder can be prepared again";
    EXPECT_EQ(r.release(), 0);
    EXPECT_NE(r.prepare(), 0);
    EXPECT_NE(r.start(), 0);
}

TEST_F(HostVideoRecorderTest, DeliversEachNalUnitOfEveryFrameOnItsOwn) {
    std::vector<Bytes> frames = Record(500);
    ASSERT_GE(frames.size(), 5u) << "about 15 expected";
    EXPECT_EQ(recorder_->framesDelivered(), frames.size());
    EXPECT_EQ(recorder_->failedTransacts(), 0u);
    for (const Bytes& unit : units_) EXPECT_EQ(NalTypes(unit).size(), 1u);
    for (size_t i = 0; i < frames.size(); ++i) {
        const Bytes& f = frames[i];
        ASSERT_GE(f.size(), 5u);
        EXPECT_TRUE(f[0] == 0 && f[1] == 0 && f[2] == 0 && f[3] == 1) << "frame " << i;
        std::vector<int> types = NalTypes(f);
        EXPECT_TRUE(i > 0 || IsKeyFrame(types)) << "the first frame must be SPS+PPS+IDR";
        EXPECT_TRUE(IsKeyFrame(types) || IsPFrame(types)) << "frame " << i;
    }
}

// The send session inspects the encoder's SPS: it must parse to the picture size, and a
// time_scale of 0 (which the session rejects) must not come from it.
TEST_F(HostVideoRecorderTest, EncoderSpsParsesToThePictureSize) {
    std::vector<Bytes> frames = Record(200);
    ASSERT_FALSE(frames.empty());
    const Bytes& key = frames[0];
    size_t next = 4;
    while (next + 4 <= key.size() &&
           !(key[next] == 0 && key[next + 1] == 0 && key[next + 2] == 0 && key[next + 3] == 1)) {
        ++next;
    }
    ASSERT_EQ(key[4] & 0x1F, 7);
    h264_sps_t sps;
    uint32_t time_scale = h264_parse_sps(key.data() + 5, static_cast<unsigned>(next - 5), 1, &sps);
    EXPECT_EQ(sps.profile_idc, 66u);
    EXPECT_EQ((sps.pic_width_in_mbs_minus1 + 1) * 16, 320u);
    EXPECT_EQ((sps.pic_height_in_map_units_minus1 + 1) * 16, 240u);
    EXPECT_NE(time_scale, 0u);
}

TEST_F(HostVideoRecorderTest, SurvivesRefusedDeliveriesAndResumesWithAKeyFrame) {
    binder_.refusals = 3;
    std::vector<Bytes> frames = Record(400);
    EXPECT_EQ(recorder_->failedTransacts(), 3u);
    ASSERT_FALSE(frames.empty());
    EXPECT_TRUE(IsKeyFrame(NalTypes(frames[0])))
        << "a service that starts listening late must get a decodable first frame";
}

TEST_F(HostVideoRecorderTest, KeyFramesAreNeverMoreThanTwoSecondsApart) {
    for (int fps : {30, 25, 7}) {
        HostCamera camera;
        HostMediaRecorder r;
        ASSERT_EQ(Configure(r, camera, 160, 96, fps), 0);
        ASSERT_EQ(r.prepare(), 0);
        std::vector<uint64_t> keys;
        const uint64_t base = 5000123;
        for (uint32_t n = 0; n <= static_cast<uint32_t>(fps) * 7; ++n) {
            uint64_t ms = base + n * 1000u / fps;
            HostMediaRecorder::Encoded e = r.encodeFrame(n, ms);
            if (e.size > 0 && e.key) keys.push_back(ms);
        }
        ASSERT_FALSE(keys.empty());
        EXPECT_EQ(keys[0], base) << fps << " fps";
        for (size_t i = 1; i < keys.size(); ++i) {
            uint64_t gap = keys[i] - keys[i - 1];
            EXPECT_LE(gap, 2000u) << fps << " fps";
            EXPECT_GT(gap, 1500u) << fps << " fps: key frames come too often";
        }
        EXPECT_EQ(keys.size(), 4u) << fps << " fps over 7 s";
    }
}

TEST_F(HostVideoRecorderTest, AKeyFrameAskedForIsTheNextPicture) {
    HostCamera camera;
    HostMediaRecorder r;
    ASSERT_EQ(Configure(r, camera, 160, 96, 30), 0);
    ASSERT_EQ(r.prepare(), 0);
    HostMediaRecorderPort port;
    std::vector<uint32_t> keys;
    for (uint32_t n = 0; n < 30; ++n) {
        if (n == 10 || n == 20) {
            EXPECT_TRUE(port.RequestKeyFrame());
        }
        if (n == 10) {
            EXPECT_TRUE(port.RequestKeyFrame());
        }
        HostMediaRecorder::Encoded e = r.encodeFrame(n, 1000 + n * 33);
        if (e.size > 0 && e.key) keys.push_back(n);
    }
    // Two requests before one picture make one key frame.
    EXPECT_EQ(keys, (std::vector<uint32_t>{0, 10, 20}));
}

TEST_F(HostVideoRecorderTest, FfprobeReadsTheStreamAsBaselineH264) {
    if (system("command -v ffprobe >/dev/null 2>&1") != 0) GTEST_SKIP() << "no ffprobe";
    std::vector<Bytes> frames = Record(400);
    ASSERT_FALSE(frames.empty());
    std::string path = ::testing::TempDir() + "orvex_" + std::to_string(getpid()) + ".h264";
    {
        std::ofstream out(path, std::ios::binary | std::ios::trunc);
        for (const Bytes& f : frames) out.write(reinterpret_cast<const char*>(f.data()), f.size());
    }
    std::string cmd =
        "ffprobe -v error -count_frames -show_entries "
        "stream=codec_name,width,height,profile,nb_read_frames -of default=nw=1 '" +
        path + "' 2>&1";
    std::string report;
    if (FILE* p = popen(cmd.c_str(), "r")) {
        char buf[256];
        while (fgets(buf, sizeof buf, p) != nullptr) report += buf;
        pclose(p);
    }
    unlink(path.c_str());
    EXPECT_NE(report.find("codec_name=h264\n"), std::string::npos) << report;
    EXPECT_NE(report.find("width=320\n"), std::string::npos) << report;
    EXPECT_NE(report.find("height=240\n"), std::string::npos) << report;
    EXPECT_TRUE(report.find("profile=Constrained Baseline\n") != std::string::npos ||
                report.find("profile=Baseline\n") != std::string::npos)
        << report;
    EXPECT_NE(report.find("nb_read_frames=" + std::to_string(frames.size()) + "\n"),
              std::string::npos)
        << "every delivered frame must decode: " << report;
}

TEST(HostVideoPatternTest, FlashSquareFollowsTheHostClock) {
    struct Case {
        uint64_t ms;
        bool white;
    } cases[] = {{0, true},    {99, true},      {100, false},    {999, false},    {1000, true},
                 {1050, true}, {123456, false}, {7000099, true}, {7000100, false}};
    for (auto [w, h] : {std::pair{320, 240}, std::pair{1280, 720}, std::pair{34, 18}}) {
        TestPattern pattern(w, h);
        Bytes frame(pattern.frameSize());
        const uint8_t* u = frame.data() + w * h;
        const uint8_t* v = u + (w / 2) * (h / 2);
        ASSERT_GE(pattern.flashSize(), 2);
        for (const Case& c : cases) {
            pattern.draw(7, c.ms, frame.data());
            const uint8_t want = c.white ? TestPattern::kWhiteY : TestPattern::kBlackY;
            int wrong = 0;
            for (int y = pattern.flashY(); y < pattern.flashY() + pattern.flashSize(); ++y) {
                for (int x = pattern.flashX(); x < pattern.flashX() + pattern.flashSize(); ++x) {
                    wrong += frame[y * w + x] != want;
                    int c_at = (y / 2) * (w / 2) + x / 2;
                    wrong += u[c_at] != TestPattern::kNeutralUV;
                    wrong += v[c_at] != TestPattern::kNeutralUV;
                }
            }
            EXPECT_EQ(wrong, 0) << w << "x" << h << " at " << c.ms << " ms";
        }
    }
}

TEST(HostVideoPatternTest, StampReadsBackTheCaptureTime) {
    // Low 32 bits of the clock; all-ones and alternating bits stress the guards.
    const uint64_t times[] = {0, 1, 0x80000000u, 0xFFFFFFFFu, 0x1AAAAAAAAull, 0x55555555u, 5300417};
    for (auto [w, h] :
         {std::pair{320, 176}, std::pair{640, 480}, std::pair{1280, 720}, std::pair{1920, 1080}}) {
        TestPattern pattern(w, h);
        ASSERT_GE(pattern.stampCell(), 8) << w << "x" << h;
        Bytes frame(pattern.frameSize());
        for (uint64_t ms : times) {
            for (int noisy = 0; noisy < 2; ++noisy) {
                pattern.draw(12345, ms, frame.data(), TestPattern::Label::kNoSignal);
                // Coarse noise of +-48 stands in for what an encoder does to flat areas.
                uint32_t seed = static_cast<uint32_t>(ms) ^ 0x9E3779B9u;
                for (int i = 0; noisy && i < w * h; ++i) {
                    seed = seed * 1664525u + 1013904223u;
                    int v = frame[i] + static_cast<int>(seed >> 24) % 97 - 48;
                    frame[i] = static_cast<uint8_t>(std::clamp(v, 0, 255));
                }
                uint32_t got = 0;
                ASSERT_TRUE(pattern.readStamp(frame.data(), &got)) << w << "x" << h << " " << ms;
                EXPECT_EQ(got, static_cast<uint32_t>(ms)) << w << "x" << h << " noisy=" << noisy;
            }
        }
        // A cell of the guard turned over: no stamp rather than a wrong one.
        pattern.draw(1, 77, frame.data());
        for (int y = 0; y < pattern.stampCell(); ++y) {
            memset(&frame[(pattern.stampY() + y) * w + pattern.stampX()], TestPattern::kBlackY,
                   pattern.stampCell());
        }
        uint32_t got = 0;
        EXPECT_FALSE(pattern.readStamp(frame.data(), &got)) << w << "x" << h;
    }
    uint32_t got = 0;
    Bytes tiny(TestPattern(34, 18).frameSize());
    TestPattern(34, 18).draw(1, 77, tiny.data());
    EXPECT_FALSE(TestPattern(34, 18).readStamp(tiny.data(), &got));
}

}  // namespace
