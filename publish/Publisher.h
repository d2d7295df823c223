#pragma once

#include <atomic>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <string>
#include <vector>

#include "codec/AccessUnitGatherer.h"
#include "config/Settings.h"
#include "publish/PublishUrl.h"
#include "stream/CaptureChoice.h"
#include "stream/FrameTap.h"

// Sends the live stream, as encoded, to media servers (kv.orvex.publish): RTMP as FLV, SRT as
// MPEG-TS, through the platform's PublishPort. Capture is held while it runs, as a playing
// RTSP client holds it.
//
// The tap gathers NAL units into access units and copies each access unit and each AAC frame
// into every server's queue. Each server has a thread of its own: connecting and writing wait
// on the network (up to 5 s), and a slow or absent server must not hold up the others. The
// thread connects at a key frame with its SPS and PPS, and after a failure tries again after
// 1 s, then 2, 4 ... up to 30 s.
// Thread contract: Start and Stop from the controlling thread; the frame calls from the tap.
class Publisher : public EncodedFrameSink, private AccessUnitGatherer::Sink {
public:
    struct Options {
        size_t queue_bytes = 4u << 20;
        uint32_t queue_span_ms = 2000;
        int first_backoff_ms = 1000;
        int max_backoff_ms = 30000;
        std::string capture_query;  // what capture is held with, from its '?' on
    };

    Publisher(stream::CaptureDemand* transport, std::vector<PublishUrl> urls, Options options);
    ~Publisher() override;
    Publisher(const Publisher&) = delete;
    Publisher& operator=(const Publisher&) = delete;

    void Start();
    // Returns once every server's thread has ended (a connection attempt is cut short).
    void Stop();

    void OnVideoFrame(const uint8_t* data, size_t len, uint32_t time_ms) override;
    void OnAudioFrame(const uint8_t* data, size_t len, uint32_t time_ms) override;

private:
    struct Server;

    void OnPicture(const AccessUnitGatherer::Picture& picture) override;
    void OnPictureLost(AccessUnitGatherer::Loss loss) override;

    stream::CaptureDemand* m_transport;
    Options m_options;
    std::vector<std::unique_ptr<Server>> m_servers;
    bool m_started = false;

    // Pictures as Annex B access units, parameter sets and delimiters kept (tap thread only).
    AccessUnitGatherer m_gatherer;
};

// The back-off after a failed connection: `first_ms` after the first, then doubling up to
// `max_ms`. `previous_ms` 0 means no failure yet.
int NextBackoffMs(int previous_ms, int first_ms, int max_ms);

// The service's publisher, started when the settings' kv.orvex.publish names servers (unset:
// nothing happens). Main thread.
void StartPublishing(const config::Settings& settings, stream::CaptureDemand* transport);
void StopPublishing();
