#include "rtsp/RtspTransport.h"

#include <arpa/inet.h>
#include <fcntl.h>
#include <netinet/tcp.h>
#include <sys/socket.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <vector>

#include "base/Clocks.h"
#include "base/OrvexLog.h"
#include "base/ThreadName.h"
#include "config/GlobalConfig.h"
#include "config/LivecameraResolution.h"
#include "config/QuitFlag.h"
#include "config/livepipmanager.h"
#include "platform/LogPort.h"
#include "rtp/SendH264Rtp.h"
#include "rtp/SendMP3Rtp.h"
#include "rtsp/CaptureQuery.h"
#include "rtsp/RtspResponse.h"
#include "rtsp/RtspSession.h"

std::atomic<int> g_capture_running{0};
std::atomic<unsigned> g_accepts_without_clients{0};

namespace {

constexpr const char* kTag = "orvex:::RtspTransport";
constexpr int kMaxClients = 5;
std::atomic<int> g_select_wait_ms{2000};
// While capture is held, a stopped capture comes back within this wait.
constexpr int kHeldSelectWaitMs = 250;
// How long a hold's capture choice waits for a connected RTSP client to make its own (a
// connecting client sends DESCRIBE at once). A client that stays connected without playing
// (a player that gave up, a probe) must not keep capture from every viewer until it is dropped.
constexpr unsigned kHoldChoiceWaitMs = 1000;

void ResetOnClose(int fd) {
    linger reset{1, 0};
    setsockopt(fd, SOL_SOCKET, SO_LINGER, &reset, sizeof reset);
}

// Three tries, 1 ms apart; a frame that finds no room is dropped whole.
int AddWithRetries(cycle_buffer& ring, unsigned char* data, unsigned len, unsigned timestamp) {
    if (data == nullptr || len == 0) return 0;
    for (int attempt = 0; attempt < 3; ++attempt) {
        if (ring.newwrite(data, static_cast<int>(len), timestamp, false)) return 1;
        usleep(1000);
    }
    return 0;
}

}  // namespace

void RtspTransport::SetSelectWaitMs(int ms) {
    g_select_wait_ms.store(ms, std::memory_order_relaxed);
}

void CloseVideoAndAudioDecodeAndSend() {
    g_capture_running.store(0, std::memory_order_relaxed);
    H264RtpTransportSession* video = H264RtpTransportSession::instance();
    MP3RtpTransportSession* audio = MP3RtpTransportSession::instance();
    video->CloseSendThread();
    audio->CloseSendThread();
    Global_Config* config = Global_Config::instance();
    config->video_audio_close_cap();
    if (video->GetInputRing() != nullptr) video->GetInputRing()->reset();
    if (audio->GetInputRing() != nullptr) audio->GetInputRing()->reset();
    config->SetTVParameterDefault();
    config->set_pause_stat(false);
}

RtspTransport::RtspTransport() = default;

RtspTransport::~RtspTransport() {
    // Capture was stopped by CloseAll; here only the thread and the sockets go.
    m_running.store(0, std::memory_order_relaxed);
    if (m_thread_started) pthread_join(m_thread, nullptr);
    Close();
    for (std::atomic<int>* end : {&m_wake_read, &m_wake_write}) {
        int fd = end->exchange(-1);
        if (fd >= 0) close(fd);
    }
}

int RtspTransport::listen_port() const { return ntohs(m_listen_addr.sin_port); }

bool RtspTransport::Open(const char* ip, unsigned port, unsigned extra) {
    if (m_opened != 0) return true;
    m_address = ip != nullptr ? ip : "";
    m_port = port;
    m_extra = extra;
    m_listen_fd.reset(socket(AF_INET, SOCK_STREAM, 0));
    if (!m_listen_fd.valid()) {
        OrvexPrint("failed to create socket");
        Close();
        return false;
    }
    int on = 1;
    if (setsockopt(m_listen_fd.get(), SOL_SOCKET, SO_REUSEADDR, &on, sizeof on) != 0) {
        OrvexLogPriority(platform::kLogError, "orvex:::RtspSession",
                         "set reuse rtsp address wrong %s", strerror(errno));
        m_listen_fd.reset();
        return false;
    }
    m_listen_addr = sockaddr_in{};
    m_listen_addr.sin_family = AF_INET;
    m_listen_addr.sin_port = htons(static_cast<uint16_t>(port));
    m_listen_addr.sin_addr.s_addr = inet_addr(m_address.c_str());
    auto fail = [this](const char* text) {
        OrvexPrint("%s", text);
        m_listen_fd.reset();
        return false;
    };
    // Both spellings "rtstptransport" are the texts operators know.
    if (bind(m_listen_fd.get(), reinterpret_cast<sockaddr*>(&m_listen_addr),
             sizeof m_listen_addr) != 0) {
        const int error = errno;
        if (error == EADDRINUSE) {
            OrvexLogPriority(platform::kLogError, kTag,
                             "%s:%u is held by another process (another orvex, or another RTSP "
                             "server): stop it, or run this one in a network namespace of its own "
                             "(unshare -n)",
                             m_address.c_str(), port);
        } else {
            OrvexLogPriority(platform::kLogError, kTag, "cannot listen on %s:%u: %s",
                             m_address.c_str(), port, strerror(error));
        }
        return fail("\n rtstptransport bind error. ");
    }
    if (listen(m_listen_fd.get(), 128) != 0) return fail("\n  rtstptransport listen error. ");
    socklen_t len = sizeof m_listen_addr;
    getsockname(m_listen_fd.get(), reinterpret_cast<sockaddr*>(&m_listen_addr), &len);
    m_running.store(1, std::memory_order_relaxed);
    if (pthread_create(&m_thread, nullptr, StartListenThread, this) != 0) {
        OrvexPrintLog(kTag, "in Open()--->thread_create failed ");
    } else {
        m_thread_started = true;
    }
    OrvexPrint("\nRtspTransport:    Begin listen connect. ip address:%s  port:%d\n",
               m_address.c_str(), static_cast<int>(port));
    m_opened = 1;
    return true;
}

void* RtspTransport::StartListenThread(void* self) {
    NameThisThread("orvex-rtsp");
    static_cast<RtspTransport*>(self)->ListenThread();
    return nullptr;
}

bool RtspTransport::Close() {
    if (m_opened == 0) {
        // A failed Open may have left its socket behind.
        m_listen_fd.reset();
        return true;
    }
    while (!m_sessions.empty()) DropSession(m_sessions.begin());
    m_addresses.clear();
    m_client_count.store(0, std::memory_order_relaxed);
    m_listen_fd.reset();
    m_opened = 0;
    return true;
}

void RtspTransport::DropSession(std::map<int, std::unique_ptr<RtspSession>>::iterator it) {
    {
        thread_mutex::Scoped hold(m_clients_lock);
        m_client_fds.erase(it->first);
    }
    m_sessions.erase(it);
}

void RtspTransport::CloseAll() {
    // The listener goes first: it may itself be stopping capture for a departing client, and
    // the send threads must be stopped by one thread at a time.
    m_running.store(0, std::memory_order_relaxed);
    if (Global_Config::instance()->wake_on_write()) {
        // Not left to time out: a client being served is cut off from reading (its request in
        // progress still completes), and the listener's wait ends.
        {
            thread_mutex::Scoped hold(m_clients_lock);
            for (int fd : m_client_fds) shutdown(fd, SHUT_RD);
        }
        Wake();
    }
    if (m_thread_started) {
        pthread_join(m_thread, nullptr);
        m_thread_started = false;
    }
    CloseVideoAndAudioDecodeAndSend();
    Close();
}

void RtspTransport::ServePipRestart() {
    Global_Config* config = Global_Config::instance();
    if (g_pip_stop_flag.exchange(0, std::memory_order_relaxed) != 0) {
        config->video_audio_close_cap();
        if (g_follow_main_flag.load(std::memory_order_relaxed) == 1) m_reopen_pending = true;
    }
    if (!m_reopen_pending) return;
    if (--m_reopen_countdown > 0) return;
    // A fast quit in the meantime (follow-main cleared) cancels the reopen.
    if (g_follow_main_flag.load(std::memory_order_relaxed) == 1) {
        m_reopened = 1;
        config->video_audio_open_cap();
    }
    m_reopen_countdown = 3;
    m_reopen_pending = false;
}

void RtspTransport::HoldCapture(const std::string& query) {
    {
        thread_mutex::Scoped hold(m_hold_lock);
        if (!query.empty()) {
            m_hold_query = query;
            m_hold_query_pending = true;
            m_hold_query_ms = GetTimeStampMillsec();
        }
    }
    m_capture_holders.fetch_add(1, std::memory_order_relaxed);
    Wake();
}

void RtspTransport::ReleaseCapture() {
    int before = m_capture_holders.load(std::memory_order_relaxed);
    while (before > 0 && !m_capture_holders.compare_exchange_weak(before, before - 1)) {
    }
    Wake();
}

void RtspTransport::Wake() {
    if (m_wake_write.load(std::memory_order_acquire) < 0) {
        thread_mutex::Scoped hold(m_wake_lock);
        int fds[2];
        if (m_wake_write.load(std::memory_order_relaxed) < 0 &&
            pipe2(fds, O_NONBLOCK | O_CLOEXEC) == 0) {
            m_wake_read.store(fds[0], std::memory_order_release);
            m_wake_write.store(fds[1], std::memory_order_release);
        }
    }
    int fd = m_wake_write.load(std::memory_order_acquire);
    char byte = 1;
    // A full pipe already holds a wake-up.
    if (fd >= 0 && write(fd, &byte, 1) < 0 && errno != EAGAIN) {
        OrvexLogPriority(platform::kLogWarn, kTag, "listener wake failed: %s", strerror(errno));
    }
}

void RtspTransport::DrainWake() {
    int fd = m_wake_read.load(std::memory_order_acquire);
    char bytes[64];
    while (fd >= 0 && read(fd, bytes, sizeof bytes) > 0) {
    }
}

void RtspTransport::ServeCaptureHolders() {
    int holders = m_capture_holders.load(std::memory_order_relaxed);
    bool nobody = m_client_count.load(std::memory_order_relaxed) == 0;
    if (holders == 0) {
        // The last hold went: stop what it kept running, unless an RTSP client is here.
        if (m_held && nobody && g_capture_running.load(std::memory_order_relaxed) != 0) {
            CloseVideoAndAudioDecodeAndSend();
        }
        m_held = false;
        return;
    }
    m_held = true;
    std::string query;
    {
        thread_mutex::Scoped hold(m_hold_lock);
        // A connected RTSP client may still choose the capture: the hold's choice waits until
        // nobody is connected, rather than being lost and capture started with none at all.
        // After kHoldChoiceWaitMs capture starts anyway, with the hold's choice only when
        // nothing was ever chosen.
        if (m_hold_query_pending && !nobody) {
            if (GetTimeStampMillsec() - m_hold_query_ms < kHoldChoiceWaitMs) return;
            if (capture_state().width == 0) {
                query.swap(m_hold_query);
                m_hold_query_pending = false;
            }
        } else {
            if (m_hold_query_pending) query.swap(m_hold_query);
            m_hold_query_pending = false;
        }
    }
    // A size the capture refuses would run capture with no picture for every consumer: the
    // last accepted choice stays, or tools/run.sh's when there is none.
    unsigned width = 0, height = 0;
    if (!query.empty()) {
        get_platform_info();
        CaptureQuerySize(query, &width, &height);
    }
    const CaptureState& state = capture_state();
    if (!query.empty() && ResolutionCode(width, height, state.board) < 0) {
        OrvexLogPriority(platform::kLogWarn, kTag,
                         "capture keys %s ask for %ux%u, a size the capture refuses; keeping "
                         "%ux%u (accepted on %s: %s)",
                         query.c_str(), width, height, state.width != 0 ? state.width : 1280,
                         state.width != 0 ? state.height : 720, state.board,
                         AcceptedSizesText(state.board).c_str());
        query = state.width != 0 ? std::string() : CaptureQueryFor("");
    }
    // An RTSP client's own choice stands; a refused query leaves the last accepted one.
    if (!query.empty() && ApplyCaptureQuery(query) != CaptureQueryResult::kApplied) {
        OrvexLogPriority(platform::kLogWarn, kTag, "capture keys refused: %s", query.c_str());
    }
    if (g_capture_running.load(std::memory_order_relaxed) == 0) StartCaptureAndSend();
}

void RtspTransport::ListenThread() {
    while (m_running.load(std::memory_order_relaxed) == 1) {
        ServePipRestart();
        ServeCaptureHolders();
        fd_set ready;
        FD_ZERO(&ready);
        int max_fd = m_listen_fd.get();
        FD_SET(m_listen_fd.get(), &ready);
        for (const auto& entry : m_sessions) {
            FD_SET(entry.first, &ready);
            if (entry.first > max_fd) max_fd = entry.first;
        }
        int wake_fd = m_wake_read.load(std::memory_order_acquire);
        if (wake_fd >= 0) {
            FD_SET(wake_fd, &ready);
            if (wake_fd > max_fd) max_fd = wake_fd;
        }
        int wait_ms = g_select_wait_ms.load(std::memory_order_relaxed);
        if (m_held && wait_ms > kHeldSelectWaitMs) wait_ms = kHeldSelectWaitMs;
        timeval wait{wait_ms / 1000, (wait_ms % 1000) * 1000};
        int n = select(max_fd + 1, &ready, nullptr, nullptr, &wait);
        if (n > 0 && wake_fd >= 0 && FD_ISSET(wake_fd, &ready)) DrainWake();
        if (n >= 0 && ProcessReadRtspSession(ready) != 0) {
            ProcessNewIncomingRtspSession(m_listen_fd.get(), ready, max_fd);
        }
        m_rounds.fetch_add(1, std::memory_order_relaxed);
    }
    OrvexPrint("\n quit all orvex loop ! ");
    // The process ends with its listener.
    ClearLiveQuitFlag();
}

int RtspTransport::ProcessNewIncomingRtspSession(int listenFd, fd_set& ready, int& maxFd) {
    if (!FD_ISSET(listenFd, &ready)) return 0;
    sockaddr_in peer{};
    socklen_t len = sizeof peer;
    int fd = accept(listenFd, reinterpret_cast<sockaddr*>(&peer), &len);
    if (fd < 1) return 0;
    int count = m_client_count.load(std::memory_order_relaxed);
    if (count == 0) g_accepts_without_clients.fetch_add(1, std::memory_order_relaxed);
    if (!m_access.AdmitConnection(ntohl(peer.sin_addr.s_addr), DottedAddress(peer))) {
        ResetOnClose(fd);
        close(fd);
        return 0;
    }
    if (count > kMaxClients - 1) {
        OrvexPrint("\n CloseSockid,socketid:%d,\n", fd);
        // The trace above is stdout only; whoever is refused needs a line in the log.
        OrvexLogPriority(platform::kLogWarn, kTag,
                         "rtsp client %s refused: %d clients already watch, the most served",
                         DottedAddress(peer).c_str(), kMaxClients);
        ResetOnClose(fd);
        close(fd);
        return 0;
    }
    std::string ip = DottedAddress(peer);
    OrvexPrint("\n rtsp session new connection client[%d] %s:%d --2 \n", count, ip.c_str(),
               ntohs(peer.sin_port));
    if (fd > maxFd) maxFd = fd;
    int old = FindSameIpFromMap(m_addresses, ip.c_str());
    if (old >= 0) {
        // A client that reconnects never holds two sessions: the old one is reset and goes.
        OrvexPrint("\n rtsp session find same addr:%s,\n", ip.c_str());
        OrvexPrint("\n CloseSockid,socketid:%d,\n", old);
        ResetOnClose(old);  // the session's own close below resets it
        ProcessDelRtspSession(old);
        if (m_client_count.load(std::memory_order_relaxed) == 0) CloseVideoAndAudioDecodeAndSend();
    }
    m_client_count.fetch_add(1, std::memory_order_relaxed);
    // A vanished peer is noticed within about six seconds.
    int on = 1, idle = 1, interval = 1, probes = 5;
    setsockopt(fd, SOL_SOCKET, SO_KEEPALIVE, &on, sizeof on);
    setsockopt(fd, IPPROTO_TCP, TCP_KEEPIDLE, &idle, sizeof idle);
    setsockopt(fd, IPPROTO_TCP, TCP_KEEPINTVL, &interval, sizeof interval);
    setsockopt(fd, IPPROTO_TCP, TCP_KEEPCNT, &probes, sizeof probes);
    // Answers go out line by line: without this, Nagle holds the later lines back, and a
    // connection closed right after an error answer (closes reset) would lose them.
    setsockopt(fd, IPPROTO_TCP, TCP_NODELAY, &on, sizeof on);
    m_sessions[fd] = std::make_unique<RtspSession>(fd, m_listen_addr, peer, this, &m_access);
    {
        thread_mutex::Scoped hold(m_clients_lock);
        m_client_fds.insert(fd);
    }
    m_addresses[fd] = ip;
    return 1;
}

void RtspTransport::StartStreaming(int fd) {
    Global_Config* config = Global_Config::instance();
    sockaddr_in local{};
    socklen_t len = sizeof local;
    if (getsockname(fd, reinterpret_cast<sockaddr*>(&local), &len) == 0) {
        config->m_server_address = DottedAddress(local);
    }
    if (g_capture_running.load(std::memory_order_relaxed) != 0) return;
    StartCaptureAndSend();
}

void RtspTransport::StartCaptureAndSend() {
    Global_Config* config = Global_Config::instance();
    g_capture_running.store(1, std::memory_order_relaxed);
    H264RtpTransportSession* video = H264RtpTransportSession::instance();
    MP3RtpTransportSession* audio = MP3RtpTransportSession::instance();
    uint32_t now = GetTimeStampMillsec();
    video->SetBaseTime(now);
    audio->SetBaseTime(now);
    if (video->GetInputRing() != nullptr) video->GetInputRing()->reset();
    if (audio->GetInputRing() != nullptr) audio->GetInputRing()->reset();
    video->StartSendThread();
    audio->StartSendThread();
    config->video_audio_open_cap();
}

int RtspTransport::ProcessReadRtspSession(fd_set& ready) {
    std::vector<int> fds;
    for (const auto& entry : m_sessions) fds.push_back(entry.first);
    // In descriptor order; a ready client is served until it leaves.
    for (int fd : fds) {
        if (!FD_ISSET(fd, &ready)) continue;
        for (;;) {
            auto it = m_sessions.find(fd);
            if (it == m_sessions.end()) break;
            int type = 0;
            errno = 0;
            int result = it->second->RtspSessionThread(type);
            if (result == 0) {
                if (type == 128 && m_client_count.load(std::memory_order_relaxed) == 1) {
                    StartStreaming(fd);
                }
                // Shutting down: stop serving after the request in progress.
                if (m_running.load(std::memory_order_relaxed) != 1) return 0;
                continue;
            }
            if (errno == EINTR) continue;
            CloseVideoAndAudioDecodeAndSend();
            if (ProcessDelRtspSessionOther(fd) != 0)
                m_client_count.fetch_sub(1, std::memory_order_relaxed);
            DropSession(it);
            break;
        }
    }
    return m_running.load(std::memory_order_relaxed) == 1 ? 1 : 0;
}

int RtspTransport::ProcessDelRtspSession(int fd) {
    auto it = m_sessions.find(fd);
    if (it == m_sessions.end()) return 0;
    OrvexPrint("\n RtspSessionMap delete one !");
    DropSession(it);
    ProcessDelRtspSessionOther(fd);
    m_client_count.fetch_sub(1, std::memory_order_relaxed);
    return 1;
}

int RtspTransport::ProcessDelRtspSessionOther(int fd) { return m_addresses.erase(fd) > 0 ? 1 : 0; }

int RtspTransport::FindSameIpFromMap(std::map<int, std::string>& addresses, const char* ip) {
    for (const auto& entry : addresses) {
        if (ip != nullptr && entry.second == ip) return entry.first;
    }
    return -1;
}

int RtspTransport::skyvo_add_h264_data(unsigned char* data, unsigned len) {
    // Time stamp 0: the ring stamps the frame with the monotonic clock.
    return AddWithRetries(m_video_ring, data, len, 0);
}

int RtspTransport::skyvo_add_mp3_data(unsigned char* data, unsigned len, unsigned timestamp) {
    int added = AddWithRetries(m_audio_ring, data, len, timestamp);
    // Encoding inline, the encoder's thread sends its frames too.
    if (Global_Config::instance()->aac_inline()) MP3RtpTransportSession::instance()->Pump();
    return added;
}
