// The orvex process: starts the streaming server on port 554 and the binder service that
// receives the encoded video, then idles until SIGTERM.
#include <fcntl.h>
#include <poll.h>
#include <signal.h>
#include <sys/time.h>
#include <unistd.h>

#include <atomic>
#include <cstring>

#include "base/OrvexLog.h"
#include "capture/Livecamera.h"
#include "capture/orvexaudiomain.h"
#include "config/GlobalConfig.h"
#include "platform/Ports.h"
#include "publish/Publisher.h"
#include "server/RtspService_t.h"
#include "server/skyvo_rtsp.h"
#include "server/skyvo_service.h"
#include "service/OrvexSystemService.h"
#include "web/WebViewer.h"
#include "webrtc/WebRtc.h"

namespace {

constexpr const char* kTag = "orvex:::orvexmainstart";
constexpr const char* kVersion = "1.6.1.android";

// 1 while the process runs; the server's listener clears it too when it ends for good.
int g_quit_flag = 0;
// Written by the signal handler, read by the main loop (no stdio inside the handler).
std::atomic<long> g_signal_sec{0};
std::atomic<long> g_signal_usec{0};
std::atomic<int> g_pending_signal{0};
// Waiting for writes, main sleeps on this pipe, which the handler writes to: a signal that
// lands between main's look at the flag and its sleep still ends the sleep at once. It stays
// open until the process ends, as a handler may still be writing.
std::atomic<int> g_signal_pipe{-1};

void sig_usr(int signo) {
    g_pending_signal.store(signo, std::memory_order_relaxed);
    if (signo != SIGTERM) return;
    timeval now{};
    gettimeofday(&now, nullptr);
    g_signal_sec.store(now.tv_sec, std::memory_order_relaxed);
    g_signal_usec.store(now.tv_usec, std::memory_order_relaxed);
    __atomic_store_n(&g_quit_flag, 0, __ATOMIC_RELAXED);
    int fd = g_signal_pipe.load(std::memory_order_relaxed);
    if (fd >= 0) {
        const char byte = 1;
        ssize_t ignored = write(fd, &byte, 1);  // async-signal-safe; a full pipe is awake
        (void)ignored;
    }
}

// Sleeps up to `us`, or until the signal handler writes to the pipe.
void SleepOrSignal(int pipe_read, useconds_t us) {
    pollfd p{pipe_read, POLLIN, 0};
    if (poll(&p, 1, static_cast<int>(us / 1000)) == 1) {
        char bytes[16];
        while (read(pipe_read, bytes, sizeof bytes) > 0) {
        }
    }
}

// What the handler could not print itself.
void ReportSignal() {
    int signo = g_pending_signal.exchange(0, std::memory_order_relaxed);
    if (signo == 0) return;
    OrvexPrintLog(kTag, "sig_usr");
    if (signo != SIGTERM) {
        OrvexPrintLog(kTag, "received other signal %d\n", signo);
        return;
    }
    OrvexPuts("received SIGTERM");
    OrvexLog(kTag, "received SIGTERM\n");
}

int main_capture_video_open() {
    OrvexRaw("main_capture_video_open");
    Start_Video_Capture();
    return 0;
}

int main_capture_video_close() {
    OrvexRaw("main_capture_video_close");
    Close_Video_Capture();
    return 0;
}

int main_capture_audio_open() {
    OrvexRaw("main_capture_audio_open");
    start_audio_record_enc();
    return 0;
}

int main_capture_audio_close() {
    OrvexRaw("main_capture_audio_close");
    stop_audio_record_enc();
    return 0;
}

}  // namespace

int main(int argc, char** argv) {
    platform::InstallDefaultPorts();
    OrvexPrintLog(kTag, "main");
    if (argc == 2 && strcmp(argv[1], "-v") == 0) {
        platform::ShowStdoutMirror();
        OrvexPrintLog(kTag, "\n skyvoap version:%s,\n", kVersion);
        return 0;
    }
    set_live_quit_flag_var(&g_quit_flag);
    if (signal(SIGTERM, sig_usr) == SIG_ERR) OrvexPrintLog(kTag, "can't catch SIGTERM");
    __atomic_store_n(&g_quit_flag, 1, __ATOMIC_RELAXED);

    skyvo_rtsp_sever_init();
    register_audio_open_thread_func(main_capture_audio_open);
    register_video_open_thread_func(main_capture_video_open);
    register_audio_close_thread_func(main_capture_audio_close);
    register_video_close_thread_func(main_capture_video_close);
    skyvo_set_mp3_rtp_config(48000);
    skyvo_set_h264_rtp_config(90000);
    int result = skyvo_rtsp_sever_open(554);  // fixed: no option changes the port
    if (result != 0) {
        OrvexPuts("\n open rtstp server failed !");  // "rtstp" as operators know it
        OrvexLog(kTag, "\n open rtstp server failed !\n");
        skyvo_rtsp_sever_close();
        return result;
    }
    const config::Settings& settings = skyvo_rtsp_service()->settings();
    // only when kv.orvex.http names a port; one gate judges RTSP and HTTP alike
    // WebRTC playback (kv.orvex.webrtc) is offered on the web viewer's server.
    WhepEndpoint* whep = StartWebRtc(settings, skyvo_rtsp_service()->listener());
    StartWebViewer(settings, skyvo_rtsp_service()->listener(),
                   &skyvo_rtsp_service()->listener()->access(), whep);
    // only when kv.orvex.publish names servers
    StartPublishing(settings, skyvo_rtsp_service()->listener());
    start_orvex_system_service();
    platform::AnnounceService(
        554, WebViewerPort(), settings.bind,
        "who may watch: " + skyvo_rtsp_service()->listener()->access().Summary());
    const useconds_t poll_us = Global_Config::instance()->run_flag_poll_us();
    int signal_pipe[2] = {-1, -1};
    if (Global_Config::instance()->wake_on_write() &&
        pipe2(signal_pipe, O_NONBLOCK | O_CLOEXEC) == 0) {
        g_signal_pipe.store(signal_pipe[1], std::memory_order_relaxed);
    }
    while (__atomic_load_n(&g_quit_flag, __ATOMIC_RELAXED) != 0) {
        ReportSignal();
        if (signal_pipe[0] >= 0) {
            SleepOrSignal(signal_pipe[0], poll_us);
        } else {
            usleep(poll_us);
        }
    }
    ReportSignal();

    // Clients and send sessions go before the frame source does; web viewers and the publisher
    // hold capture through the listener, so they go first.
    StopPublishing();
    StopWebViewer();
    StopWebRtc();  // after the viewer: no offer is under way any more
    skyvo_rtsp_sever_close();
    close_orvex_system_service();
    timeval now{};
    gettimeofday(&now, nullptr);
    long usec = static_cast<long>(now.tv_usec) - g_signal_usec.load(std::memory_order_relaxed);
    long elapsed =
        (static_cast<long>(now.tv_sec) - g_signal_sec.load(std::memory_order_relaxed)) * 1000 +
        usec / 1000;  // the division truncates toward zero on the signed difference
    OrvexPrintLog(kTag, "******elapse time is %d ms", static_cast<int>(elapsed));

    OrvexPuts("\n orvex all services exit ! ");
    OrvexLog(kTag, "\n orvex all services exit ! \n");
    return orvex_system_service_refused() ? 1 : 0;
}
