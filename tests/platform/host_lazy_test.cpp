// Which libraries the host's sources map: OpenH264 only for a picture the host encodes,
// GStreamer (through its module) only for a live source. This program links neither, so
// /proc/self/maps shows exactly what the sources loaded.
#include <gtest/gtest.h>
#include <stdlib.h>
#include <sys/wait.h>
#include <unistd.h>

#include <atomic>
#include <cstdio>
#include <fstream>
#include <memory>
#include <string>
#include <vector>

#include "platform/Ports.h"
#include "platform/host/HostAudio.h"
#include "platform/host/video/HostCamera.h"
#include "platform/host/video/HostMediaRecorder.h"
#include "tests/platform/HostPortsTest.h"

// GLib's allocations while it is loaded belong to it (see host_capture_test.cpp).
extern "C" const char* __lsan_default_suppressions() { return "leak:_dl_init\n"; }

namespace {

using platform::host::HostCamera;
using platform::host::HostMediaRecorder;

// "openh264", "gstreamer", "module", each when mapped, space separated.
std::string Mapped() {
    std::ifstream maps("/proc/self/maps");
    std::string text((std::istreambuf_iterator<char>(maps)), std::istreambuf_iterator<char>());
    std::string out;
    for (const char* name : {"libopenh264", "libgstreamer-1.0", "liborvex_host_gst"}) {
        if (text.find(name) == std::string::npos) continue;
        if (!out.empty()) out += ' ';
        out += name;
    }
    return out;
}

class HostLazyTest : public HostPortsTest {
protected:
    // Starts the picture and the sound the way capture start does, reads a block of sound,
    // stops both. "video=RC audio=RC", the codes prepare/start and the record's start gave.
    std::string Capture() {
        HostCamera camera;
        camera.unlock();
        HostMediaRecorder r;
        r.setCamera(camera);
        r.setVideoSource(1);
        r.setOutputFormat(101);
        r.setVideoEncoder(2);
        r.setVideoSize(320, 240);
        r.setVideoFrameRate(30);
        int video = r.prepare();
        if (video == 0) video = r.start();
        platform::host::HostAudioRecordPort port;
        auto record = port.create("orvex");
        record->set(1, 48000, 1, 12, 960);
        int audio = record->start();
        if (audio == 0) {
            int16_t pcm[960 * 2];
            record->read(pcm, sizeof pcm);
        }
        record->stop();
        r.release();
        return "video=" + std::to_string(video) + " audio=" + std::to_string(audio);
    }

    // Runs Capture in a child process, so that each case starts with nothing loaded, and
    // gives its result followed by what the child had mapped.
    std::string CaptureInChild() {
        int pipe_fds[2];
        if (pipe(pipe_fds) != 0) return "no pipe";
        pid_t child = fork();
        if (child == 0) {
            close(pipe_fds[0]);
            std::string result = Capture();
            result += " | " + Mapped();
            ssize_t n = write(pipe_fds[1], result.data(), result.size());
            _exit(n == static_cast<ssize_t>(result.size()) ? 0 : 1);
        }
        close(pipe_fds[1]);
        std::string result;
        char buffer[256];
        ssize_t n;
        while ((n = read(pipe_fds[0], buffer, sizeof buffer)) > 0) result.append(buffer, n);
        close(pipe_fds[0]);
        int status = 0;
        waitpid(child, &status, 0);
        if (!WIFEXITED(status) || WEXITSTATUS(status) != 0) result += " (child failed)";
        return result;
    }
};

TEST_F(HostLazyTest, SourcesMapOnlyTheLibrariesTheyUse) {
    ASSERT_EQ(Mapped(), "") << "this program must not link the libraries it looks for";
    struct Case {
        const char* video;
        const char* audio;
        const char* result;
    };
    const Case cases[] = {
        {"none", "tone", "video=0 audio=0 | "},
        {"none", "none", "video=0 audio=0 | "},
        {"pattern", "tone", "video=0 audio=0 | libopenh264"},
        {"none", "gst:audiotestsrc", "video=0 audio=0 | libgstreamer-1.0 liborvex_host_gst"},
        {"gst:videotestsrc", "none",
         "video=0 audio=0 | libopenh264 libgstreamer-1.0 liborvex_host_gst"},
    };
    for (const Case& c : cases) {
        properties_.Set("orvex.host.video", c.video);
        properties_.Set("orvex.host.audio", c.audio);
        EXPECT_EQ(CaptureInChild(), c.result) << c.video << " + " << c.audio;
    }
    EXPECT_EQ(Mapped(), "");
}

TEST_F(HostLazyTest, ModuleThatDoesNotLoadIsOneLinePerSource) {
    std::string junk = testing::TempDir() + "orvex-not-a-module.so";
    std::ofstream(junk) << std::string(256, 'x');
    struct Case {
        std::string path;
        const char* reason;  // the loader's, after the path
    };
    const Case cases[] = {
        {"/nonexistent/liborvex_host_gst.so", "cannot open shared object file"},
        {junk, "invalid ELF header"},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.path);
        setenv("ORVEX_HOST_GST_MODULE", c.path.c_str(), 1);
        log_.Clear();
        properties_.Set("orvex.host.video", "gst:videotestsrc");
        properties_.Set("orvex.host.audio", "gst:audiotestsrc");
        // Each track stands alone: "no signal" and silence, and both keep trying.
        EXPECT_EQ(Capture(), "video=0 audio=0");
        // Each line ends in the loader's own text; its start is ours.
        std::string load = "cannot start: cannot load liborvex_host_gst.so: " + c.path + ": ";
        const std::string heads[] = {
            "MediaRecorder: video source gst:videotestsrc " + load + c.reason,
            "AudioRecord: audio source gst:audiotestsrc " + load + c.reason,
        };
        std::vector<std::string> lines = Lines("source");
        EXPECT_EQ(lines.size(), 2u);
        lines.resize(2);
        for (int i = 0; i < 2; ++i) EXPECT_EQ(lines[i].substr(0, heads[i].size()), heads[i]);
    }
    unsetenv("ORVEX_HOST_GST_MODULE");
    remove(junk.c_str());
    // The "no signal" picture is encoded; GStreamer never loaded.
    EXPECT_EQ(Mapped(), "libopenh264");
}

}  // namespace
