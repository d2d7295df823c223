#include "rtp/SendMP3Rtp.h"

#include <netinet/in.h>
#include <sys/socket.h>
#include <unistd.h>

#include <memory>

#include "base/OrvexLog.h"
#include "base/ThreadName.h"
#include "config/GlobalConfig.h"
#include "platform/UniqueFd.h"
#include "rtp/ClientFanout.h"
#include "rtp/RtpPackets.h"
#include "rtp/SendLoopState.h"
#include "sync/LazyInstance.h"

namespace {

constexpr const char* kTag = "orvex:::SendMP3Rtp";
constexpr useconds_t kIdleSleepUs = 5000;
// Printed when a run ends, whether a thread or the producer drove it.
constexpr const char* kRunEndedText = "\n exit MP3RtpTransportSession::SendAACRTPPACKET ";

TLock g_class_lock;
std::atomic<MP3RtpTransportSession*> g_instance{nullptr};

}  // namespace

MP3RtpTransportSession* MP3RtpTransportSession::instance() {
    return LazyInstance(g_instance, g_class_lock, [] { return new MP3RtpTransportSession(); });
}

void MP3RtpTransportSession::CloseInstance() {
    delete g_instance.exchange(nullptr, std::memory_order_acq_rel);
}

MP3RtpTransportSession::MP3RtpTransportSession()
    : RtpSendSession(g_class_lock, 8002, "\n MP3RtpTransportSession CloseThread() \n ") {}

// The loop runs a virtual of this object: it must stop before the object goes.
MP3RtpTransportSession::~MP3RtpTransportSession() { CloseSendThread(); }

void MP3RtpTransportSession::sendMP3RtpPacket(const Buffer_Item& item, ClientFanout& fanout,
                                              uint32_t timestamp, uint16_t sequence) {
    unsigned char packet[kRtpPacketMax];
    unsigned length = BuildAacPacket(item.data, static_cast<unsigned>(item.length), timestamp,
                                     sequence, packet, m_payload_type);
    if (length == 0) {
        // Not an ADTS frame that fits one packet: dropped, the stream goes on.
        OrvexLog(kTag, "\n  mp3 frame of %d bytes dropped ! \n", static_cast<int>(item.length));
        return;
    }
    fanout.Send(packet, length);
    fanout.Flush();
}

// What one run of the sender keeps from its start to its stop.
struct MP3RtpTransportSession::SendRun {
    explicit SendRun(int fd) : sock(fd), fanout(fd, false, "\n  mp3 frame send error ! \n ") {}

    const platform::UniqueFd sock;
    ClientFanout fanout;
    unsigned rate = 0;
    std::unique_ptr<Buffer_Item> item = std::make_unique<Buffer_Item>();
    AacSendState state;
    uint32_t ts = 0;
    uint16_t sequence = 0;
    bool recompute = true;
    unsigned audio_ms = 0;
};

std::unique_ptr<MP3RtpTransportSession::SendRun> MP3RtpTransportSession::BeginRun() {
    Global_Config* config = Global_Config::instance();
    auto run = std::make_unique<SendRun>(socket(AF_INET, SOCK_DGRAM, 0));
    sockaddr_in local{};
    local.sin_family = AF_INET;
    local.sin_port = htons(static_cast<uint16_t>(config->m_audio_rtp_port));
    local.sin_addr.s_addr = htonl(INADDR_ANY);
    (void)bind(run->sock.get(), reinterpret_cast<sockaddr*>(&local),
               sizeof local);  // unchecked, as ever
    run->rate = config->m_audio_rtp_frequency;
    m_payload_type = static_cast<unsigned>(config->m_audio_payload_type);
    run->fanout.SetTargets(m_dests.targets());
    return run;
}

bool MP3RtpTransportSession::Turn(SendRun& run) {
    Global_Config* config = Global_Config::instance();
    if (run.recompute) run.audio_ms = PositionMs(run.ts, run.rate);
    run.recompute = false;
    unsigned video_ms = config->get_timestamp(true);
    if (run.state.VideoLags(run.audio_ms, video_ms) && GET_ORVEX_API_DEBUG_PRINTF() == 1) {
        // The number shown is the video position itself; operators read it that way.
        OrvexPrintLog(kTag, "Video and audio timestamp compare: video delay %d \n",
                      static_cast<int>(video_ms));
    }
    GetSocketInfoList();
    bool got = m_ring != nullptr && m_ring->newread(*run.item);
    if (!got || config->isPause() || !config->InIISOK() || m_dests.targets().empty()) {
        return false;
    }
    AdvanceTimestamp(&run.ts, run.rate, run.item->timestamp, &m_last_item_time);
    config->set_timestamp(PositionMs(run.ts, run.rate), false);
    sendMP3RtpPacket(*run.item, run.fanout, run.ts, run.sequence);
    run.state.AfterSend(&run.sequence);
    run.recompute = true;
    return true;
}

void MP3RtpTransportSession::procMP3Thread() {
    NameThisThread("orvex-aac-send");
    std::unique_ptr<SendRun> run = BeginRun();
    while (m_running.load(std::memory_order_relaxed) == 1) {
        if (!Turn(*run)) Idle(kIdleSleepUs);
    }
    OrvexPrint("%s", kRunEndedText);
}

// Driven, the encoder's thread sends: a frame goes out as soon as it is written, with no
// thread to wake. The video sender paces itself on the same published position.
bool MP3RtpTransportSession::BeginDriven() {
    if (!Global_Config::instance()->aac_inline()) return false;
    TLock::Scoped hold(m_drive_lock);
    m_driven_run = BeginRun();
    return true;
}

void MP3RtpTransportSession::EndDriven() {
    TLock::Scoped hold(m_drive_lock);
    if (m_driven_run == nullptr) return;
    m_driven_run.reset();
    OrvexPrint("%s", kRunEndedText);
}

void MP3RtpTransportSession::Pump() {
    TLock::Scoped hold(m_drive_lock);
    if (m_driven_run == nullptr) return;
    while (m_running.load(std::memory_order_relaxed) == 1 && Turn(*m_driven_run)) {
    }
}
