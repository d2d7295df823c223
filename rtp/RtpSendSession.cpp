#include "rtp/RtpSendSession.h"

#include "base/OrvexLog.h"
#include "config/GlobalConfig.h"
#include "platform/LogPort.h"

namespace {
// Only a lost wake-up would need it: writes and CloseSendThread end the wait.
constexpr unsigned kIdleBoundMs = 100;
}  // namespace

RtpSendSession::RtpSendSession(TLock& class_lock, unsigned server_port, const char* closed_text)
    : m_dests(class_lock), m_server_port(server_port), m_closed_text(closed_text) {}

RtpSendSession::~RtpSendSession() { CloseSendThread(); }

void* RtpSendSession::Trampoline(void* self) {
    static_cast<RtpSendSession*>(self)->Run();
    return nullptr;
}

int RtpSendSession::StartSendThread() {
    if (m_thread_started) return 0;  // one send thread at a time
    m_running.store(1, std::memory_order_relaxed);
    m_wake_on_write.store(Global_Config::instance()->wake_on_write(), std::memory_order_relaxed);
    BeforeStart();
    if (BeginDriven()) {
        m_thread_started = m_driven = true;
        return 0;
    }
    int rc = pthread_create(&m_thread, nullptr, Trampoline, this);
    m_thread_started = rc == 0;
    if (rc != 0) {
        m_running.store(0, std::memory_order_relaxed);
        OrvexLogPriority(platform::kLogError, "orvex:::RtpSendSession",
                         "send thread could not start (%d): nothing is sent", rc);
    }
    return rc;
}

void RtpSendSession::CloseSendThread() {
    m_running.store(0, std::memory_order_relaxed);
    if (m_driven) {
        EndDriven();
        m_thread_started = m_driven = false;
        OrvexPrint("%s", m_closed_text);
    }
    if (m_thread_started && m_ring != nullptr) m_ring->wake_reader();
    if (m_thread_started) {
        pthread_join(m_thread, nullptr);
        m_thread_started = false;
        OrvexPrint("%s", m_closed_text);
    }
    m_dests.Clear();
}

void RtpSendSession::Idle(useconds_t poll_us) {
    // What is in the ring was just dropped or cannot be read: sleep as when polling.
    if (!m_wake_on_write.load(std::memory_order_relaxed) || m_ring == nullptr ||
        !m_ring->wait_readable(kItemHeaderSize + 1, kIdleBoundMs)) {
        usleep(poll_us);
    }
}

void RtpSendSession::add_dest_socket_info(void* key, int port, std::string ip) {
    m_dests.Add(key, port, ip);
}

void RtpSendSession::del_dest_socket_info(void* key) { m_dests.Del(key); }
