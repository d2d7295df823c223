#pragma once

#include <atomic>
#include <cstdint>
#include <string>

#include "base/Clocks.h"  // the program's two clocks live with the configuration
#include "config/Settings.h"
#include "config/orvexPIPCfg.h"
#include "sync/TLock.h"

// The process-wide configuration: stream parameters, readiness, pause and sub-stream state,
// the capture callbacks and the two send threads' playing positions.
// Thread contract: instance() from any thread. Clock rates and callbacks are written at
// start-up before the threads that read them exist; the flags are atomic; the playing-time
// stamps are guarded by their own lock. CloseInstance only when no other thread uses it.
class Global_Config {
public:
    typedef int (*CaptureFunc)();

    static Global_Config* instance();
    static void CloseInstance();
    virtual ~Global_Config();

    // Stream parameters (public words, as every subsystem reads them).
    uint32_t m_video_rtp_frequency = 0;  // Hz; 90000 once configured
    uint32_t m_audio_rtp_frequency = 0;  // Hz; the audio sample rate, 48000 once configured
    uint32_t m_rtsp_port = 0;
    int32_t m_video_payload_type = 96;
    int32_t m_audio_payload_type = 98;  // what the audio RTP headers carry (kv.orvex.audiopt)
    uint32_t m_h264_rtp_port = 8000;
    uint32_t m_audio_rtp_port = 8002;
    // Local dotted IPv4 address of the last accepted RTSP connection.
    std::string m_server_address;

    void register_audio_open_thread_func(CaptureFunc f) { m_audio_open = f; }
    void register_audio_close_thread_func(CaptureFunc f) { m_audio_close = f; }
    void register_video_open_thread_func(CaptureFunc f) { m_video_open = f; }
    void register_video_close_thread_func(CaptureFunc f) { m_video_close = f; }
    // Video first, then audio. An unregistered callback is skipped.
    void video_audio_open_cap();
    void video_audio_close_cap();

    // Takes the start-time settings the send threads and idle loops read: the audio payload
    // type (kv.orvex.audiopt), how idle loops wait (kv.orvex.wake: fixed short sleeps, or a
    // ring's consumer sleeps until a write and the run-flag loops until they are woken), the
    // video sender's latency report (kv.orvex.latency) and how AAC frames are stamped
    // (kv.orvex.audioclock: at write time, or by the capture time of their first sample), and
    // where AAC is encoded and sent (kv.orvex.aacenc: threads of their own, or the sound
    // reader's).
    // Called once, when the server opens; threads read them when they start.
    void Apply(const config::Settings& settings);
    bool wake_on_write() const { return m_wake_on_write.load(std::memory_order_relaxed); }
    // Reads kv.orvex.join again: "key" lets a new RTSP client start at the next key picture,
    // so that its decoder never starts on a picture it cannot decode; otherwise it gets
    // whatever the encoder sends next, as the television does. At each video send start.
    void read_join_mode();
    bool join_at_key() const { return m_join_at_key.load(std::memory_order_relaxed); }
    bool report_latency() const { return m_report_latency.load(std::memory_order_relaxed); }
    bool audio_clock_samples() const {
        return m_audio_clock_samples.load(std::memory_order_relaxed);
    }
    bool aac_inline() const { return m_aac_inline.load(std::memory_order_relaxed); }
    // The sleep of the loops that only watch a run flag (the main and binder service loops).
    // Waiting for writes, they are woken instead: SIGTERM interrupts main's sleep, and the
    // service's stop notifies its thread; the second is only a bound.
    unsigned run_flag_poll_us() const { return wake_on_write() ? 1000000 : 10000; }

    void mp3_config_ok();
    void h264_config_frequency_ok();
    bool InIISOK() const { return m_input_ready.load(std::memory_order_relaxed) != 0; }

    void set_current_signal_status(int status) {
        m_signal_status.store(status, std::memory_order_relaxed);
    }
    int current_signal_status() const { return m_signal_status.load(std::memory_order_relaxed); }

    void SetTVParameterDefault() { m_pip_cfg.SetTVParameterDefault(); }
    orvexPIPCfg& pip_cfg() { return m_pip_cfg; }

    bool isPause() const { return m_flag_run_pause.load(std::memory_order_relaxed); }
    void set_pause_stat(bool pause);
    bool isSub() const { return m_flag_sub.load(std::memory_order_relaxed); }
    void set_sub_stat(bool sub);

    // Milliseconds of media sent by the video (video true) or the audio send thread.
    void set_timestamp(unsigned value, bool video);
    unsigned get_timestamp(bool video);

private:
    Global_Config() = default;

    CaptureFunc m_audio_open = nullptr;
    CaptureFunc m_audio_close = nullptr;
    CaptureFunc m_video_open = nullptr;
    CaptureFunc m_video_close = nullptr;
    std::atomic<int> m_signal_status{0};
    std::atomic<unsigned char> m_input_ready{0};
    std::atomic<unsigned char> m_audio_configured{0};
    std::atomic<unsigned char> m_video_configured{0};
    std::atomic<unsigned char> m_both_configured{0};
    orvexPIPCfg m_pip_cfg;
    std::atomic<bool> m_flag_run_pause{false};
    std::atomic<bool> m_flag_sub{false};
    std::atomic<bool> m_wake_on_write{false};
    std::atomic<bool> m_join_at_key{false};
    std::atomic<bool> m_report_latency{false};
    std::atomic<bool> m_audio_clock_samples{false};
    std::atomic<bool> m_aac_inline{false};
    TLock m_timestamp_lock;
    unsigned m_video_time ORVEX_GUARDED_BY(m_timestamp_lock) = 0;
    unsigned m_audio_time ORVEX_GUARDED_BY(m_timestamp_lock) = 0;
};
