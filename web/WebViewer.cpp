#include "web/WebViewer.h"

#include <arpa/inet.h>
#include <errno.h>
#include <microhttpd.h>
#include <netinet/in.h>
#include <stdarg.h>
#include <string.h>

#include <cstdio>
#include <cstdlib>

#include "auth/DigestGate.h"
#include "platform/LogPort.h"
#include "platform/Ports.h"
#include "rtsp/CaptureQuery.h"
#include "rtsp/RtspTransport.h"
#include "service/Clocks.h"
#include "service/OrvexLog.h"
#include "web/WebPage.h"

namespace {

constexpr const char* kTag = "orvex:::web";
constexpr int kReadWaitMs = 500;  // a viewer's thread looks at the stop this often
constexpr size_t kBlockBytes = 32 * 1024;

std::string AddressText(const sockaddr* addr) {
    if (addr == nullptr || addr->sa_family != AF_INET) return "?";
    const auto* in = reinterpret_cast<const sockaddr_in*>(addr);
    char ip[INET_ADDRSTRLEN] = "?";
    inet_ntop(AF_INET, &in->sin_addr, ip, sizeof ip);
    return std::string(ip) + ":" + std::to_string(ntohs(in->sin_port));
}

uint32_t HostOrderAddress(const sockaddr* addr) {
    if (addr == nullptr || addr->sa_family != AF_INET) return 0;
    return ntohl(reinterpret_cast<const sockaddr_in*>(addr)->sin_addr.s_addr);
}

const sockaddr* PeerOf(MHD_Connection* connection) {
    const MHD_ConnectionInfo* info =
        MHD_get_connection_info(connection, MHD_CONNECTION_INFO_CLIENT_ADDRESS);
    return info == nullptr ? nullptr : info->client_addr;
}

MHD_Result Reply(MHD_Connection* connection, unsigned status, const char* text,
                 const char* header = nullptr, const char* value = nullptr) {
    MHD_Response* response = MHD_create_response_from_buffer(strlen(text), const_cast<char*>(text),
                                                             MHD_RESPMEM_PERSISTENT);
    if (response == nullptr) return MHD_NO;
    MHD_add_response_header(response, MHD_HTTP_HEADER_CONTENT_TYPE, "text/plain; charset=utf-8");
    MHD_add_response_header(response, MHD_HTTP_HEADER_CACHE_CONTROL, "no-store");
    if (header != nullptr) MHD_add_response_header(response, header, value);
    MHD_Result result = MHD_queue_response(connection, status, response);
    MHD_destroy_response(response);
    return result;
}

// What a request carries between libmicrohttpd's callbacks: its target as the client sent it
// (the Digest answer names it so, query included).
struct Request {
    std::string uri;
};

}  // namespace

// One streaming response: a reader of the ring and the capture hold it took.
struct StreamViewer {
    WebViewer* owner;
    std::string peer;
    FragmentRing::Reader reader;
    uint32_t started_ms;
    const char* end_reason = "the connection ended";
    bool told_skip = false;
};

struct WebViewerCalls {
    static MHD_Result Accept(void* cls, const sockaddr* addr, socklen_t) {
        auto* self = static_cast<WebViewer*>(cls);
        if (self->m_stopping.load()) return MHD_NO;
        thread_mutex::Scoped hold(self->m_access_lock);
        return self->m_access.AdmitConnection(HostOrderAddress(addr), AddressText(addr)) ? MHD_YES
                                                                                         : MHD_NO;
    }

    static void* Uri(void*, const char* uri, MHD_Connection*) {
        return new Request{uri != nullptr ? uri : ""};
    }

    static void Completed(void*, MHD_Connection*, void** request, MHD_RequestTerminationCode) {
        delete static_cast<Request*>(*request);
        *request = nullptr;
    }

    static void Logger(void*, const char* format, va_list args) {
        char line[256];
        vsnprintf(line, sizeof line, format, args);
        size_t n = strlen(line);
        while (n > 0 && (line[n - 1] == '\n' || line[n - 1] == '\r')) line[--n] = '\0';
        OrvexLogPriority(platform::kLogDebug, kTag, "http: %s", line);
    }

    static MHD_Result Handle(void* cls, MHD_Connection* connection, const char* url,
                             const char* method, const char*, const char*, size_t* upload_size,
                             void** context) {
        auto* self = static_cast<WebViewer*>(cls);
        if (*upload_size != 0) {  // a body nobody asked for: read and dropped
            *upload_size = 0;
            return MHD_YES;
        }
        auto* request = static_cast<Request*>(*context);
        const std::string uri = request != nullptr && !request->uri.empty() ? request->uri : url;
        return Answer(self, connection, uri, method);
    }

    static MHD_Result Answer(WebViewer* self, MHD_Connection* connection, const std::string& uri,
                             const char* method) {
        if (self->m_stopping.load()) return Reply(connection, 503, "The service is stopping.\n");
        const bool head = strcmp(method, MHD_HTTP_METHOD_HEAD) == 0;
        if (!head && strcmp(method, MHD_HTTP_METHOD_GET) != 0) {
            return Reply(connection, 405, "Only GET and HEAD.\n", MHD_HTTP_HEADER_ALLOW,
                         "GET, HEAD");
        }
        const sockaddr* peer = PeerOf(connection);
        const std::string peer_text = AddressText(peer);

        // Who may watch, judged as for an RTSP request.
        std::vector<std::string> lines{std::string(method) + " " + uri + " HTTP/1.1"};
        const char* authorization =
            MHD_lookup_connection_value(connection, MHD_HEADER_KIND, MHD_HTTP_HEADER_AUTHORIZATION);
        if (authorization != nullptr)
            lines.push_back(std::string("Authorization: ") + authorization);
        RtspAccess::Decision decision;
        {
            thread_mutex::Scoped hold(self->m_access_lock);
            decision = self->m_access.Judge(lines, -1, HostOrderAddress(peer), peer_text);
        }
        if (!decision.reason.empty() &&
            decision.reason != auth::VerdictText(auth::DigestVerdict::kMissing)) {
            OrvexLogPriority(platform::kLogWarn, kTag, "web client %s refused: %s",
                             peer_text.c_str(), decision.reason.c_str());
        }
        switch (decision.answer) {
            case RtspAccess::Answer::kServe:
                break;
            case RtspAccess::Answer::kChallenge: {
                constexpr const char kPrefix[] = "WWW-Authenticate: ";
                std::string value = decision.header;
                if (value.compare(0, sizeof kPrefix - 1, kPrefix) == 0)
                    value.erase(0, sizeof kPrefix - 1);
                return Reply(connection, 401, "401 Unauthorized\n",
                             MHD_HTTP_HEADER_WWW_AUTHENTICATE, value.c_str());
            }
            case RtspAccess::Answer::kBadRequest:
                return Reply(connection, 400, "400 Bad Request\n");
            case RtspAccess::Answer::kUnavailable:
                return Reply(connection, 503, "503 Service Unavailable\n");
        }

        const size_t mark = uri.find('?');
        const std::string path = uri.substr(0, mark);
        const std::string query = mark == std::string::npos ? std::string() : uri.substr(mark);
        if (path == "/" || path == "/index.html") {
            MHD_Response* page = MHD_create_response_from_buffer(
                kWebPageSize, const_cast<unsigned char*>(kWebPage), MHD_RESPMEM_PERSISTENT);
            if (page == nullptr) return MHD_NO;
            MHD_add_response_header(page, MHD_HTTP_HEADER_CONTENT_TYPE, "text/html; charset=utf-8");
            MHD_add_response_header(page, MHD_HTTP_HEADER_CACHE_CONTROL, "no-store");
            MHD_Result result = MHD_queue_response(connection, 200, page);
            MHD_destroy_response(page);
            return result;
        }
        if (path == "/stream.mp4") return ServeStream(self, connection, peer_text, query);
        return Reply(connection, 404, "404 Not Found\n");
    }

    static MHD_Result ServeStream(WebViewer* self, MHD_Connection* connection,
                                  const std::string& peer, const std::string& query) {
        const int max = self->m_options.max_viewers;
        if (self->m_viewers.fetch_add(1) >= max) {
            self->m_viewers.fetch_sub(1);
            OrvexLogPriority(platform::kLogWarn, kTag,
                             "web viewer %s refused: %d viewers already watch (kv.orvex.http.max)",
                             peer.c_str(), max);
            return Reply(connection, 503, "Too many viewers; try again later.\n");
        }
        if (self->m_transport != nullptr) self->m_transport->HoldCapture(CaptureQueryFor(query));
        auto* viewer = new StreamViewer{self, peer, {}, GetTimeStampMillsec()};
        std::string type;
        if (!self->m_ring.WaitForStart(&viewer->reader, &type, self->m_options.start_wait_ms)) {
            OrvexLogPriority(platform::kLogWarn, kTag,
                             "web viewer %s: no picture within %d ms (is capture running?)",
                             peer.c_str(), self->m_options.start_wait_ms);
            viewer->end_reason = nullptr;
            End(viewer);
            return Reply(connection, 503, "No picture yet; try again.\n");
        }
        MHD_Response* response =
            MHD_create_response_from_callback(MHD_SIZE_UNKNOWN, kBlockBytes, Read, viewer, End);
        if (response == nullptr) {
            viewer->end_reason = nullptr;
            End(viewer);
            return MHD_NO;
        }
        MHD_add_response_header(response, MHD_HTTP_HEADER_CONTENT_TYPE, type.c_str());
        MHD_add_response_header(response, MHD_HTTP_HEADER_CACHE_CONTROL, "no-store");
        MHD_Result result = MHD_queue_response(connection, 200, response);
        MHD_destroy_response(response);  // the connection keeps it; End runs when it is done
        OrvexLog(kTag, "web viewer %s watching (%d of %d) %s\n", peer.c_str(),
                 self->m_viewers.load(), max, type.c_str());
        return result;
    }

    static ssize_t Read(void* cls, uint64_t, char* buf, size_t max) {
        auto* viewer = static_cast<StreamViewer*>(cls);
        const char* why = nullptr;
        long n = viewer->owner->m_ring.Read(&viewer->reader, reinterpret_cast<uint8_t*>(buf), max,
                                            kReadWaitMs, &why);
        if (n < 0) {
            viewer->end_reason = why;
            return MHD_CONTENT_READER_END_OF_STREAM;
        }
        if (viewer->reader.skips > 0 && !viewer->told_skip) {
            viewer->told_skip = true;
            OrvexLogPriority(platform::kLogWarn, kTag,
                             "web viewer %s reads too slowly: it skips to the latest key frame",
                             viewer->peer.c_str());
        }
        return static_cast<ssize_t>(n);
    }

    static void End(void* cls) {
        auto* viewer = static_cast<StreamViewer*>(cls);
        WebViewer* self = viewer->owner;
        if (viewer->end_reason != nullptr) {
            OrvexLog(kTag, "web viewer %s left after %u s: %s (skipped ahead %u times)\n",
                     viewer->peer.c_str(), (GetTimeStampMillsec() - viewer->started_ms) / 1000,
                     viewer->end_reason, viewer->reader.skips);
        }
        if (self->m_transport != nullptr) self->m_transport->ReleaseCapture();
        self->m_viewers.fetch_sub(1);
        delete viewer;
    }
};

WebViewer::WebViewer(RtspTransport* transport, Options options)
    : m_transport(transport), m_options(options), m_ring(options.ring_bytes), m_muxer(&m_ring) {}

WebViewer::~WebViewer() { Stop(); }

bool WebViewer::Start() {
    {
        thread_mutex::Scoped hold(m_access_lock);
        m_access.Load();
    }
    sockaddr_in bind{};
    bind.sin_family = AF_INET;
    bind.sin_port = htons(static_cast<uint16_t>(m_options.port));
    bind.sin_addr.s_addr = htonl(INADDR_ANY);
    if (!m_options.bind.empty() &&
        inet_pton(AF_INET, m_options.bind.c_str(), &bind.sin_addr) != 1) {
        OrvexLogPriority(platform::kLogError, kTag,
                         "web viewer: \"%s\" is not an IPv4 address; not listening",
                         m_options.bind.c_str());
        return false;
    }
    const unsigned viewers = static_cast<unsigned>(m_options.max_viewers);
    m_daemon = MHD_start_daemon(
        MHD_USE_THREAD_PER_CONNECTION | MHD_USE_INTERNAL_POLLING_THREAD | MHD_USE_POLL |
            MHD_USE_ERROR_LOG,
        static_cast<uint16_t>(m_options.port), WebViewerCalls::Accept, this, WebViewerCalls::Handle,
        this, MHD_OPTION_EXTERNAL_LOGGER, WebViewerCalls::Logger, this, MHD_OPTION_SOCK_ADDR,
        reinterpret_cast<sockaddr*>(&bind), MHD_OPTION_URI_LOG_CALLBACK, WebViewerCalls::Uri, this,
        MHD_OPTION_NOTIFY_COMPLETED, WebViewerCalls::Completed, this,
        // Viewers, page loads and a margin; one address cannot take every connection.
        MHD_OPTION_CONNECTION_LIMIT, 2 * viewers + 8, MHD_OPTION_PER_IP_CONNECTION_LIMIT,
        viewers + 4, MHD_OPTION_CONNECTION_TIMEOUT, m_options.idle_timeout_s,
        // Bounds a request's headers as well as the buffers of its answer.
        MHD_OPTION_CONNECTION_MEMORY_LIMIT, static_cast<size_t>(64 * 1024),
        MHD_OPTION_THREAD_STACK_SIZE, static_cast<size_t>(256 * 1024), MHD_OPTION_END);
    if (m_daemon == nullptr) {
        OrvexLogPriority(platform::kLogError, kTag,
                         "web viewer: cannot listen on port %u (%s); is another program using it? "
                         "kv.orvex.http chooses the port",
                         m_options.port, strerror(errno));
        return false;
    }
    if (m_options.port == 0) {  // any free port (tests): say which
        const MHD_DaemonInfo* info = MHD_get_daemon_info(m_daemon, MHD_DAEMON_INFO_BIND_PORT);
        if (info != nullptr) m_options.port = info->port;
    }
    m_tapped = AddFrameSink(&m_muxer);
    OrvexLogPriority(platform::kLogInfo, kTag, "web viewer on port %u, at most %d viewers",
                     m_options.port, m_options.max_viewers);
    return true;
}

void WebViewer::Stop() {
    if (m_daemon == nullptr) return;
    m_stopping.store(true);
    m_ring.Stop();
    if (m_tapped) RemoveFrameSink(&m_muxer);
    m_tapped = false;
    MHD_stop_daemon(m_daemon);  // joins every connection's thread; the viewers' holds end
    m_daemon = nullptr;
}

namespace {
std::unique_ptr<WebViewer> g_web_viewer;
}

void StartWebViewer(RtspTransport* transport) {
    char value[platform::kPropertyValueMax] = {};
    platform::Properties().Get("kv.orvex.http", value, "");
    if (value[0] == '\0') return;  // the television's default: no web viewer, no port
    char* end = nullptr;
    long port = strtol(value, &end, 10);
    if (end == value || *end != '\0' || port < 1 || port > 65535) {
        OrvexLogPriority(platform::kLogError, kTag,
                         "kv.orvex.http=\"%s\" is not a port number; no web viewer", value);
        return;
    }
    WebViewer::Options options;
    options.port = static_cast<unsigned>(port);
    platform::Properties().Get("kv.orvex.http.max", value, "16");
    long max = strtol(value, &end, 10);
    if (end == value || *end != '\0' || max < 1 || max > 64) {
        OrvexLogPriority(platform::kLogWarn, kTag,
                         "kv.orvex.http.max=\"%s\" is not 1 to 64; 16 viewers at most", value);
        max = 16;
    }
    options.max_viewers = static_cast<int>(max);
    platform::Properties().Get("kv.orvex.bind", value, "");
    options.bind = value;
    auto viewer = std::make_unique<WebViewer>(transport, options);
    if (viewer->Start()) g_web_viewer = std::move(viewer);
}

void StopWebViewer() { g_web_viewer.reset(); }

unsigned WebViewerPort() { return g_web_viewer != nullptr ? g_web_viewer->port() : 0; }
