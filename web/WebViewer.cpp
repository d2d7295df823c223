#include "web/WebViewer.h"
#include "stream/KeyFrames.h"

#include <arpa/inet.h>
#include <errno.h>
#include <microhttpd.h>
#include <netinet/in.h>
#include <stdarg.h>
#include <string.h>
#include <strings.h>

#include <sys/socket.h>

#include <chrono>
#include <cstdio>
#include <cstdlib>

#include "auth/DigestGate.h"
#include "base/Clocks.h"
#include "base/OrvexLog.h"
#include "config/LivecameraResolution.h"
#include "platform/LogPort.h"
#include "platform/Ports.h"
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

uint64_t SteadyMs() {
    return static_cast<uint64_t>(std::chrono::duration_cast<std::chrono::milliseconds>(
                                     std::chrono::steady_clock::now().time_since_epoch())
                                     .count());
}

const sockaddr* PeerOf(MHD_Connection* connection) {
    const MHD_ConnectionInfo* info =
        MHD_get_connection_info(connection, MHD_CONNECTION_INFO_CLIENT_ADDRESS);
    return info == nullptr ? nullptr : info->client_addr;
}

// A plain-text answer; `close` ends the connection after it.
MHD_Result Reply(MHD_Connection* connection, unsigned status, const std::string& text,
                 const char* header = nullptr, const char* value = nullptr, bool close = false) {
    MHD_Response* response = MHD_create_response_from_buffer(
        text.size(), const_cast<char*>(text.data()), MHD_RESPMEM_MUST_COPY);
    if (response == nullptr) return MHD_NO;
    MHD_add_response_header(response, MHD_HTTP_HEADER_CONTENT_TYPE, "text/plain; charset=utf-8");
    MHD_add_response_header(response, MHD_HTTP_HEADER_CACHE_CONTROL, "no-store");
    if (header != nullptr) MHD_add_response_header(response, header, value);
    if (close) MHD_add_response_header(response, MHD_HTTP_HEADER_CONNECTION, "close");
    MHD_Result result = MHD_queue_response(connection, status, response);
    MHD_destroy_response(response);
    return result;
}

// What a browser shows when its password prompt is cancelled: where the password is.
constexpr const char* kUnauthorizedText =
    "401 Unauthorized: this stream needs a user name and password.\n"
    "On the machine that runs orvex, the URL with them is in ~/.config/orvex/play-url;\n"
    "tools/orvex-passwd USER adds a user or changes a password.\n";

// Why the capture would refuse the size a query asks for, in words for the viewer; empty when
// it takes it. Without this the viewer would wait for pictures that never come.
std::string RefusedSize(const std::string& query) {
    unsigned width = 0, height = 0;
    stream::CaptureQuerySize(stream::CaptureQueryFor(query), &width, &height);
    const std::string board_text = config::Reread(config::Property::kBoard).text;
    const char* board = board_text.c_str();
    if (ResolutionCode(width, height, board) >= 0) return "";
    return "The capture does not take " + std::to_string(width) + "x" + std::to_string(height) +
           "; accepted sizes (width= and height= in the address): " + AcceptedSizesText(board) +
           ".\n";
}

// How many Host lines a request has; RFC 9112 §3.2 wants one in every HTTP/1.1 request.
int HostLines(MHD_Connection* connection) {
    int count = 0;
    MHD_get_connection_values(
        connection, MHD_HEADER_KIND,
        [](void* cls, MHD_ValueKind, const char* key, const char*) -> MHD_Result {
            if (strcasecmp(key, MHD_HTTP_HEADER_HOST) == 0) ++*static_cast<int*>(cls);
            return MHD_YES;
        },
        &count);
    return count;
}

// What a request carries between libmicrohttpd's callbacks: its target as the client sent it
// (the Digest answer names it so, query included).
struct Request {
    std::string uri;
    bool headers_seen = false;  // a POST's first call: its body comes in the next ones
    std::string body;
    bool body_too_large = false;
};

// An SDP offer is a few kilobytes; anything much larger is not one.
constexpr size_t kMaxOfferBytes = 64 * 1024;

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
        return self->m_gate->AdmitConnection(HostOrderAddress(addr), AddressText(addr)) ? MHD_YES
                                                                                        : MHD_NO;
    }

    static void Connection(void* cls, MHD_Connection* connection, void**,
                           MHD_ConnectionNotificationCode code) {
        auto* self = static_cast<WebViewer*>(cls);
        if (code == MHD_CONNECTION_NOTIFY_CLOSED) {
            self->m_warden.Closed(connection);
            return;
        }
        const MHD_ConnectionInfo* fd =
            MHD_get_connection_info(connection, MHD_CONNECTION_INFO_CONNECTION_FD);
        if (fd == nullptr) return;
        const sockaddr* peer = PeerOf(connection);
        if (self->m_warden.Opened(connection, fd->connect_fd, HostOrderAddress(peer), SteadyMs())) {
            LogCrowd(self, "the oldest waiting connection of the busiest address was closed");
        }
    }

    // One warning per ten seconds while connections crowd in.
    static void LogCrowd(WebViewer* self, const char* what) {
        const uint32_t now = GetTimeStampMillsec();
        uint32_t last = self->m_crowd_logged_ms.load();
        if (last != 0 && now - last < 10000) return;
        if (!self->m_crowd_logged_ms.compare_exchange_strong(last, now == 0 ? 1 : now)) return;
        OrvexLogPriority(platform::kLogWarn, kTag,
                         "web: more than %d connections wait for a request, or one took over "
                         "%u ms to send it: %s",
                         self->m_options.waiting_max, self->m_options.request_deadline_ms, what);
    }

    static void* Uri(void*, const char* uri, MHD_Connection*) {
        auto* request = new Request;
        request->uri = uri != nullptr ? uri : "";
        return request;
    }

    static void Completed(void* cls, MHD_Connection* connection, void** request,
                          MHD_RequestTerminationCode) {
        static_cast<WebViewer*>(cls)->m_warden.Answered(connection, SteadyMs());
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
                             const char* method, const char* version, const char* upload_data,
                             size_t* upload_size, void** context) {
        auto* self = static_cast<WebViewer*>(cls);
        auto* request = static_cast<Request*>(*context);
        if (*upload_size != 0) {  // kept for a POST (an offer), else read and dropped
            if (request != nullptr && request->headers_seen) {
                if (request->body.size() + *upload_size > kMaxOfferBytes) {
                    request->body_too_large = true;
                } else {
                    request->body.append(upload_data, *upload_size);
                }
            }
            *upload_size = 0;
            return MHD_YES;
        }
        if (request != nullptr && !request->headers_seen &&
            strcmp(method, MHD_HTTP_METHOD_POST) == 0) {
            request->headers_seen = true;
            return MHD_YES;
        }
        // Only now is the request whole: a body still coming is under the warden's deadline
        // as its head was, since the gate sees a POST only once its body is in.
        self->m_warden.Answering(connection);
        if (strcmp(version, MHD_HTTP_VERSION_1_1) == 0 && HostLines(connection) != 1)
            return Reply(connection, 400, "An HTTP/1.1 request names its Host once.\n", nullptr,
                         nullptr, true);
        const std::string uri = request != nullptr && !request->uri.empty() ? request->uri : url;
        return Answer(self, connection, uri, method, request);
    }

    static MHD_Result Answer(WebViewer* self, MHD_Connection* connection, const std::string& uri,
                             const char* method, Request* body) {
        if (self->m_stopping.load()) return Reply(connection, 503, "The service is stopping.\n");
        const bool head = strcmp(method, MHD_HTTP_METHOD_HEAD) == 0;
        const std::string target = uri.substr(0, uri.find('?'));
        const bool whep_offer = self->m_whep != nullptr && target == "/whep";
        const bool whep_session =
            self->m_whep != nullptr && target.size() > 6 && target.compare(0, 6, "/whep/") == 0;
        const bool whep = whep_offer || whep_session;
        const char* allowed = whep_offer ? "POST" : whep_session ? "DELETE" : "GET, HEAD";
        const bool method_ok =
            whep ? strcmp(method, allowed) == 0 : head || strcmp(method, MHD_HTTP_METHOD_GET) == 0;
        if (!method_ok) {
            // PATCH included: every candidate is in the answer, there is nothing to trickle.
            return Reply(connection, 405, std::string("Only ") + allowed + ".\n",
                         MHD_HTTP_HEADER_ALLOW, allowed);
        }
        const sockaddr* peer = PeerOf(connection);
        const std::string peer_text = AddressText(peer);

        // Who may watch: the gate the RTSP side asks too.
        const char* authorization =
            MHD_lookup_connection_value(connection, MHD_HEADER_KIND, MHD_HTTP_HEADER_AUTHORIZATION);
        const std::string authorization_text = authorization != nullptr ? authorization : "";
        auth::AccessRequest request;
        request.method = method;
        request.uri = uri;
        request.authorization = authorization != nullptr ? &authorization_text : nullptr;
        request.address = HostOrderAddress(peer);
        request.address_text = peer_text;
        const auth::AccessDecision decision = self->m_gate->Judge(request);
        if (decision.answer != auth::AccessAnswer::kServe &&
            decision.reason != auth::VerdictText(auth::DigestVerdict::kMissing)) {
            OrvexLogPriority(decision.answer == auth::AccessAnswer::kLockedOut ? platform::kLogDebug
                                                                               : platform::kLogWarn,
                             kTag, "web client %s refused: %s", peer_text.c_str(),
                             decision.reason.c_str());
        }
        switch (decision.answer) {
            case auth::AccessAnswer::kServe:
                break;
            case auth::AccessAnswer::kChallenge:
                return Reply(connection, 401, kUnauthorizedText, MHD_HTTP_HEADER_WWW_AUTHENTICATE,
                             decision.challenge.c_str(), decision.close);
            case auth::AccessAnswer::kBadRequest:
                return Reply(connection, 400, "400 Bad Request\n", nullptr, nullptr,
                             decision.close);
            case auth::AccessAnswer::kLockedOut: {
                const std::string seconds = std::to_string(decision.retry_after_s);
                const std::string text =
                    "Too many wrong answers from this address; try again in " + seconds + " s.\n";
                return Reply(connection, 429, text, MHD_HTTP_HEADER_RETRY_AFTER, seconds.c_str(),
                             true);
            }
            case auth::AccessAnswer::kUnavailable:
                return Reply(connection, 503, "503 Service Unavailable\n", nullptr, nullptr,
                             decision.close);
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
        if (whep_offer) return ServeOffer(self, connection, peer_text, query, body);
        if (whep_session) {
            if (!self->m_whep->End(path.substr(6)))
                return Reply(connection, 404, "No such session.\n");
            return Reply(connection, 200, "");
        }
        return Reply(connection, 404, "404 Not Found\n");
    }

    // A viewer's place among kv.orvex.http.max, at a size the capture takes: 0 when it has one
    // (and is counted), else the status to answer with `why` (one log line said it).
    static unsigned TakePlace(WebViewer* self, const std::string& peer, const std::string& query,
                              std::string* why) {
        const int max = self->m_options.max_viewers;
        if (self->m_viewers->fetch_add(1) >= max) {
            self->m_viewers->fetch_sub(1);
            OrvexLogPriority(platform::kLogWarn, kTag,
                             "web viewer %s refused: %d viewers already watch (kv.orvex.http.max)",
                             peer.c_str(), max);
            *why = "Too many viewers; try again later.\n";
            return 503;
        }
        *why = RefusedSize(query);
        if (why->empty()) return 0;
        self->m_viewers->fetch_sub(1);
        OrvexLogPriority(platform::kLogWarn, kTag, "web viewer %s refused: %.*s", peer.c_str(),
                         static_cast<int>(why->size() - 1), why->c_str());
        return 400;
    }

    // POST /whep: an SDP offer in, the answer out, the session counted among the viewers.
    static MHD_Result ServeOffer(WebViewer* self, MHD_Connection* connection,
                                 const std::string& peer, const std::string& query,
                                 Request* request) {
        const char* type =
            MHD_lookup_connection_value(connection, MHD_HEADER_KIND, MHD_HTTP_HEADER_CONTENT_TYPE);
        if (type == nullptr || strncasecmp(type, "application/sdp", 15) != 0)
            return Reply(connection, 415, "An offer is sent as application/sdp.\n");
        if (request == nullptr || request->body_too_large)
            return Reply(connection, 413, "The offer is too large.\n", nullptr, nullptr, true);
        std::string refused;
        if (const unsigned status = TakePlace(self, peer, query, &refused))
            return Reply(connection, status, refused);
        const int max = self->m_options.max_viewers;
        sockaddr_storage local{};
        socklen_t local_len = sizeof local;
        const MHD_ConnectionInfo* fd =
            MHD_get_connection_info(connection, MHD_CONNECTION_INFO_CONNECTION_FD);
        if (fd == nullptr ||
            getsockname(fd->connect_fd, reinterpret_cast<sockaddr*>(&local), &local_len) != 0) {
            self->m_viewers->fetch_sub(1);
            return Reply(connection, 500, "The server's own address is unknown.\n");
        }
        std::shared_ptr<std::atomic<int>> viewers = self->m_viewers;
        WhepEndpoint::OfferRequest offer{std::move(request->body), query,
                                         reinterpret_cast<const sockaddr*>(&local), peer,
                                         [viewers] { viewers->fetch_sub(1); }};
        WhepEndpoint::Reply reply = self->m_whep->Offer(std::move(offer));
        if (reply.status != 201) {
            self->m_viewers->fetch_sub(1);
            return Reply(connection, reply.status, reply.body);
        }
        MHD_Response* response = MHD_create_response_from_buffer(
            reply.body.size(), const_cast<char*>(reply.body.data()), MHD_RESPMEM_MUST_COPY);
        if (response == nullptr) return MHD_NO;
        MHD_add_response_header(response, MHD_HTTP_HEADER_CONTENT_TYPE, "application/sdp");
        MHD_add_response_header(response, MHD_HTTP_HEADER_CACHE_CONTROL, "no-store");
        MHD_add_response_header(response, MHD_HTTP_HEADER_LOCATION, reply.location.c_str());
        MHD_Result result = MHD_queue_response(connection, 201, response);
        MHD_destroy_response(response);
        OrvexLog(kTag, "web viewer %s watching by WebRTC (%d of %d) from %s\n", peer.c_str(),
                 self->m_viewers->load(), max,
                 AddressText(reinterpret_cast<const sockaddr*>(&local)).c_str());
        return result;
    }

    static MHD_Result ServeStream(WebViewer* self, MHD_Connection* connection,
                                  const std::string& peer, const std::string& query) {
        std::string refused;
        if (const unsigned status = TakePlace(self, peer, query, &refused))
            return Reply(connection, status, refused);
        const int max = self->m_options.max_viewers;
        if (self->m_transport != nullptr)
            self->m_transport->HoldCapture(stream::CaptureQueryFor(query));
        stream::AskForKeyFrame();  // a fresh key frame to start from, not the encoder's next
        auto* viewer = new StreamViewer{self, peer, {}, GetTimeStampMillsec()};
        std::string type;
        if (!self->m_ring.WaitForStart(&viewer->reader, &type, self->m_options.start_wait_ms)) {
            OrvexLogPriority(platform::kLogWarn, kTag,
                             "web viewer %s: no picture within %d ms (is capture running?)",
                             peer.c_str(), self->m_options.start_wait_ms);
            viewer->end_reason = nullptr;
            End(viewer);
            return Reply(connection, 503,
                         "No picture within " +
                             std::to_string(self->m_options.start_wait_ms / 1000) +
                             " s: the picture source is not running; the service's log says "
                             "why.\n");
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
                 self->m_viewers->load(), max, type.c_str());
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
        self->m_viewers->fetch_sub(1);
        delete viewer;
    }
};

WebViewer::WebViewer(stream::CaptureDemand* transport, auth::AccessGate* gate, Options options,
                     WhepEndpoint* whep)
    : m_transport(transport),
      m_options(options),
      m_ring(options.ring_bytes),
      m_muxer(&m_ring),
      m_own_gate(gate == nullptr ? std::make_unique<auth::AccessGate>() : nullptr),
      m_gate(gate != nullptr ? gate : m_own_gate.get()),
      m_whep(whep),
      m_warden({options.waiting_max, options.request_deadline_ms},
               // The connection's own thread sees its socket end and closes it.
               [](int fd) { shutdown(fd, SHUT_RDWR); }) {}

WebViewer::~WebViewer() { Stop(); }

bool WebViewer::Start() {
    if (m_own_gate != nullptr) m_own_gate->Configure(m_options.allow, m_options.auth_file);
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
        MHD_OPTION_NOTIFY_COMPLETED, WebViewerCalls::Completed, this, MHD_OPTION_NOTIFY_CONNECTION,
        WebViewerCalls::Connection, this,
        // Viewers, connections waiting for their request (the warden keeps those from taking
        // more) and a margin; one address cannot take every connection.
        MHD_OPTION_CONNECTION_LIMIT, viewers + static_cast<unsigned>(m_options.waiting_max) + 8,
        MHD_OPTION_PER_IP_CONNECTION_LIMIT, viewers + 4, MHD_OPTION_CONNECTION_TIMEOUT,
        m_options.idle_timeout_s,
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
    m_sweeper = std::thread([this] {
        thread_mutex::Scoped hold(m_sweep_lock);
        while (!m_stopping.load()) {
            if (m_warden.Sweep(SteadyMs()) > 0)
                WebViewerCalls::LogCrowd(this, "connections past the deadline were closed");
            m_sweep_wake.wait_for(m_sweep_lock, std::chrono::milliseconds(250));
        }
    });
    OrvexLogPriority(platform::kLogInfo, kTag, "web viewer on port %u, at most %d viewers",
                     m_options.port, m_options.max_viewers);
    return true;
}

void WebViewer::Stop() {
    if (m_daemon == nullptr) return;
    {
        thread_mutex::Scoped hold(m_sweep_lock);
        m_stopping.store(true);
        m_sweep_wake.notify_all();
    }
    if (m_sweeper.joinable()) m_sweeper.join();
    m_ring.Stop();
    if (m_tapped) RemoveFrameSink(&m_muxer);
    m_tapped = false;
    MHD_stop_daemon(m_daemon);  // joins every connection's thread; the viewers' holds end
    m_daemon = nullptr;
}

namespace {
std::unique_ptr<WebViewer> g_web_viewer;
}

void StartWebViewer(const config::Settings& settings, stream::CaptureDemand* transport,
                    auth::AccessGate* gate, WhepEndpoint* whep) {
    // Unset is the television's default: no web viewer, no port. A refused value was logged.
    if (settings.http_port == 0) return;
    WebViewer::Options options;
    options.port = settings.http_port;
    options.max_viewers = settings.http_max;
    options.bind = settings.bind;
    options.allow = settings.allow;
    options.auth_file = settings.auth_file;
    auto viewer = std::make_unique<WebViewer>(transport, gate, options, whep);
    if (viewer->Start()) g_web_viewer = std::move(viewer);
}

void StopWebViewer() { g_web_viewer.reset(); }

unsigned WebViewerPort() { return g_web_viewer != nullptr ? g_web_viewer->port() : 0; }
