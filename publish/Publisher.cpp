#include "publish/Publisher.h"

#include <chrono>
#include <cstring>
#include <thread>

#include "base/OrvexLog.h"
#include "base/ThreadName.h"
#include "codec/AnnexB.h"
#include "platform/LogPort.h"
#include "platform/Ports.h"
#include "publish/PublishQueue.h"
#include "stream/CaptureChoice.h"
#include "stream/KeyFrames.h"
#include "stream/StreamFacts.h"

namespace {

constexpr const char* kTag = "orvex:::publish";
constexpr size_t kMaxUnit = 4u << 20;  // far above what the recorder's bit rates give
constexpr int kPopWaitMs = 200;        // how often an idle server's thread looks at its clock
constexpr size_t kMaxServers = 4;

int64_t SteadyMs() {
    return std::chrono::duration_cast<std::chrono::milliseconds>(
               std::chrono::steady_clock::now().time_since_epoch())
        .count();
}

}  // namespace

int NextBackoffMs(int previous_ms, int first_ms, int max_ms) {
    if (previous_ms <= 0) return first_ms;
    return previous_ms >= max_ms / 2 ? max_ms : previous_ms * 2;
}

// One media server: its queue, its thread and what that thread knows of the stream.
struct Publisher::Server {
    Server(PublishUrl u, const Options& options)
        : url(std::move(u)),
          queue(options.queue_bytes, options.queue_span_ms),
          first_backoff_ms(options.first_backoff_ms),
          max_backoff_ms(options.max_backoff_ms) {}

    void Run();
    bool Connect(uint32_t origin_ms);
    void Lost(const char* what);

    PublishUrl url;
    PublishQueue queue;
    const int first_backoff_ms;
    const int max_backoff_ms;
    std::atomic<bool> stop{false};
    std::thread thread;

    // The server's thread only.
    std::unique_ptr<platform::PublishSession> session;
    std::vector<uint8_t> sps, pps;
    std::vector<uint8_t> session_sps, session_pps;  // what the session's header carries
    uint32_t origin_ms = 0;
    int backoff_ms = 0;
    bool key_asked = false;  // for the connection being made
    int64_t retry_at_ms = 0;
    bool outage = false;  // a failure was logged; the next success says so
    int64_t outage_since_ms = 0;
    bool drop_told = false;
};

void Publisher::Server::Run() {
    NameThisThread("orvex-publish");
    std::vector<uint8_t> frame_bytes(512 * 1024);
    while (!stop.load()) {
        PublishQueue::Frame frame;
        unsigned dropped = 0;
        const bool got = queue.Pop(&frame, &frame_bytes, kPopWaitMs, &dropped);
        if (dropped > 0 && session != nullptr && !drop_told) {
            OrvexLogPriority(platform::kLogWarn, kTag,
                             "publish %s: the server takes the stream too slowly; frames are "
                             "dropped up to the next key frame",
                             url.url.c_str());
            drop_told = true;
        }
        if (!got) continue;
        const uint8_t* data = frame_bytes.data();
        const bool video = frame.kind == PublishQueue::Kind::kVideo;
        if (video) {
            ForEachNalUnit(data, frame.len, [&](const uint8_t* nal, size_t n) {
                const uint8_t type = nal[0] & 0x1F;
                if ((type == 7 || type == 8) && n <= AccessUnitGatherer::kMaxParameterSet)
                    (type == 7 ? sps : pps).assign(nal, nal + n);
            });
            if (frame.key && dropped == 0) drop_told = false;
            // Capture restarted with another size (an RTSP client chose it): the stream's
            // header no longer describes the pictures, so the server gets a new stream.
            if (session != nullptr && frame.key && (sps != session_sps || pps != session_pps)) {
                OrvexLogPriority(platform::kLogInfo, kTag,
                                 "publish %s: new SPS/PPS; starting the stream anew",
                                 url.url.c_str());
                session.reset();
            }
        }
        if (session == nullptr) {
            // A server (re)connects at a key frame: ask for one rather than wait out the
            // encoder's interval.
            if (!key_asked && SteadyMs() >= retry_at_ms) key_asked = stream::AskForKeyFrame();
            if (!video || !frame.key || sps.empty() || pps.empty()) continue;
            if (SteadyMs() < retry_at_ms) continue;
            if (!Connect(frame.time_ms)) continue;
        }
        const int32_t pts = static_cast<int32_t>(frame.time_ms - origin_ms);
        if (!video && pts < 0) continue;  // sound from before the first picture
        const bool written = video ? session->WriteVideo(data, frame.len, pts, frame.key)
                                   : session->WriteAudio(data, frame.len, pts);
        if (!written && !stop.load()) Lost("the connection was lost");
    }
    session.reset();
}

bool Publisher::Server::Connect(uint32_t time_ms) {
    platform::PublishTarget target;
    target.url = url.url;
    target.container = url.container;
    target.sps = sps;
    target.pps = pps;
    uint16_t width = 0, height = 0;
    if (stream::PictureSize(sps.data(), sps.size(), &width, &height)) {
        target.width = width;
        target.height = height;
    }
    target.audio_rate = static_cast<int>(stream::kAudioRate);
    target.audio_channels = stream::kAudioChannels;
    uint8_t config[2];
    stream::AudioSpecificConfig(config);
    target.audio_config.assign(config, config + sizeof config);
    target.stop = &stop;
    std::string error;
    session = platform::Publish().Open(target, &error);
    if (session == nullptr) {
        if (!stop.load()) Lost(error.c_str());
        return false;
    }
    origin_ms = time_ms;
    session_sps = sps;
    session_pps = pps;
    backoff_ms = 0;
    drop_told = false;
    if (outage) {
        OrvexLogPriority(platform::kLogInfo, kTag, "publish %s: publishing again after %lld s",
                         url.url.c_str(),
                         static_cast<long long>((SteadyMs() - outage_since_ms + 500) / 1000));
    } else {
        OrvexLogPriority(platform::kLogInfo, kTag, "publish %s: publishing %dx%d as %s",
                         url.url.c_str(), target.width, target.height, url.container.c_str());
    }
    outage = false;
    return true;
}

void Publisher::Server::Lost(const char* what) {
    session.reset();
    key_asked = false;
    backoff_ms = NextBackoffMs(backoff_ms, first_backoff_ms, max_backoff_ms);
    retry_at_ms = SteadyMs() + backoff_ms;
    if (outage) return;  // said once per outage; the attempts go on quietly
    outage = true;
    outage_since_ms = SteadyMs();
    OrvexLogPriority(platform::kLogWarn, kTag,
                     "publish %s: %s; trying again in %d ms, then less often (up to %d s)",
                     url.url.c_str(), what, backoff_ms, max_backoff_ms / 1000);
}

Publisher::Publisher(stream::CaptureDemand* transport, std::vector<PublishUrl> urls,
                     Options options)
    : m_transport(transport),
      m_options(std::move(options)),
      m_gatherer(this, AccessUnitGatherer::Prefix::kStartCode, true, kMaxUnit) {
    for (PublishUrl& url : urls) m_servers.push_back(std::make_unique<Server>(url, m_options));
}

Publisher::~Publisher() { Stop(); }

void Publisher::Start() {
    if (m_started) return;
    m_started = true;
    for (auto& server : m_servers) {
        Server* s = server.get();
        s->thread = std::thread([s] { s->Run(); });
    }
    if (!AddFrameSink(this)) {
        OrvexLogPriority(platform::kLogError, kTag,
                         "publish: no room for another frame consumer; nothing is published");
    }
    if (m_transport != nullptr) m_transport->HoldCapture(m_options.capture_query);
}

void Publisher::Stop() {
    if (!m_started) return;
    m_started = false;
    RemoveFrameSink(this);  // no tap call is under way after this
    for (auto& server : m_servers) {
        server->stop.store(true);
        server->queue.Stop();
    }
    for (auto& server : m_servers) {
        if (server->thread.joinable()) server->thread.join();
    }
    if (m_transport != nullptr) m_transport->ReleaseCapture();
}

void Publisher::OnVideoFrame(const uint8_t* data, size_t len, uint32_t time_ms) {
    m_gatherer.Add(data, len, time_ms);
}

void Publisher::OnPicture(const AccessUnitGatherer::Picture& picture) {
    for (auto& server : m_servers) {
        server->queue.Push(PublishQueue::Kind::kVideo, picture.key, picture.time_ms, picture.data,
                           picture.len);
    }
}

void Publisher::OnPictureLost(AccessUnitGatherer::Loss loss) {
    if (loss == AccessUnitGatherer::Loss::kTooLarge) {
        OrvexLogPriority(platform::kLogWarn, kTag,
                         "publish: a picture over %zu bytes; skipping to the next key frame",
                         kMaxUnit);
    }
    // The pictures after it cannot be decoded without it.
    for (auto& server : m_servers) server->queue.DropToKeyFrame();
}

void Publisher::OnAudioFrame(const uint8_t* data, size_t len, uint32_t time_ms) {
    if (!StripAdtsHeader(&data, &len)) return;
    for (auto& server : m_servers) {
        server->queue.Push(PublishQueue::Kind::kAudio, false, time_ms, data, len);
    }
}

namespace {
std::unique_ptr<Publisher> g_publisher;
}

void StartPublishing(const config::Settings& settings, stream::CaptureDemand* transport) {
    const std::vector<std::string> words = SplitPublishList(settings.publish);
    if (words.empty()) return;  // the default: no publishing, no threads
    std::vector<PublishUrl> urls;
    for (const std::string& word : words) {
        PublishUrl url;
        std::string why;
        if (!ParsePublishUrl(word, &url, &why)) {
            OrvexLogPriority(platform::kLogError, kTag,
                             "kv.orvex.publish: \"%s\" is not an rtmp:// or srt:// URL to publish "
                             "to (%s); it is left out",
                             word.c_str(), why.c_str());
            continue;
        }
        if (urls.size() == kMaxServers) {
            OrvexLogPriority(platform::kLogError, kTag,
                             "kv.orvex.publish: at most %zu servers; \"%s\" is left out",
                             kMaxServers, word.c_str());
            continue;
        }
        urls.push_back(url);
    }
    if (urls.empty()) return;
    Publisher::Options options;
    options.capture_query = CaptureQueryFor("");
    g_publisher = std::make_unique<Publisher>(transport, std::move(urls), options);
    g_publisher->Start();
}

void StopPublishing() { g_publisher.reset(); }
