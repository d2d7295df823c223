#include <dlfcn.h>
#include <gtest/gtest.h>
#include <unistd.h>

#include <atomic>
#include <cmath>
#include <cstdio>
#include <string>
#include <thread>
#include <vector>

#include "capture/DumpFile.h"
#include "capture/orvexaudiomain.h"
#include "config/DumpSwitches.h"
#include "config/GlobalConfig.h"
#include "platform/fake/FakePlatform.h"
#include "server/RtspService_t.h"
#include "server/skyvo_rtsp.h"
#include "server/skyvo_service.h"

namespace {

using Calls = std::vector<std::string>;

class AudioTest : public ::testing::Test {
protected:
    ~AudioTest() override {
        stop_audio_record_enc();
        Global_Config::CloseInstance();
    }
    platform::fake::FakePlatform fake;
};

// 3840-byte blocks of a 1 kHz stereo sine.
void FeedSine(int blocks) {
    std::vector<int16_t> pcm(kPcmBlockBytes / 2);
    for (int b = 0; b < blocks; ++b) {
        for (size_t i = 0; i < pcm.size() / 2; ++i) {
            double t = (b * 960 + static_cast<double>(i)) / 48000.0;
            pcm[2 * i] = pcm[2 * i + 1] =
                static_cast<int16_t>(8000 * std::sin(2 * M_PI * 1000 * t));
        }
        ASSERT_EQ(
            audio_pcm_ring().write(reinterpret_cast<unsigned char*>(pcm.data()), kPcmBlockBytes),
            kPcmBlockBytes);
    }
}

// The host's real encoder behind the same loop: its frames are the ADTS the parameters ask for
// (the loop's paths are covered against the scripted library in aac_encoder_test.cpp).
TEST_F(AudioTest, HostEncoderTurnsBlocksIntoAdtsFramesForTheServer) {
    fake.aac_library.set_library("libvo-aacenc.so.0");
    void* probe = dlopen("libvo-aacenc.so.0", RTLD_NOW);
    if (probe == nullptr) GTEST_SKIP() << "libvo-aacenc is not installed for this machine";
    dlclose(probe);
    RtspTransport::SetSelectWaitMs(20);  // the server closes within one listener round
    skyvo_rtsp_sever_init();
    ASSERT_EQ(skyvo_rtsp_sever_open(0), 0);
    audio_pcm_ring().reset();
    FeedSine(25);  // 0.5 s of sound: 25 blocks of 20 ms
    std::atomic<int> run{1};
    ::testing::internal::CaptureStdout();
    std::thread encoder([&] { EXPECT_EQ(audio_aac_enc(&run), 0); });
    for (int i = 0; i < 2000 && audio_pcm_ring().used_space() > 0; ++i) usleep(1000);
    usleep(20000);
    run = 0;
    encoder.join();
    std::string out = ::testing::internal::GetCapturedStdout();
    EXPECT_NE(out.find("\n exit audio_aac_enc \n"), std::string::npos);
    cycle_buffer& ring = skyvo_rtsp_service()->listener()->audio_ring();
    auto item = std::make_unique<Buffer_Item>();
    int frames = 0;
    while (ring.newread(*item)) {
        const unsigned char* f = item->data;
        ASSERT_GE(item->length, 7);
        EXPECT_EQ(f[0], 0xFF);
        EXPECT_EQ(f[1] & 0xF6, 0xF0);                   // sync, layer 0
        EXPECT_EQ((f[2] >> 6) & 3, 1);                  // AAC LC
        EXPECT_EQ((f[2] >> 2) & 0xF, 3);                // 48000 Hz
        EXPECT_EQ(((f[2] & 1) << 2) | (f[3] >> 6), 2);  // stereo
        EXPECT_EQ(((f[3] & 3) << 11) | (f[4] << 3) | (f[5] >> 5), item->length);
        ++frames;
    }
    // 1024 samples a frame: 24000 samples make 23.4 frames, less the encoder's delay.
    EXPECT_GE(frames, 20);
    EXPECT_LE(frames, 24);
    skyvo_rtsp_sever_close();
    RtspTransport::SetSelectWaitMs(2000);
}

TEST_F(AudioTest, PcmThreadSetUpFailures) {
    struct Case {
        std::string inject, printed;
    };
    const Case cases[] = {
        {"AudioFlinger", "\n AudioSystem::get_audio_flinger failed "},
        {"AudioRecord::set", "\n audiorecord setaudiorecord error !"},
        {"AudioRecord::start", "\n audiorecord start error !"},
    };
    for (const Case& c : cases) {
        fake.results.Clear();
        fake.results.Set(c.inject, -1);
        std::atomic<int> run{1};
        ::testing::internal::CaptureStdout();
        EXPECT_EQ(audio_output_pcm(&run), 1) << c.inject;
        EXPECT_NE(::testing::internal::GetCapturedStdout().find(c.printed), std::string::npos)
            << c.inject;
    }
    // Sub-window sound on an unknown flavour: nothing is recorded, the sub state stays.
    fake.results.Clear();
    fake.journal.Clear();
    Global_Config::instance()->set_sub_stat(true);
    std::atomic<int> run{1};
    ::testing::internal::CaptureStdout();
    EXPECT_EQ(audio_output_pcm(&run), 1);
    EXPECT_NE(::testing::internal::GetCapturedStdout().find(
                  "get property kelvo.build.kelvotv failed[0].\n"),
              std::string::npos);
    for (const std::string& call : fake.journal.Calls()) EXPECT_NE(call, "AudioRecord::start");
    EXPECT_TRUE(Global_Config::instance()->isSub());
}

TEST_F(AudioTest, StartFillsTheRingAndStopJoinsAndClearsTheSubState) {
    Global_Config::instance()->set_sub_stat(true);
    fake.properties.Set("kelvo.build.kelvotv", "px");
    ::testing::internal::CaptureStdout();
    EXPECT_EQ(start_audio_record_enc(), 0);
    for (int i = 0; i < 2000 && audio_pcm_ring().used_space() == 0; ++i) usleep(1000);
    stop_audio_record_enc();
    std::string out = ::testing::internal::GetCapturedStdout();
    EXPECT_NE(out.find("thread_join(g_thread_audio_pcm.thread_handle)"), std::string::npos);
    EXPECT_NE(out.find("thread_join(g_thread_audio_aac.thread_handle)"), std::string::npos);
    EXPECT_FALSE(Global_Config::instance()->isSub());  // cleared when recording ends normally
    Calls calls = fake.journal.Calls();
    EXPECT_NE(std::find(calls.begin(), calls.end(), "PX_AOUT_SetAttr(-1, 5, 1)"), calls.end());

    ::testing::internal::CaptureStdout();
    stop_audio_record_enc();  // nothing running: only the end line
    EXPECT_EQ(::testing::internal::GetCapturedStdout(), "\nstop_audio_record_enc end\n");
    EXPECT_EQ(add_audio_pcm_data(reinterpret_cast<const unsigned char*>("x"), 0), 0);
}

// A PIP reopen followed by a PLAY starts the audio threads over running ones: the dump switches
// the client asked for stay on.
TEST_F(AudioTest, StartOverRunningThreadsKeepsTheDumpSwitches) {
    fake.properties.Set("kelvo.build.kelvotv", "px");
    ::testing::internal::CaptureStdout();
    EXPECT_EQ(start_audio_record_enc(), 0);
    set_write_pcm_file();
    set_write_aac_file();
    EXPECT_EQ(start_audio_record_enc(), 0);
    EXPECT_EQ(get_write_pcm_file(), 1);
    EXPECT_EQ(get_write_aac_file(), 1);
    stop_audio_record_enc();
    ::testing::internal::GetCapturedStdout();
    EXPECT_EQ(get_write_pcm_file(), 0);
    EXPECT_EQ(get_write_aac_file(), 0);
}

// Writers on several threads (binder pool threads) across many restarts: the file only ever
// holds whole blocks, each from one writer.
TEST(DumpFileTest, ConcurrentWritersAcrossRestartsKeepBlocksWhole) {
    platform::fake::FakePlatform fake;
    std::string path = ::testing::TempDir() + "orvex_dump_mt_" + std::to_string(getpid());
    constexpr size_t kBlock = 100;
    constexpr int kRounds = 20;
    int bad = 0;
    for (int round = 0; round < kRounds; ++round) {
        std::atomic<bool> say{false};
        DumpFile dump("orvex:::orvexservice", path, path + "_ex", 1000, {"a", "b", "c", "d", "e"},
                      &say);
        std::vector<std::thread> writers;
        for (int w = 0; w < 3; ++w) {
            writers.emplace_back([&dump, w] {
                std::vector<unsigned char> block(kBlock, static_cast<unsigned char>('A' + w));
                for (int i = 0; i < 200; ++i) dump.Write(block.data(), block.size(), false);
            });
        }
        for (auto& t : writers) t.join();
        dump.Close();
        FILE* f = fopen(path.c_str(), "rb");
        std::vector<unsigned char> content(4096);
        size_t n = f != nullptr ? fread(content.data(), 1, content.size(), f) : 0;
        if (f != nullptr) fclose(f);
        bool whole = f != nullptr && n % kBlock == 0 && n <= 1000 + kBlock;
        for (size_t i = 0; whole && i < n; ++i) whole = content[i] == content[i - i % kBlock];
        if (!whole) ++bad;
    }
    EXPECT_EQ(bad, 0) << "of " << kRounds << " rounds";
    unlink(path.c_str());
}

TEST(DumpFileTest, InternalDumpStartsOverPastItsLimitExternalNever) {
    platform::fake::FakePlatform fake;
    std::string dir = ::testing::TempDir() + "orvex_dump_" + std::to_string(getpid());
    std::string internal = dir + "_in", external = dir + "_ex";
    std::atomic<bool> say{true};
    DumpFile dump("orvex:::orvexaudiomain", internal, external, 100,
                  {"open in failed", "open ex failed", "removed", "remove failed", "reopen failed"},
                  &say);
    std::vector<unsigned char> block(60, 7);
    for (int i = 0; i < 3; ++i) dump.Write(block.data(), block.size(), false);  // 60, 120, restart
    dump.Close();
    FILE* f = fopen(internal.c_str(), "rb");
    ASSERT_NE(f, nullptr);
    fseek(f, 0, SEEK_END);
    EXPECT_EQ(ftell(f), 60);
    fclose(f);
    DumpFile sd("orvex:::orvexaudiomain", internal, external, 100, {"a", "b", "c", "d", "e"}, &say);
    for (int i = 0; i < 4; ++i) sd.Write(block.data(), block.size(), true);
    sd.Close();
    f = fopen(external.c_str(), "rb");
    ASSERT_NE(f, nullptr);
    fseek(f, 0, SEEK_END);
    EXPECT_EQ(ftell(f), 240);
    fclose(f);
    DumpFile nowhere("orvex:::orvexaudiomain", "/nonexistent/dir/x", "/nonexistent/y", 100,
                     {"open in failed", "open ex failed", "c", "d", "e"}, &say);
    nowhere.Write(block.data(), 1, false);
    EXPECT_FALSE(nowhere.is_open());
    EXPECT_EQ(fake.log.Texts("orvex:::orvexaudiomain"), (Calls{"removed", "open in failed"}));
    unlink(internal.c_str());
    unlink(external.c_str());
}

}  // namespace
