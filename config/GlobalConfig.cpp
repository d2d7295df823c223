#include "config/GlobalConfig.h"

#include <cstring>

#include "base/OrvexLog.h"
#include "platform/Ports.h"
#include "sync/LazyInstance.h"

namespace {

constexpr const char* kTag = "globalconfig";
// The television's own clients expect 98, although the SDP announces 97.
constexpr int32_t kAudioPayloadTypeDefault = 98;

std::atomic<Global_Config*> g_instance{nullptr};
TLock g_create_lock;

}  // namespace

Global_Config* Global_Config::instance() {
    return LazyInstance(g_instance, g_create_lock, [] { return new Global_Config(); });
}

void Global_Config::CloseInstance() {
    Global_Config* p = g_instance.exchange(nullptr, std::memory_order_acq_rel);
    delete p;
}

Global_Config::~Global_Config() = default;

void Global_Config::video_audio_open_cap() {
    if (m_video_open != nullptr) m_video_open();
    if (m_audio_open != nullptr) m_audio_open();
}

void Global_Config::video_audio_close_cap() {
    if (m_video_close != nullptr) m_video_close();
    if (m_audio_close != nullptr) m_audio_close();
}

void Global_Config::read_audio_payload_type() {
    char value[platform::kPropertyValueMax] = {};
    platform::Properties().Get("kv.orvex.audiopt", value, "");
    m_audio_payload_type = kAudioPayloadTypeDefault;
    if (value[0] == '\0') return;  // unset, as on the television
    char* end = nullptr;
    long pt = strtol(value, &end, 10);
    if (end == value || *end != '\0' || pt < 96 || pt > 127) {
        OrvexLog(kTag,
                 "kv.orvex.audiopt=\"%s\" is not a payload type from 96 to 127; audio RTP keeps 98",
                 value);
        return;
    }
    m_audio_payload_type = static_cast<int32_t>(pt);
}

namespace {

// A two-way switch property: unset (or empty) and `off` give false, `on` true; anything else is
// logged once, with what the service does instead, and gives false.
bool ReadSwitch(const char* key, const char* off, const char* on, const char* otherwise) {
    char value[platform::kPropertyValueMax] = {};
    platform::Properties().Get(key, value, "");
    if (strcmp(value, on) == 0) return true;
    if (value[0] != '\0' && strcmp(value, off) != 0) {
        OrvexLog(kTag, "%s=\"%s\" is neither %s nor %s; %s", key, value, off, on, otherwise);
    }
    return false;
}

}  // namespace

void Global_Config::read_wake_mode() {
    m_wake_on_write.store(ReadSwitch("kv.orvex.wake", "poll", "event", "idle loops keep polling"),
                          std::memory_order_relaxed);
}

void Global_Config::read_join_mode() {
    m_join_at_key.store(ReadSwitch("kv.orvex.join", "now", "key", "clients join at once"),
                        std::memory_order_relaxed);
}

void Global_Config::read_latency_report() {
    m_report_latency.store(ReadSwitch("kv.orvex.latency", "0", "1", "no latency report"),
                           std::memory_order_relaxed);
}

void Global_Config::read_audio_clock() {
    m_audio_clock_samples.store(
        ReadSwitch("kv.orvex.audioclock", "write", "samples", "audio is stamped at write time"),
        std::memory_order_relaxed);
}

void Global_Config::mp3_config_ok() {
    m_audio_configured.store(1, std::memory_order_relaxed);
    if (m_video_configured.load(std::memory_order_relaxed) != 0) {
        m_both_configured.store(1, std::memory_order_relaxed);
        m_input_ready.store(1, std::memory_order_relaxed);
    }
}

void Global_Config::h264_config_frequency_ok() {
    m_video_configured.store(1, std::memory_order_relaxed);
    if (m_audio_configured.load(std::memory_order_relaxed) != 0) {
        m_both_configured.store(1, std::memory_order_relaxed);
        m_input_ready.store(1, std::memory_order_relaxed);
    }
}

void Global_Config::set_pause_stat(bool pause) {
    // The text does not show the value; operators know it by its wording.
    OrvexLog(kTag, "m_flag_run_pause = pausestat");
    m_flag_run_pause.store(pause, std::memory_order_relaxed);
}

void Global_Config::set_sub_stat(bool sub) {
    OrvexLog(kTag, "m_flag_sub = sub");
    m_flag_sub.store(sub, std::memory_order_relaxed);
}

void Global_Config::set_timestamp(unsigned value, bool video) {
    TLock::Scoped hold(m_timestamp_lock);
    if (video) {
        m_video_time = value;
    } else {
        m_audio_time = value;
    }
}

unsigned Global_Config::get_timestamp(bool video) {
    TLock::Scoped hold(m_timestamp_lock);
    return video ? m_video_time : m_audio_time;
}
