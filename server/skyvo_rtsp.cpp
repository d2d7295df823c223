#include "server/skyvo_rtsp.h"

#include <atomic>
#include <memory>
#include <thread>

#include "base/OrvexLog.h"
#include "config/Settings.h"
#include "platform/Ports.h"
#include "server/RtspService_t.h"
#include "server/skyvo_service.h"
#include "stream/FrameTap.h"
#include "stream/StreamFacts.h"

namespace {
// Producers may still run while the server closes: they enter (count up) before they load the
// pointer, and a closing server takes the pointer away before it waits for the count to drop.
// Both sides use sequentially consistent order, so either the producer sees null or the closer
// sees it counted.
std::atomic<RtspService_t*> g_pRtspService{nullptr};
std::atomic<int> g_producers_inside{0};

RtspService_t* Service() { return g_pRtspService.load(std::memory_order_acquire); }

class ProducerScope {
public:
    ProducerScope() {
        g_producers_inside.fetch_add(1);
        service_ = g_pRtspService.load();
    }
    ~ProducerScope() { g_producers_inside.fetch_sub(1); }
    ProducerScope(const ProducerScope&) = delete;
    ProducerScope& operator=(const ProducerScope&) = delete;
    RtspTransport* listener() const { return service_ != nullptr ? service_->listener() : nullptr; }

private:
    RtspService_t* service_;
};

// The pointer is already null: no new producer can reach `service`.
void WaitForProducers() {
    while (g_producers_inside.load() != 0) std::this_thread::yield();
}
}  // namespace

RtspService_t* skyvo_rtsp_service() { return Service(); }

extern "C" {

void* skyvo_rtsp_sever_init(void) {
    // The start-time properties are read here, once, and live with the service.
    auto* service = new RtspService_t(config::ReadSettings(platform::Properties()));
    g_pRtspService.store(service, std::memory_order_release);
    return service;
}

int skyvo_rtsp_sever_open(unsigned port) {
    RtspService_t* service = Service();
    if (service == nullptr) return 1;
    if (service->Open(port)) return 0;
    OrvexDebugPuts("Rtsp Transport open failed.");
    std::unique_ptr<RtspService_t> failed(g_pRtspService.exchange(nullptr));
    WaitForProducers();
    return 1;
}

void skyvo_rtsp_sever_close(void) {
    std::unique_ptr<RtspService_t> service(g_pRtspService.exchange(nullptr));
    if (service == nullptr) {
        OrvexDebugPuts("\n g_pRtspService is NULL ! ");
        return;
    }
    WaitForProducers();
    service->Release();
}

void skyvo_set_mp3_rtp_config(unsigned rate) {
    RtspService_t* service = Service();
    if (service == nullptr || service->config() == nullptr) {
        OrvexDebugPuts("\n g_pRtspService is NULL ! ");
        return;
    }
    service->config()->m_audio_rtp_frequency = rate;
    service->config()->mp3_config_ok();
}

void skyvo_set_h264_rtp_config(unsigned rate) {
    RtspService_t* service = Service();
    if (service == nullptr || service->config() == nullptr) {
        OrvexDebugPuts("\n g_pRtspService is NULL ! ");
        return;
    }
    service->config()->m_video_rtp_frequency = rate;
    service->config()->h264_config_frequency_ok();
}

int skyvo_add_h264_data(unsigned char* data, unsigned len) {
    if (data == nullptr || len == 0) return 0;
    stream::Facts().Note(data, len, stream::SteadyMs());
    TapVideoFrame(data, len);
    ProducerScope inside;
    RtspTransport* listener = inside.listener();
    return listener != nullptr ? listener->skyvo_add_h264_data(data, len) : 0;
}

int skyvo_add_mp3_data(unsigned char* data, unsigned len, unsigned timestamp) {
    if (data == nullptr || len == 0) return 0;
    TapAudioFrame(data, len, timestamp);
    ProducerScope inside;
    RtspTransport* listener = inside.listener();
    return listener != nullptr ? listener->skyvo_add_mp3_data(data, len, timestamp) : 0;
}

// The registrations need a server; without one they are ignored rather than crash.
void register_audio_open_thread_func(skyvo_capture_func f) {
    if (Service() != nullptr) Service()->config()->register_audio_open_thread_func(f);
}
void register_video_open_thread_func(skyvo_capture_func f) {
    if (Service() != nullptr) Service()->config()->register_video_open_thread_func(f);
}
void register_audio_close_thread_func(skyvo_capture_func f) {
    if (Service() != nullptr) Service()->config()->register_audio_close_thread_func(f);
}
void register_video_close_thread_func(skyvo_capture_func f) {
    if (Service() != nullptr) Service()->config()->register_video_close_thread_func(f);
}

}  // extern "C"
