#include <gtest/gtest.h>

#include <dirent.h>
#include <signal.h>
#include <stdlib.h>
#include <unistd.h>
#include <algorithm>

#include <chrono>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <memory>
#include <string>
#include <thread>
#include <vector>

#include "platform/Ports.h"
#include "platform/host/HostAudio.h"
#include "platform/host/capture/GstSource.h"
#include "platform/host/capture/HostSources.h"
#include "platform/host/capture/LaunchChild.h"
#include "platform/host/video/HostCamera.h"
#include "platform/host/video/HostMediaRecorder.h"
#include "platform/host/video/TestPattern.h"
#include "tests/platform/HostPortsTest.h"
#include "tests/platform/WaitFor.h"

// Leaks that belong to the libraries, not to this code: GLib's allocations while it is loaded,
// and ximagesrc's copy of its display name. Their stacks pass through libraries built without
// frame pointers, so only the slow unwinder sees far enough to match them.
extern "C" const char* __lsan_default_suppressions() {
    return "leak:_dl_init\nleak:libgstximagesrc.so\n";
}
extern "C" const char* __asan_default_options() { return "fast_unwind_on_malloc=0"; }

namespace {

using platform::host::GstSource;
using platform::host::HostCamera;
using platform::host::HostMediaRecorder;
using platform::host::LaunchChild;
using platform::host::SourceChoice;
using platform::host::TestPattern;

constexpr char kTag[] = "orvex:::host";

class HostCaptureTest : public HostPortsTest {
protected:
    // A recorder set up the way capture start does it, up to (not including) prepare.
    std::unique_ptr<HostMediaRecorder> Recorder(int w, int h, bool sub = false) {
        HostCamera camera;
        if (sub) camera.setParameters("traveling-res=12;traveling-mode=4");
        camera.unlock();
        auto r = std::make_unique<HostMediaRecorder>();
        EXPECT_EQ(r->setCamera(camera), 0);
        EXPECT_EQ(r->setVideoSource(1), 0);
        EXPECT_EQ(r->setOutputFormat(101), 0);
        EXPECT_EQ(r->setVideoEncoder(2), 0);
        EXPECT_EQ(r->setVideoSize(w, h), 0);
        EXPECT_EQ(r->setVideoFrameRate(30), 0);
        return r;
    }
};

TEST(HostSourceValues, ParseEveryFormAndRefuseTheRest) {
    struct Case {
        const char* value;
        bool video;
        bool ok;
        SourceChoice::Kind kind;
        const char* arg;
    };
    const Case cases[] = {
        {"pattern", true, true, SourceChoice::kPattern, ""},
        {"none", true, true, SourceChoice::kNone, ""},
        {"x11", true, true, SourceChoice::kX11, ""},
        {"x11::1", true, true, SourceChoice::kX11, ":1"},
        {"wayland", true, true, SourceChoice::kWayland, ""},
        {"wayland:", true, false, SourceChoice::kPattern, ""},
        {"pipewire:42", true, true, SourceChoice::kPipeWire, "42"},
        {"pipewire:orvex-screen", true, true, SourceChoice::kPipeWire, "orvex-screen"},
        {"pipewire", true, false, SourceChoice::kPattern, ""},
        {"v4l2", true, true, SourceChoice::kV4l2, "/dev/video0"},
        {"v4l2:/dev/video2", true, true, SourceChoice::kV4l2, "/dev/video2"},
        {"gst:videotestsrc ! x:y", true, true, SourceChoice::kGst, "videotestsrc ! x:y"},
        {"gst:", true, false, SourceChoice::kPattern, ""},
        {"tone", true, false, SourceChoice::kPattern, ""},
        {"x11x", true, false, SourceChoice::kPattern, ""},
        {"Pattern", true, false, SourceChoice::kPattern, ""},
        {"", true, false, SourceChoice::kPattern, ""},
        {"tone", false, true, SourceChoice::kTone, ""},
        {"none", false, true, SourceChoice::kNone, ""},
        {"pulse", false, true, SourceChoice::kPulse, ""},
        {"pulse:alsa_input.usb-mic", false, true, SourceChoice::kPulse, "alsa_input.usb-mic"},
        {"alsa", false, true, SourceChoice::kAlsa, ""},
        {"alsa:hw:1,0", false, true, SourceChoice::kAlsa, "hw:1,0"},
        {"gst:audiotestsrc", false, true, SourceChoice::kGst, "audiotestsrc"},
        {"pattern", false, false, SourceChoice::kTone, ""},
        {"pulseaudio", false, false, SourceChoice::kTone, ""},
    };
    for (const Case& c : cases) {
        SourceChoice out;
        out.kind = c.video ? SourceChoice::kPattern : SourceChoice::kTone;
        bool ok = c.video ? platform::host::ParseVideoSource(c.value, &out)
                          : platform::host::ParseAudioSource(c.value, &out);
        EXPECT_EQ(ok, c.ok) << c.value;
        EXPECT_EQ(out.kind, c.kind) << c.value;
        EXPECT_EQ(out.arg, c.arg) << c.value;
    }
}

// The recorder asks the camera port whether its owner still holds it, whatever camera it is
// handed: the host's own, or another platform's (here a stand-in that is always held).
TEST_F(HostCaptureTest, ARecorderRefusesACameraItsOwnerStillHolds) {
    struct HeldCamera final : platform::Camera {
        std::string getParameters() override { return ""; }
        int setParameters(const std::string&) override { return 0; }
        int unlock() override { return 0; }
        int lock() override { return 0; }
        bool locked() override { return true; }
    };
    HostCamera host;
    HeldCamera held;
    EXPECT_EQ(HostMediaRecorder().setCamera(host), HostMediaRecorder::kInvalidOperation);
    EXPECT_EQ(HostMediaRecorder().setCamera(held), HostMediaRecorder::kInvalidOperation);
    host.unlock();
    EXPECT_EQ(HostMediaRecorder().setCamera(host), 0);
}

TEST_F(HostCaptureTest, UnknownValuesAreReportedAndTheDefaultIsUsed) {
    properties_.Set("orvex.host.video", "webcam");
    properties_.Set("orvex.host.video.sub", "x11");
    properties_.Set("orvex.host.audio", "mic");
    EXPECT_EQ(platform::host::ChooseVideoSource(false).kind, SourceChoice::kPattern);
    EXPECT_EQ(platform::host::ChooseVideoSource(true).kind, SourceChoice::kX11);
    EXPECT_EQ(platform::host::ChooseAudioSource().kind, SourceChoice::kTone);
    EXPECT_EQ(log_.Texts(kTag),
              (std::vector<std::string>{"orvex.host.video: unknown value \"webcam\", using pattern",
                                        "orvex.host.audio: unknown value \"mic\", using tone"}));
}

// Luma of the picture at (x, y).
int LumaAt(const std::vector<uint8_t>& i420, int width, int x, int y) {
    return i420[static_cast<size_t>(y) * width + x];
}

TEST_F(HostCaptureTest, FramesHaveTheAskedSizeRateAndBordersKeepingTheAspect) {
    struct Case {
        const char* source;  // a white picture
        int width, height, fps;
        bool bars_left_right;
        bool bars_top_bottom;
    };
    const Case cases[] = {
        // 4:3 into 16:9: bars left and right.
        {"videotestsrc pattern=white ! video/x-raw,width=320,height=240,framerate=25/1", 640, 360,
         30, true, false},
        // 16:9 into 4:3: bars above and below.
        {"videotestsrc pattern=white ! video/x-raw,width=640,height=360,framerate=60/1", 320, 240,
         15, false, true},
        // Same aspect, larger: no bars.
        {"videotestsrc pattern=white ! video/x-raw,width=160,height=90,framerate=30/1", 1280, 720,
         30, false, false},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.source);
        SourceChoice source;
        ASSERT_TRUE(platform::host::ParseVideoSource(std::string("gst:") + c.source, &source));
        GstSource live;
        std::string error;
        ASSERT_TRUE(
            live.start(platform::host::VideoPipeline(source, c.width, c.height, c.fps), &error))
            << error;
        std::vector<uint8_t> picture(static_cast<size_t>(c.width) * c.height * 3 / 2, 0);
        // Frames are stamped on the asked rate's grid.
        const uint64_t period = 1000000000u / c.fps;
        for (int n = 0; n < 3; ++n) {
            ASSERT_TRUE(
                WaitFor([&] { return live.latestFrame(picture.data(), c.width, c.height); }));
            uint64_t pts = live.lastFrameTimeNs();
            uint64_t off = pts % period;
            EXPECT_TRUE(off < 1000 || period - off < 1000) << pts << " ns";
        }
        int w = c.width, h = c.height;
        EXPECT_GT(LumaAt(picture, w, w / 2, h / 2), 200);
        EXPECT_EQ(LumaAt(picture, w, 2, h / 2) < 32, c.bars_left_right);
        EXPECT_EQ(LumaAt(picture, w, w - 3, h / 2) < 32, c.bars_left_right);
        EXPECT_EQ(LumaAt(picture, w, w / 2, 2) < 32, c.bars_top_bottom);
        EXPECT_EQ(LumaAt(picture, w, w / 2, h - 3) < 32, c.bars_top_bottom);
        // Chroma of a white and black picture is neutral.
        EXPECT_NEAR(picture[static_cast<size_t>(w) * h + 1], 128, 4);
    }
}

// The pipes this process holds open (GStreamer's own wake-ups are sockets and eventfds, which
// come and go as it pleases).
size_t OpenPipes() {
    size_t n = 0;
    if (DIR* d = opendir("/proc/self/fd")) {
        while (dirent* e = readdir(d)) {
            char target[64] = {};
            std::string path = std::string("/proc/self/fd/") + e->d_name;
            if (readlink(path.c_str(), target, sizeof target - 1) > 0 &&
                strncmp(target, "pipe:", 5) == 0) {
                ++n;
            }
        }
        closedir(d);
    }
    return n;
}

TEST(LaunchChildTest, TheReasonIsGStreamersErrorElseTheFirstLineElseHowItEnded) {
    struct Case {
        const char* text;  // what the child wrote on its standard error
        int status;        // its wait status, -1 while it runs
        const char* reason;
    };
    const Case cases[] = {
        {"ERROR: from element /GstPipeline:pipeline0/GstXImageSrc:ximagesrc0: Could not open X "
         "display for reading\nAdditional debug info:\n../sys/ximage/gstximagesrc.c(158): "
         "gst_ximage_src_open_display (): /GstPipeline:pipeline0/GstXImageSrc:ximagesrc0:\n"
         "ERROR: pipeline doesn't want to preroll.\n",
         1 << 8, "Could not open X display for reading"},
        // Xlib's last words when the X server goes away, after GStreamer's warnings.
        {"\n  XIO:  fatal IO error 11 (Resource temporarily unavailable) on X server \":99\"\n"
         "      after 37 requests (37 known processed) with 0 events remaining.\n",
         1 << 8, "XIO:  fatal IO error 11 (Resource temporarily unavailable) on X server \":99\""},
        {"WARNING: erroneous pipeline: no element \"nosuchelement\"\r\n", 1 << 8,
         "WARNING: erroneous pipeline: no element \"nosuchelement\""},
        {"", SIGKILL, "gst-launch-1.0 ended by signal 9"},
        {" \n\t\n", 3 << 8, "gst-launch-1.0 exited with status 3"},
        {"", -1, ""},
        // An error line cut off before its message is a line like any other.
        {"ERROR: from element /GstPipeline:pipeline0", -1,
         "ERROR: from element /GstPipeline:pipeline0"},
    };
    for (const Case& c : cases) {
        EXPECT_EQ(LaunchChild::Reason(c.text, c.status), c.reason) << c.text;
    }
}

// The screen is captured in a child process, so that a library that ends its process (Xlib,
// when the X server goes away) ends only the child: its frames arrive here, its death is the
// source's end with the reason, and it leaves no process or pipe behind.
TEST_F(HostCaptureTest, AChildsFramesArriveAndItsDeathEndsTheSourceLeavingNothing) {
    const std::string white =
        "videotestsrc pattern=white is-live=true ! "
        "video/x-raw,format=I420,width=320,height=240,framerate=30/1 ! fdsink fd=3";
    std::vector<uint8_t> picture(320 * 240 * 3 / 2, 0);
    std::string error;
    size_t pipes = 0;
    for (int round = 0; round < 2; ++round) {  // the first loads GStreamer, which keeps some
        GstSource live;
        ASSERT_TRUE(live.startInChild(white, 320, 240, 30, &error)) << error;
        ASSERT_TRUE(WaitFor([&] { return live.latestFrame(picture.data(), 320, 240); }));
        EXPECT_GT(LumaAt(picture, 320, 160, 120), 200);
        const int pid = live.childPid();
        ASSERT_GT(pid, 0);
        if (round == 0) {
            live.stop();
            EXPECT_EQ(kill(pid, 0), -1);  // killed and reaped
            pipes = OpenPipes();
            continue;
        }
        kill(pid, SIGKILL);
        std::string why;
        // Read as the recorder does: the end is seen once the frames before it are taken.
        ASSERT_TRUE(WaitFor([&] {
            live.latestFrame(picture.data(), 320, 240);
            return live.ended(&why);
        }));
        EXPECT_EQ(why, "gst-launch-1.0 ended by signal 9");
        EXPECT_EQ(live.childPid(), -1);
    }
    EXPECT_EQ(OpenPipes(), pipes);

    struct Case {
        const char* child;
        const char* error;
    };
    const Case cases[] = {
        {"nosuchelement ! fdsink fd=3",
         "WARNING: erroneous pipeline: no element \"nosuchelement\""},
        // Sound is no picture: the child cannot link and says so.
        {"audiotestsrc ! video/x-raw,format=I420,width=320,height=240 ! fdsink fd=3",
         "WARNING: erroneous pipeline: could not link audiotestsrc0 to fdsink0, audiotestsrc0 "
         "can't handle caps video/x-raw, format=(string)I420, width=(int)320, height=(int)240"},
    };
    for (const Case& c : cases) {
        GstSource live;
        EXPECT_FALSE(live.startInChild(c.child, 320, 240, 30, &error));
        EXPECT_EQ(error, c.error);
    }
}

TEST_F(HostCaptureTest, RecordGivesStereo48kS16InBlocksOfAtMostTheMinimum) {
    // A mono 44.1 kHz 1 kHz sine must come out as 48 kHz stereo: 2000 zero crossings a second.
    properties_.Set("orvex.host.audio",
                    "gst:audiotestsrc freq=1000 volume=0.5 ! audio/x-raw,rate=44100,channels=1");
    platform::host::HostAudioRecordPort port;
    size_t min_frames = 0;
    ASSERT_EQ(port.getMinFrameCount(&min_frames, 48000, 1, 12), 0);
    auto record = port.create("orvex");
    ASSERT_EQ(record->set(1, 48000, 1, 12, min_frames), 0);
    ASSERT_EQ(record->start(), 0);
    std::vector<int16_t> pcm;
    std::vector<int16_t> block(min_frames * 2 * 4);
    while (pcm.size() < 2 * 48000 + 2 * 4800) {
        long got = record->read(block.data(), block.size() * 2);
        ASSERT_GT(got, 0);
        ASSERT_LE(static_cast<size_t>(got), min_frames * 4);
        ASSERT_EQ(got % 4, 0);
        pcm.insert(pcm.end(), block.begin(), block.begin() + got / 2);
    }
    record->stop();
    // Skip the first 100 ms (the resampler's start), then count one second.
    int crossings = 0;
    for (size_t i = 4800; i < 4800 + 48000; ++i) {
        ASSERT_EQ(pcm[2 * i], pcm[2 * i + 1]) << "frame " << i;
        if ((pcm[2 * i] < 0) != (pcm[2 * i + 2] < 0)) ++crossings;
    }
    EXPECT_NEAR(crossings, 2000, 10);
    EXPECT_TRUE(Lines("audio source").empty());
}

TEST_F(HostCaptureTest, PictureSourcesThatCannotStartShowNoSignalWithOneWarning) {
    struct Case {
        const char* value;
        const char* line;  // the whole log line up to GStreamer's own text
    };
    const Case cases[] = {
        {"gst:nosuchelement ! videoconvert",
         "MediaRecorder: video source gst:nosuchelement ! videoconvert cannot start: "
         "no element \"nosuchelement\""},
        {"gst:videotestsrc ! ! fakesink",
         "MediaRecorder: video source gst:videotestsrc ! ! "
         "fakesink cannot start: "},
        {"x11::4711", "MediaRecorder: video source x11::4711 cannot start: "},
        {"v4l2:/dev/orvex-no-such-camera",
         "MediaRecorder: video source v4l2:/dev/orvex-no-such-camera cannot start: "},
        // Sound is no picture: caps negotiation fails before the first frame.
        {"gst:audiotestsrc", "MediaRecorder: video source gst:audiotestsrc cannot start: "},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.value);
        log_.Clear();
        properties_.Set("orvex.host.video", c.value);
        auto r = Recorder(320, 240);
        // The track stands alone: it records "no signal" so that the sound plays.
        EXPECT_EQ(r->prepare(), 0);
        std::vector<std::string> lines = Lines("video source");
        ASSERT_EQ(lines.size(), 1u);
        EXPECT_EQ(lines[0].compare(0, strlen(c.line), c.line), 0) << lines[0];
        const std::string tail = "; showing \"no signal\", trying again in 1 s";
        ASSERT_GE(lines[0].size(), strlen(c.line) + tail.size()) << lines[0];
        EXPECT_EQ(lines[0].substr(lines[0].size() - tail.size()), tail);
        EXPECT_EQ(r->start(), 0);
        EXPECT_TRUE(WaitFor([&] { return binder_.frames.load() >= 3; }));
        EXPECT_EQ(r->release(), 0);
        binder_.frames = 0;
    }
}

TEST_F(HostCaptureTest, SoundSourcesThatCannotStartGiveSilenceAndOneWarning) {
    const char* saved = getenv("PULSE_SERVER");
    std::string keep = saved != nullptr ? saved : "";
    setenv("PULSE_SERVER", "unix:/nonexistent/orvex-pulse", 1);
    const char* const values[] = {"gst:nosuchelement", "pulse", "gst:audiotestsrc ! !"};
    for (const char* value : values) {
        SCOPED_TRACE(value);
        log_.Clear();
        properties_.Set("orvex.host.audio", value);
        platform::host::HostAudioRecordPort port;
        auto record = port.create("orvex");
        ASSERT_EQ(record->set(1, 48000, 1, 12, 960), 0);
        // The track stands alone: it starts, with silence, so that the picture plays.
        EXPECT_EQ(record->start(), 0);
        std::vector<std::string> lines = Lines("audio source");
        ASSERT_EQ(lines.size(), 1u);
        std::string head = std::string("AudioRecord: audio source ") + value + " cannot start: ";
        EXPECT_EQ(lines[0].compare(0, head.size(), head), 0) << lines[0];
        const std::string tail = "; silence, trying again in 1 s";
        ASSERT_GT(lines[0].size(), head.size() + tail.size()) << lines[0];
        EXPECT_EQ(lines[0].substr(lines[0].size() - tail.size()), tail);
        int16_t pcm[64];
        std::fill(std::begin(pcm), std::end(pcm), 1);
        EXPECT_EQ(record->read(pcm, sizeof pcm), static_cast<long>(sizeof pcm));
        EXPECT_TRUE(std::all_of(std::begin(pcm), std::end(pcm), [](int16_t v) { return v == 0; }));
        EXPECT_EQ(Lines("audio source").size(), 1u);  // no line per read
        record->stop();
    }
    if (saved != nullptr) {
        setenv("PULSE_SERVER", keep.c_str(), 1);
    } else {
        unsetenv("PULSE_SERVER");
    }
}

TEST_F(HostCaptureTest, PictureSourceEndingMidStreamIsReportedOnceAndFramesGoOn) {
    properties_.Set("orvex.host.video", "gst:videotestsrc num-buffers=10");
    auto r = Recorder(320, 240);
    ASSERT_EQ(r->prepare(), 0);
    ASSERT_EQ(r->start(), 0);
    ASSERT_TRUE(WaitFor([&] { return !Lines("stopped").empty(); }));
    int after = binder_.frames.load();
    EXPECT_TRUE(WaitFor([&] { return binder_.frames.load() >= after + 10; }));
    // A second later the source is started again: it gives its ten frames once more.
    EXPECT_TRUE(WaitFor([&] { return !Lines("is back").empty(); }));
    EXPECT_EQ(r->stop(), 0);
    EXPECT_EQ(Lines("stopped").at(0),
              "MediaRecorder: video source gst:videotestsrc num-buffers=10 stopped: end of "
              "stream; showing \"no signal\", trying again in 1 s");
    EXPECT_EQ(Lines("is back").at(0),
              "MediaRecorder: video source gst:videotestsrc num-buffers=10 is back");
}

TEST_F(HostCaptureTest, SoundSourceEndingMidStreamIsBridgedWithSilenceAndReopened) {
    properties_.Set("orvex.host.audio", "gst:audiotestsrc num-buffers=3 volume=0.5");
    platform::host::HostAudioRecordPort port;
    auto record = port.create("orvex");
    ASSERT_EQ(record->set(1, 48000, 1, 12, 960), 0);
    ASSERT_EQ(record->start(), 0);
    std::vector<int16_t> block(960 * 2);
    size_t silent_blocks = 0, sound_after_reopen = 0;
    // Real-time reads: the reopen comes a second after the end, so this reads about 1.1 s.
    for (int i = 0; i < 400 && sound_after_reopen == 0; ++i) {
        long got = record->read(block.data(), block.size() * 2);
        ASSERT_GT(got, 0);
        bool silent = true;
        for (long s = 0; s < got / 2; ++s) silent = silent && block[s] == 0;
        if (silent && !Lines("stopped").empty()) ++silent_blocks;
        if (!silent && !Lines("is back").empty()) ++sound_after_reopen;
    }
    record->stop();
    EXPECT_GE(silent_blocks, 5u);
    EXPECT_EQ(sound_after_reopen, 1u);
    const std::string source =
        "AudioRecord: audio source gst:audiotestsrc num-buffers=3 volume=0.5";
    EXPECT_EQ(Lines("stopped").at(0),
              source + " stopped: end of stream; silence, trying again in 1 s");
    EXPECT_EQ(Lines("is back"), (std::vector<std::string>{source + " is back"}));
}

TEST_F(HostCaptureTest, TheSubWindowTakesItsOwnSource) {
    properties_.Set("orvex.host.video", "gst:nosuchelement");
    properties_.Set("orvex.host.video.sub", "pattern");
    auto sub = Recorder(320, 240, true);
    EXPECT_EQ(sub->prepare(), 0);
    EXPECT_EQ(sub->source().kind, SourceChoice::kPattern);
    EXPECT_EQ(sub->release(), 0);
    auto main = Recorder(320, 240, false);
    EXPECT_EQ(main->prepare(), 0);  // "no signal" meanwhile
    EXPECT_EQ(main->source().kind, SourceChoice::kGst);
    EXPECT_EQ(main->release(), 0);
}

TEST(HostPatternLabel, LabelsAreDrawnInTheMiddle) {
    TestPattern pattern(320, 240);
    std::vector<uint8_t> plain(pattern.frameSize()), sub(plain.size()), lost(plain.size());
    pattern.draw(7, 500, plain.data());
    pattern.draw(7, 500, sub.data(), TestPattern::Label::kSub);
    pattern.draw(7, 500, lost.data(), TestPattern::Label::kNoSignal);
    auto middle_differs = [&](const std::vector<uint8_t>& a) {
        int differ = 0;
        for (int y = 100; y < 140; ++y) {
            for (int x = 100; x < 220; ++x) differ += a[y * 320 + x] != plain[y * 320 + x];
        }
        return differ;
    };
    EXPECT_GT(middle_differs(sub), 1000);
    EXPECT_GT(middle_differs(lost), 1000);
    EXPECT_NE(sub, lost);
    // The flash square and the counter stay where they are.
    EXPECT_EQ(sub[0], plain[0]);
    EXPECT_EQ(lost[300], plain[300]);
}

}  // namespace
