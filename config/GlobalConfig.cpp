#include "config/GlobalConfig.h"

#include "base/OrvexLog.h"
#include "sync/LazyInstance.h"

namespace {

constexpr const char* kTag = "globalconfig";

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

void Global_Config::Apply(const config::Settings& settings) {
    m_audio_payload_type = settings.audio_payload_type;
    m_wake_on_write.store(settings.wake_on_write, std::memory_order_relaxed);
    m_report_latency.store(settings.report_latency, std::memory_order_relaxed);
    m_audio_clock_samples.store(settings.audio_clock_samples, std::memory_order_relaxed);
    m_aac_inline.store(settings.aac_inline, std::memory_order_relaxed);
}

void Global_Config::read_join_mode() {
    m_join_at_key.store(config::Reread(config::Property::kJoin).number != 0,
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
