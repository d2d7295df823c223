#include "server/skyvo_rtsp.h"

#include <atomic>

#include "server/RtspService_t.h"
#include "server/skyvo_service.h"
#include "service/OrvexLog.h"

namespace {
// Created before and destroyed after every producer runs; atomic so a late producer sees null.
std::atomic<RtspService_t*> g_pRtspService{nullptr};

RtspService_t* Service() { return g_pRtspService.load(std::memory_order_acquire); }
}  // namespace

RtspService_t* skyvo_rtsp_service() { return Service(); }

extern "C" {

void* skyvo_rtsp_sever_init(void) {
    auto* service = new RtspService_t();
    g_pRtspService.store(service, std::memory_order_release);
    return service;
}

int skyvo_rtsp_sever_open(unsigned port) {
    RtspService_t* service = Service();
    if (service == nullptr) return 1;
    if (service->Open(port)) return 0;
    OrvexDebugPuts("Rtsp Transport open failed.");
    g_pRtspService.store(nullptr, std::memory_order_release);
    delete service;
    return 1;
}

void skyvo_rtsp_sever_close(void) {
    RtspService_t* service = g_pRtspService.exchange(nullptr, std::memory_order_acq_rel);
    if (service == nullptr) {
        OrvexDebugPuts("\n g_pRtspService is NULL ! ");
        return;
    }
    service->Release();
    delete service;
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
    RtspService_t* service = Service();
    if (data == nullptr || len == 0 || service == nullptr || service->listener() == nullptr) return 0;
    return service->listener()->skyvo_add_h264_data(data, len);
}

int skyvo_add_mp3_data(unsigned char* data, unsigned len, unsigned timestamp) {
    RtspService_t* service = Service();
    if (data == nullptr || len == 0 || service == nullptr || service->listener() == nullptr) return 0;
    return service->listener()->skyvo_add_mp3_data(data, len, timestamp);
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
