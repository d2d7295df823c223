#include "rtp/SendH264Rtp.h"

#include <sys/socket.h>
#include <unistd.h>

#include <memory>

#include "base/OrvexLog.h"
#include "base/ThreadName.h"
#include "codec/Base64.h"
#include "codec/h264_sps.h"
#include "config/GlobalConfig.h"
#include "platform/UniqueFd.h"
#include "rtp/ClientFanout.h"
#include "rtp/FrameLatency.h"
#include "rtp/RtpPackets.h"
#include "rtp/SendLoopState.h"
#include "sync/LazyInstance.h"

namespace {

constexpr const char* kTag = "orvex:::SendH264Rtp";
constexpr useconds_t kIdleSleepUs = 2000;

TLock g_class_lock;
std::atomic<H264RtpTransportSession*> g_instance{nullptr};

}  // namespace

H264RtpTransportSession* H264RtpTransportSession::instance() {
    return LazyInstance(g_instance, g_class_lock, [] { return new H264RtpTransportSession(); });
}

void H264RtpTransportSession::CloseInstance() {
    delete g_instance.exchange(nullptr, std::memory_order_acq_rel);
}

H264RtpTransportSession::H264RtpTransportSession()
    : RtpSendSession(g_class_lock, 8000, "\n H264RtpTransportSession CloseThread() \n ") {}

// The loop runs a virtual of this object: it must stop before the object goes.
H264RtpTransportSession::~H264RtpTransportSession() { CloseSendThread(); }

void H264RtpTransportSession::BeforeStart() {
    m_dests.MarkChanged();
    m_sps_seen = false;
    m_last_nal_type = 0;  // the last run's last unit says nothing of this run's first
    // Before the thread runs: the clients that set up before capture started are held to a key
    // picture too, as the items after a ring reset may begin inside a picture.
    Global_Config* config = Global_Config::instance();
    config->read_join_mode();
    m_dests.SetJoinAtKey(config->join_at_key());
}

void H264RtpTransportSession::InspectParameterSets(const Buffer_Item& item) {
    if (item.length < 5) return;
    unsigned n = static_cast<unsigned>(item.length) - 4;
    unsigned type = item.data[4] & 0x1F;
    if (!m_sps_seen && type == 7) {
        h264_sps_t sps;
        m_time_scale = h264_parse_sps(item.data + 5, n - 1, m_time_scale, &sps);
        char complaint[64];
        if (h264_sps_complaint(sps, complaint, sizeof complaint)) OrvexPrint("%s", complaint);
        if (m_time_scale == 0) {
            OrvexPrint("The SPS's time_scale field info is error!");
        } else {
            Base64Encode(item.data + 4, n, m_sps_base64);
            m_sps_seen = true;
        }
    }
    if (!m_pps_seen && type == 8) {
        Base64Encode(item.data + 4, n, m_pps_base64);
        m_pps_seen = true;
    }
}

bool H264RtpTransportSession::StartsKeyPicture(const Buffer_Item& item) {
    if (item.length < 5) return false;
    const unsigned type = item.data[4] & 0x1F;
    const unsigned before = m_last_nal_type;
    m_last_nal_type = type;
    // Its SPS, or the first IDR slice of a stream that sends no parameter sets in front (after
    // an SPS, PPS, SEI, delimiter or slice of the same picture it would be a later part).
    return type == 7 ||
           (type == 5 && before != 5 && before != 6 && before != 7 && before != 8 && before != 9);
}

void H264RtpTransportSession::ReportLatency(unsigned ring_wait_ms, Clock::time_point send_start,
                                            FrameLatency* latency) {
    auto send_us = std::chrono::duration_cast<std::chrono::microseconds>(Clock::now() - send_start);
    char line[160];
    if (latency->Add(ring_wait_ms, static_cast<uint32_t>(send_us.count()), line, sizeof line)) {
        OrvexLog(kTag, "%s", line);
    }
}

void H264RtpTransportSession::procH264Thread() {
    NameThisThread("orvex-h264-send");
    const platform::UniqueFd sock(socket(AF_INET, SOCK_DGRAM, 0));
    m_sps_seen = true;  // inspection stays dormant unless a flag is cleared
    m_pps_seen = true;
    m_time_scale = 1;
    Global_Config* config = Global_Config::instance();
    const unsigned rate = config->m_video_rtp_frequency;
    const unsigned payload_type = static_cast<unsigned>(config->m_video_payload_type);
    // A megabyte: on the heap, as a 32-bit thread stack may not hold it.
    auto item = std::make_unique<Buffer_Item>();
    ClientFanout fanout(sock.get(), true, "\n  h264 frame send error ! \n ");
    fanout.SetTargets(m_dests.targets());
    H264SendState state;
    uint32_t ts = 0;
    uint16_t sequence = 0;

    const bool report_latency = config->report_latency();
    FrameLatency latency;

    bool recompute = true;
    unsigned video_ms = 0;
    while (m_running.load(std::memory_order_relaxed) == 1) {
        // The position is not recomputed after a sleep, only after a sent item.
        if (recompute) video_ms = PositionMs(ts, rate);
        recompute = false;
        unsigned audio_ms = config->get_timestamp(false);
        if (state.MustWaitForAudio(video_ms, audio_ms)) {
            if (GET_ORVEX_API_DEBUG_PRINTF() == 1) {
                OrvexPrintLog(kTag, "Video and audio timestamp compare: audio delay %d \n",
                              static_cast<int32_t>(video_ms - audio_ms));
            }
            usleep(kIdleSleepUs);  // audio moves on by itself: no write to wait for here
            continue;
        }
        m_dests.Refresh();
        if (m_ring == nullptr || !m_ring->newread(*item)) {
            Idle(kIdleSleepUs);
            continue;
        }
        if (state.TakeFirstItem()) {
            OrvexPrint("*****h264 set current signal status 1 ");
            OrvexLog(kTag, "*****h264 set current signal status 1 \n");
            config->set_current_signal_status(1);
        }
        if (state.Admit(config->isPause()) == H264SendState::kDrop) {
            Idle(kIdleSleepUs);
            continue;
        }
        InspectParameterSets(*item);
        // Clients that joined since the last key picture start with this one.
        if (StartsKeyPicture(*item) && m_dests.AdmitWaiting()) m_dests.Refresh();
        if (m_dests.targets().empty()) {
            Idle(kIdleSleepUs);
            continue;
        }
        AdvanceTimestamp(&ts, rate, item->timestamp, &m_last_item_time);
        config->set_timestamp(PositionMs(ts, rate), true);
        const unsigned send_ms = report_latency ? GetTimeStampMillsec() : 0;
        const auto send_start = report_latency ? Clock::now() : Clock::time_point();
        PacketiseH264Item(item->data, static_cast<unsigned>(item->length), ts, payload_type,
                          &sequence, fanout);
        fanout.Flush();
        if (report_latency) ReportLatency(send_ms - item->timestamp, send_start, &latency);
        state.AfterSend(&sequence);
        recompute = true;
    }
    OrvexPrint("\n exit H264RtpTransportSession::SendH264RTPPACKET ");
    OrvexPrintLog(kTag, "\n H264RtpTransportSession::event_loop_thread \n ");
}
