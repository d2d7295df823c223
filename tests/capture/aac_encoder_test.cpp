// The encoder loop against the scripted encoder library: every answer the library can give,
// checked by what reaches the server's audio ring, what is printed and logged, and how the
// thread ends.
#include <dlfcn.h>
#include <gtest/gtest.h>
#include <unistd.h>

#include <atomic>
#include <chrono>
#include <future>
#include <memory>
#include <string>
#include <thread>
#include <vector>

#include "capture/orvexaudiomain.h"
#include "config/GlobalConfig.h"
#include "config/Settings.h"
#include "platform/fake/FakePlatform.h"
#include "rtsp/RtspTransport.h"
#include "server/RtspService_t.h"
#include "server/skyvo_rtsp.h"
#include "server/skyvo_service.h"
#include "tests/capture/ScriptedAacEncoder.h"

namespace {

using Bytes = std::vector<unsigned char>;
using Texts = std::vector<std::string>;

constexpr const char* kTag = "orvex:::orvexaudiomain";
constexpr VO_U32 kMoreInput = kVoErrInputBufferSmall;
constexpr VO_U32 kEnd = kVoErrOutputBufferSmall;
// What a successful run prints: the memory table's traces from Init and Uninit, then the end.
const std::string kRanToTheEnd =
    "orvex:::cmnMemmory__cmnMemAlloc\norvex:::cmnMemmory__cmnMemFree\n\n\n exit audio_aac_enc \n";

// Two ADTS-looking frames and a third, shorter one.
const Bytes kFrameA = {0xFF, 0xF1, 0x4C, 0x80, 0x01, 0x3F, 0xFC, 0x21, 0x10};
const Bytes kFrameB = {0xFF, 0xF1, 0x4C, 0x80, 0x01, 0x1F, 0xFC, 0xDE};
const Bytes kFrameC = {0xFF, 0xF1, 0x4C, 0x80, 0x00, 0xFF, 0xFC};

struct Step {
    VO_U32 result;
    Bytes frame;
};

std::vector<Step> Repeat(int n, Step step) {
    return std::vector<Step>(static_cast<size_t>(n), step);
}
std::vector<Step> Cat(std::initializer_list<std::vector<Step>> parts) {
    std::vector<Step> out;
    for (const auto& p : parts) out.insert(out.end(), p.begin(), p.end());
    return out;
}

// Every scripted answer up to and including the first output-too-small is asked for.
int AskedFor(const std::vector<Step>& steps) {
    int n = 0;
    for (const Step& s : steps) {
        ++n;
        if (s.result == kEnd) break;
    }
    return n;
}

class AacEncoderLoopTest : public ::testing::Test {
protected:
    void SetUp() override {
        library_ = dlopen(ORVEX_SCRIPTED_AAC, RTLD_NOW);
        ASSERT_NE(library_, nullptr) << dlerror();
        load_ = reinterpret_cast<ScriptedAacLoad>(dlsym(library_, "scripted_aac_load"));
        record_ = reinterpret_cast<ScriptedAacResult>(dlsym(library_, "scripted_aac_record"));
        ASSERT_NE(load_, nullptr);
        ASSERT_NE(record_, nullptr);
        RtspTransport::SetSelectWaitMs(20);  // the server closes within one listener round
        skyvo_rtsp_sever_init();
        ASSERT_EQ(skyvo_rtsp_sever_open(0), 0);
    }
    void TearDown() override {
        skyvo_rtsp_sever_close();
        RtspTransport::SetSelectWaitMs(2000);
        if (library_ != nullptr) dlclose(library_);
    }

    void Load(VO_S32 get_api, VO_U32 init, const std::vector<Step>& steps) {
        steps_.clear();
        for (const Step& s : steps) {
            steps_.push_back({s.result, s.frame.data(), static_cast<uint32_t>(s.frame.size())});
        }
        ScriptedAacScript script{get_api, init, steps_.data(), steps_.size()};
        load_(&script);
    }

    // `blocks` PCM blocks, block i filled with the byte i + 1, so the record shows their order.
    static void Feed(int blocks) {
        audio_pcm_ring().reset();
        Bytes block(kPcmBlockBytes);
        for (int i = 0; i < blocks; ++i) {
            block.assign(kPcmBlockBytes, static_cast<unsigned char>(i + 1));
            ASSERT_EQ(audio_pcm_ring().write(block.data(), kPcmBlockBytes), kPcmBlockBytes);
        }
    }

    // Runs the loop on its own thread as the capture does; a loop that has not ended by itself
    // after 10 s is stopped through its run flag and reported.
    int Run(std::string* printed) {
        std::atomic<int> run{1};
        ::testing::internal::CaptureStdout();
        std::promise<int> result;
        std::future<int> done = result.get_future();
        std::thread encoder([&] { result.set_value(audio_aac_enc(&run)); });
        bool ended = done.wait_for(std::chrono::seconds(10)) == std::future_status::ready;
        run = 0;
        encoder.join();
        *printed = ::testing::internal::GetCapturedStdout();
        EXPECT_TRUE(ended) << "the encoder thread did not end by itself";
        return done.get();
    }

    static std::vector<Bytes> RingItems() {
        std::vector<Bytes> out;
        auto item = std::make_unique<Buffer_Item>();
        while (skyvo_rtsp_service()->listener()->audio_ring().newread(*item)) {
            out.emplace_back(item->data, item->data + item->length);
        }
        return out;
    }

    const ScriptedAacRecord& Record() { return *record_(); }

    platform::fake::FakePlatform fake;

private:
    void* library_ = nullptr;
    ScriptedAacLoad load_ = nullptr;
    ScriptedAacResult record_ = nullptr;
    std::vector<ScriptedAacStep> steps_;
};

TEST_F(AacEncoderLoopTest, OutputResultsDecideWhatReachesTheRingAndWhenTheThreadEnds) {
    struct Case {
        const char* name;
        int blocks;
        std::vector<Step> steps;
        std::vector<Bytes> items;
        int inputs;       // SetInputData calls
        int blocks_left;  // still in the PCM ring afterwards
        Texts logged;
    };
    const Texts kStarted = {"audio_aac_enc"};
    const Case cases[] = {
        {"frames go out in order; more-input takes the next block",
         2,
         {{0, kFrameA}, {0, kFrameB}, {kMoreInput, {}}, {0, kFrameC}, {kEnd, {}}},
         {kFrameA, kFrameB, kFrameC},
         2,
         0,
         kStarted},
        {"output-too-small ends the thread with blocks left",
         3,
         {{kEnd, {}}, {0, kFrameA}},
         {},
         1,
         2,
         kStarted},
        {"unknown results are asked again",
         1,
         {{0x80000001, {}}, {0x12345678, {}}, {0x80000005 + 1, {}}, {0, kFrameA}, {kEnd, {}}},
         {kFrameA},
         1,
         0,
         kStarted},
        {"a success with an empty frame puts nothing in the ring",
         1,
         {{0, {}}, {0, kFrameB}, {kEnd, {}}},
         {kFrameB},
         1,
         0,
         kStarted},
        {"64 unknown results for a block skip it, logged once",
         2,
         Cat({Repeat(64, {0x8000000A, {}}), {{0, kFrameA}, {kEnd, {}}}}),
         {kFrameA},
         2,
         0,
         {"audio_aac_enc",
          "encoder gave 64 unknown results for one block (last 0x8000000a): block skipped"}},
        {"63 unknown results keep the block",
         2,
         Cat({Repeat(63, {0x8000000A, {}}), {{0, kFrameA}, {kEnd, {}}}}),
         {kFrameA},
         1,
         1,
         kStarted},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.name);
        fake.log.Clear();
        fake.journal.Clear();
        fake.aac_library.set_library(ORVEX_SCRIPTED_AAC);
        Load(0, 0, c.steps);
        Feed(c.blocks);
        std::string printed;
        EXPECT_EQ(Run(&printed), 0);
        EXPECT_EQ(printed, kRanToTheEnd);
        EXPECT_EQ(RingItems(), c.items);
        EXPECT_EQ(fake.log.Texts(kTag), c.logged);
        EXPECT_EQ(fake.journal.Calls(),
                  (Texts{std::string("dlopen(") + ORVEX_SCRIPTED_AAC + ")", "dlclose"}));
        EXPECT_EQ(audio_pcm_ring().used_space(), c.blocks_left * kPcmBlockBytes);

        const ScriptedAacRecord& r = Record();
        EXPECT_EQ(r.init_calls, 1);
        EXPECT_EQ(r.init_codec_type, kVoAudioCodingAac);
        EXPECT_TRUE(r.init_memory_operators);
        EXPECT_EQ(r.memory_alloc_result, 0);
        EXPECT_EQ(r.set_param_calls, 1);
        EXPECT_EQ(r.set_param_id, kVoPidAacEncParam);
        EXPECT_EQ(r.params.sampleRate, 48000);
        EXPECT_EQ(r.params.bitRate, 128000);
        EXPECT_EQ(r.params.nChannels, 2);
        EXPECT_EQ(r.params.adtsUsed, 1);
        EXPECT_EQ(r.set_input_calls, c.inputs);
        EXPECT_EQ(r.input_length_other, 0u);
        for (int i = 0; i < c.inputs && i < 16; ++i) EXPECT_EQ(r.input_first_byte[i], i + 1);
        EXPECT_EQ(r.get_output_calls, AskedFor(c.steps));
        EXPECT_EQ(r.offered_length_other, 0u);
        EXPECT_EQ(r.uninit_calls, 1);
        EXPECT_TRUE(r.uninit_handle_matches);
    }
}

TEST_F(AacEncoderLoopTest, LoadAndInitFailuresEndOnlyTheEncoderThread) {
    const std::string scripted = ORVEX_SCRIPTED_AAC;
    struct Case {
        const char* name;
        std::string library, refused;
        VO_S32 get_api;
        VO_U32 init;
        std::string printed;
        Texts journal;
        int init_calls;
    };
    const Case cases[] = {
        {"missing library",
         "/nonexistent/libstagefright.so",
         "",
         0,
         0,
         "\nopen dll error......\n",
         {"dlopen(/nonexistent/libstagefright.so)"},
         0},
        {"missing symbol",
         scripted,
         "voGetAACEncAPI",
         0,
         0,
         "\nopen function error......\n",
         {"dlopen(" + scripted + ")", "dlclose"},
         0},
        {"API table refused",
         scripted,
         "",
         1,
         0,
         "\npGetAPI function return error\n",
         {"dlopen(" + scripted + ")", "dlclose"},
         0},
        {"Init fails",
         scripted,
         "",
         0,
         0x80000001,
         "\n#### VOI_Error2:fail to initialize the Encoderr###\n",
         {"dlopen(" + scripted + ")", "dlclose"},
         1},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.name);
        fake.log.Clear();
        fake.journal.Clear();
        fake.aac_library.set_library(c.library);
        fake.aac_library.refuse_symbol(c.refused);
        Load(c.get_api, c.init, {{0, kFrameA}});
        Feed(1);
        std::string printed;
        EXPECT_EQ(Run(&printed), -1);
        EXPECT_EQ(printed, c.printed);
        EXPECT_EQ(fake.journal.Calls(), c.journal);
        EXPECT_EQ(fake.log.Texts(kTag), Texts{"audio_aac_enc"});
        EXPECT_EQ(RingItems(), std::vector<Bytes>{});
        EXPECT_EQ(audio_pcm_ring().used_space(), kPcmBlockBytes);  // the PCM is not touched
        EXPECT_EQ(Record().init_calls, c.init_calls);
        EXPECT_EQ(Record().set_input_calls, 0);
        EXPECT_EQ(Record().uninit_calls, 0);
    }
    fake.aac_library.refuse_symbol("");
    ::testing::internal::CaptureStdout();
    EXPECT_EQ(audio_aac_enc(nullptr), 1);
    EXPECT_EQ(::testing::internal::GetCapturedStdout(), "\n\n Stsrt param error !\n");
}

}  // namespace

// kv.orvex.aacenc=inline: the PCM thread encodes what it reads, whole blocks only, and no
// encoder thread is started; an encoder that cannot load leaves the PCM ring untouched.
TEST_F(AacEncoderLoopTest, InlineEncoderRunsInThePcmThread) {
    const std::string scripted = ORVEX_SCRIPTED_AAC;
    struct Case {
        const char* name;
        std::string library;
        std::vector<Bytes> items;
        const char* printed;  // a line the start prints, if any
        size_t ended;         // times the encoder's end is printed
    };
    const std::vector<Step> steps = {
        {0, kFrameA}, {0, kFrameB}, {kMoreInput, {}}, {0, kFrameC}, {kEnd, {}}};
    const Case cases[] = {
        // The script ends with the encoder's output-too-small: it ends as the thread would.
        {"frames reach the server", scripted, {kFrameA, kFrameB, kFrameC}, nullptr, 1},
        {"missing library", "/nonexistent/libstagefright.so", {}, "\nopen dll error......\n", 0},
    };
    fake.properties.Set("kv.orvex.aacenc", "inline");
    Global_Config::instance()->Apply(config::ReadSettings(fake.properties));
    for (const Case& c : cases) {
        SCOPED_TRACE(c.name);
        fake.aac_library.set_library(c.library);
        Load(0, 0, steps);
        audio_pcm_ring().reset();
        ::testing::internal::CaptureStdout();
        ASSERT_EQ(start_audio_record_enc(), 0);
        // What the server's audio ring holds once every frame is in (read on this thread only
        // after the PCM thread is joined).
        unsigned expected = 0;
        for (const Bytes& item : c.items) expected += kItemHeaderSize + item.size();
        cycle_buffer& ring = skyvo_rtsp_service()->listener()->audio_ring();
        for (int i = 0; i < 5000 && ring.used_space() < expected; ++i) usleep(1000);
        usleep(20000);
        stop_audio_record_enc();
        std::string out = ::testing::internal::GetCapturedStdout();
        EXPECT_NE(out.find("thread_join(g_thread_audio_pcm.thread_handle)"), std::string::npos);
        EXPECT_EQ(out.find("thread_join(g_thread_audio_aac.thread_handle)"), std::string::npos);
        if (c.printed != nullptr) {
            EXPECT_NE(out.find(c.printed), std::string::npos);
        }
        size_t ended = 0;
        for (size_t at = out.find("exit audio_aac_enc"); at != std::string::npos;
             at = out.find("exit audio_aac_enc", at + 1)) {
            ++ended;
        }
        EXPECT_EQ(ended, c.ended) << out;
        EXPECT_EQ(RingItems(), c.items);
        EXPECT_EQ(audio_pcm_ring().used_space(), 0u);
        EXPECT_EQ(Record().set_input_calls, c.items.empty() ? 0 : 2);
        EXPECT_EQ(Record().input_length_other, 0u);
    }
}
