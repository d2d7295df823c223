// Publishing with libavformat: FLV over its RTMP client, MPEG-TS over libsrt, muxed as the
// encoders gave it. Every network wait ends within 5 s, or at once when the target's stop flag
// is raised (libavformat's interrupt callback).
#include "platform/host/publish/AvModule.h"

extern "C" {
#include <libavformat/avformat.h>
#include <libavutil/channel_layout.h>
#include <libavutil/mem.h>
}

#include <time.h>

#include <cstring>
#include <memory>

namespace platform {
namespace host {
namespace {

constexpr int64_t kIoTimeoutMs = 5000;

int64_t NowMs() {
    timespec now{};
    clock_gettime(CLOCK_MONOTONIC, &now);
    return int64_t{now.tv_sec} * 1000 + now.tv_nsec / 1000000;
}

std::string ErrorText(int code) {
    char text[AV_ERROR_MAX_STRING_SIZE] = {};
    av_strerror(code, text, sizeof text);
    return text;
}

class AvSession final : public PublishSession {
public:
    explicit AvSession(const PublishTarget& target) : m_stop(target.stop) {}
    ~AvSession() override { Close(); }

    bool Open(const PublishTarget& target, std::string* error);
    bool WriteVideo(const uint8_t* data, size_t len, int64_t pts_ms, bool key) override;
    bool WriteAudio(const uint8_t* data, size_t len, int64_t pts_ms) override;

private:
    static int Interrupt(void* self);
    bool Write(AVStream* stream, int64_t* last, const uint8_t* data, size_t len, int64_t pts_ms,
               bool key);
    void Close();
    // Every network wait gets 5 s from the start of the call that makes it.
    void Arm() { m_deadline_ms = NowMs() + kIoTimeoutMs; }

    const std::atomic<bool>* m_stop;
    int64_t m_deadline_ms = 0;
    AVFormatContext* m_context = nullptr;
    AVStream* m_video = nullptr;
    AVStream* m_audio = nullptr;
    AVPacket* m_packet = nullptr;
    int64_t m_last_video = -1;
    int64_t m_last_audio = -1;
    bool m_header_written = false;
    bool m_broken = false;
};

int AvSession::Interrupt(void* opaque) {
    auto* self = static_cast<AvSession*>(opaque);
    if (self->m_stop != nullptr && self->m_stop->load(std::memory_order_relaxed)) return 1;
    return NowMs() > self->m_deadline_ms ? 1 : 0;
}

bool AvSession::Open(const PublishTarget& target, std::string* error) {
    int rc = avformat_alloc_output_context2(&m_context, nullptr, target.container.c_str(),
                                            target.url.c_str());
    if (rc < 0 || m_context == nullptr) {
        *error = "no " + target.container + " muxer: " + ErrorText(rc);
        return false;
    }
    m_context->interrupt_callback.callback = &AvSession::Interrupt;
    m_context->interrupt_callback.opaque = this;
    // Each packet goes out as it is written: a live stream must not wait in a buffer.
    m_context->flags |= AVFMT_FLAG_FLUSH_PACKETS;

    m_video = avformat_new_stream(m_context, nullptr);
    if (m_video == nullptr) {
        *error = "out of memory";
        return false;
    }
    AVCodecParameters* v = m_video->codecpar;
    v->codec_type = AVMEDIA_TYPE_VIDEO;
    v->codec_id = AV_CODEC_ID_H264;
    v->width = target.width;
    v->height = target.height;
    // Annex B parameter sets: the FLV muxer makes its avcC from them and converts the pictures
    // to length prefixes; MPEG-TS carries them as they are.
    const size_t extra = 8 + target.sps.size() + target.pps.size();
    v->extradata = static_cast<uint8_t*>(av_mallocz(extra + AV_INPUT_BUFFER_PADDING_SIZE));
    if (v->extradata == nullptr) {
        *error = "out of memory";
        return false;
    }
    static const uint8_t kStart[4] = {0, 0, 0, 1};
    uint8_t* out = v->extradata;
    memcpy(out, kStart, 4);
    memcpy(out + 4, target.sps.data(), target.sps.size());
    out += 4 + target.sps.size();
    memcpy(out, kStart, 4);
    memcpy(out + 4, target.pps.data(), target.pps.size());
    v->extradata_size = static_cast<int>(extra);
    m_video->time_base = AVRational{1, 1000};

    if (!target.audio_config.empty()) {
        m_audio = avformat_new_stream(m_context, nullptr);
        if (m_audio == nullptr) {
            *error = "out of memory";
            return false;
        }
        AVCodecParameters* a = m_audio->codecpar;
        a->codec_type = AVMEDIA_TYPE_AUDIO;
        a->codec_id = AV_CODEC_ID_AAC;
        a->sample_rate = target.audio_rate;
        av_channel_layout_default(&a->ch_layout, target.audio_channels);
        a->frame_size = 1024;
        a->extradata = static_cast<uint8_t*>(
            av_mallocz(target.audio_config.size() + AV_INPUT_BUFFER_PADDING_SIZE));
        if (a->extradata == nullptr) {
            *error = "out of memory";
            return false;
        }
        memcpy(a->extradata, target.audio_config.data(), target.audio_config.size());
        a->extradata_size = static_cast<int>(target.audio_config.size());
        m_audio->time_base = AVRational{1, 1000};
    }

    AVDictionary* options = nullptr;
    if (target.container == "mpegts") {
        // SRT carries whole TS packets, seven to a datagram; live mode, a short latency.
        av_dict_set(&options, "pkt_size", "1316", 0);
        av_dict_set(&options, "latency", "120000", 0);  // microseconds
    }
    Arm();
    rc = avio_open2(&m_context->pb, target.url.c_str(), AVIO_FLAG_WRITE,
                    &m_context->interrupt_callback, &options);
    av_dict_free(&options);
    if (rc < 0) {
        *error = "cannot connect: " + ErrorText(rc);
        return false;
    }
    AVDictionary* mux = nullptr;
    if (target.container == "flv") av_dict_set(&mux, "flvflags", "no_duration_filesize", 0);
    Arm();
    rc = avformat_write_header(m_context, &mux);
    av_dict_free(&mux);
    if (rc < 0) {
        *error = "the server refused the stream: " + ErrorText(rc);
        return false;
    }
    m_header_written = true;
    m_packet = av_packet_alloc();
    if (m_packet == nullptr) {
        *error = "out of memory";
        return false;
    }
    return true;
}

bool AvSession::Write(AVStream* stream, int64_t* last, const uint8_t* data, size_t len,
                      int64_t pts_ms, bool key) {
    if (m_broken || stream == nullptr) return !m_broken;
    // Each track's times must increase; two frames stamped within a millisecond still do.
    if (pts_ms <= *last) pts_ms = *last + 1;
    *last = pts_ms;
    av_packet_unref(m_packet);
    // The muxers only read the payload; it is not copied.
    m_packet->data = const_cast<uint8_t*>(data);
    m_packet->size = static_cast<int>(len);
    m_packet->stream_index = stream->index;
    m_packet->pts = av_rescale_q(pts_ms, AVRational{1, 1000}, stream->time_base);
    m_packet->dts = m_packet->pts;
    m_packet->flags = key ? AV_PKT_FLAG_KEY : 0;
    Arm();
    const int rc = av_write_frame(m_context, m_packet);
    m_packet->data = nullptr;
    m_packet->size = 0;
    if (rc < 0 || (m_context->pb != nullptr && m_context->pb->error < 0)) m_broken = true;
    return !m_broken;
}

bool AvSession::WriteVideo(const uint8_t* data, size_t len, int64_t pts_ms, bool key) {
    return Write(m_video, &m_last_video, data, len, pts_ms, key);
}

bool AvSession::WriteAudio(const uint8_t* data, size_t len, int64_t pts_ms) {
    return Write(m_audio, &m_last_audio, data, len, pts_ms, true);
}

void AvSession::Close() {
    if (m_context == nullptr) return;
    // A trailer on a live connection is a courtesy: short, and skipped when it is gone.
    if (m_header_written && !m_broken) {
        Arm();
        m_deadline_ms = NowMs() + 1000;
        av_write_trailer(m_context);
    }
    if (m_context->pb != nullptr) avio_closep(&m_context->pb);
    avformat_free_context(m_context);
    m_context = nullptr;
    av_packet_free(&m_packet);
}

}  // namespace
}  // namespace host
}  // namespace platform

extern "C" __attribute__((visibility("default"))) platform::PublishSession* orvex_host_av_open(
    const platform::PublishTarget& target, std::string* error) {
    auto session = std::make_unique<platform::host::AvSession>(target);
    if (!session->Open(target, error)) return nullptr;
    return session.release();
}
