#pragma once

#include <atomic>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <string>
#include <vector>

// Port to a muxer that sends the encoded stream to a media server as it is (no re-encoding):
// FLV over RTMP, MPEG-TS over SRT. The host implements it with libavformat; the television
// has no such library and refuses.
// Thread contract: Open from any thread; a session is used by one thread at a time.

namespace platform {

struct PublishTarget {
    std::string url;        // rtmp://host[:port]/app/key or srt://host:port[?options]
    std::string container;  // "flv" or "mpegts"
    // The parameter sets the stream begins with, each a bare NAL unit (no start code).
    std::vector<uint8_t> sps;
    std::vector<uint8_t> pps;
    int width = 0;
    int height = 0;
    // The AAC AudioSpecificConfig (AAC-LC 48 kHz stereo: 0x11 0x90); empty: no sound track.
    std::vector<uint8_t> audio_config;
    int audio_rate = 48000;
    int audio_channels = 2;
    // Set by the owner to end a connection attempt or a write that waits on the network.
    const std::atomic<bool>* stop = nullptr;
};

class PublishSession {
public:
    virtual ~PublishSession() = default;
    // One access unit in Annex B (start codes included), its time in milliseconds from the
    // stream's origin. False when the connection is lost; the session is then of no more use.
    virtual bool WriteVideo(const uint8_t* annexb_access_unit, size_t len, int64_t pts_ms,
                            bool key) = 0;
    // One raw AAC frame (no ADTS header).
    virtual bool WriteAudio(const uint8_t* raw_aac, size_t len, int64_t pts_ms) = 0;
};

class PublishPort {
public:
    virtual ~PublishPort() = default;
    // Connects and writes the stream's header; null with `*error` set when that fails.
    virtual std::unique_ptr<PublishSession> Open(const PublishTarget& target,
                                                 std::string* error) = 0;
};

}  // namespace platform
