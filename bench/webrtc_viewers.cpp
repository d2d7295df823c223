// Many WebRTC viewers at once against a running orvex: each posts the chromium offer (its own
// certificate's fingerprint in it), completes STUN and DTLS as a browser would, then counts
// what arrives for SECONDS while sending consent checks and NACKs for gaps in the video.
//   webrtc_viewers HOST HTTP_PORT N SECONDS [--stall K:FROM:LEN]
// --stall: viewer K reads and sends nothing from second FROM for LEN seconds (its socket's
// buffer fills and the kernel drops the rest, as for a viewer whose Wi-Fi vanished), then
// goes on. One thread polls every socket. Per viewer: lost counts the video packets missing
// from the sequence when a later one came, resent those of them that came after all.
#include <arpa/inet.h>
#include <netinet/in.h>
#include <poll.h>
#include <sys/socket.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <fstream>
#include <memory>
#include <set>
#include <sstream>
#include <string>
#include <vector>

#include "tests/webrtc/DtlsTestClient.h"
#include "tests/webrtc/StunRequest.h"

namespace {

using Bytes = std::vector<uint8_t>;
using Clock = std::chrono::steady_clock;

constexpr int kJoinMs = 5000;
constexpr int kSettleMs = 500;
constexpr int kConsentMs = 2500;         // a browser checks every 2-3 s (RFC 7675 §5.1)
constexpr int kReceiveBuffer = 1 << 20;  // a key picture for every viewer at once, with room
constexpr int kNackLargestGap = 256;     // beyond what a sender keeps; a browser would ask a PLI

std::string Attribute(const std::string& sdp, const std::string& name) {
    const size_t at = sdp.find("a=" + name + ":");
    if (at == std::string::npos) return "";
    const size_t from = at + name.size() + 3;
    return sdp.substr(from, sdp.find("\r\n", from) - from);
}

// One HTTP/1.1 exchange on a connection of its own: the status, the Location and the body.
struct HttpReply {
    int status = 0;
    std::string location, body;
};

HttpReply Http(const sockaddr_in& to, const std::string& method, const std::string& path,
               const std::string& body) {
    HttpReply reply;
    const int fd = socket(AF_INET, SOCK_STREAM, 0);
    if (fd < 0) return reply;
    if (connect(fd, reinterpret_cast<const sockaddr*>(&to), sizeof to) != 0) {
        close(fd);
        return reply;
    }
    std::string request = method + " " + path + " HTTP/1.1\r\nHost: orvex\r\nConnection: close\r\n";
    if (!body.empty()) request += "Content-Type: application/sdp\r\n";
    request += "Content-Length: " + std::to_string(body.size()) + "\r\n\r\n" + body;
    for (size_t sent = 0; sent < request.size();) {
        const ssize_t n = send(fd, request.data() + sent, request.size() - sent, MSG_NOSIGNAL);
        if (n <= 0) break;
        sent += static_cast<size_t>(n);
    }
    std::string text;
    char chunk[4096];
    for (ssize_t n; (n = recv(fd, chunk, sizeof chunk, 0)) > 0;) text.append(chunk, n);
    close(fd);
    if (text.compare(0, 9, "HTTP/1.1 ") != 0) return reply;
    reply.status = std::atoi(text.c_str() + 9);
    const size_t end = text.find("\r\n\r\n");
    const std::string head = text.substr(0, end);
    for (const char* key : {"\r\nLocation: ", "\r\nlocation: "}) {
        const size_t at = head.find(key);
        if (at != std::string::npos) {
            const size_t from = at + strlen(key);
            reply.location = head.substr(from, head.find("\r\n", from) - from);
        }
    }
    if (end != std::string::npos) reply.body = text.substr(end + 4);
    return reply;
}

struct Viewer {
    std::unique_ptr<webrtc::test::DtlsTestClient> dtls;
    int fd = -1;
    std::string location, ufrag, pwd;
    int opus_type = -1;
    // Counted once the warm-up is over; pictures also per second of the run.
    long video = 0, audio = 0, lost = 0, resent = 0, refused = 0;
    std::vector<int> pictures;  // per second
    bool have_seq = false;
    uint16_t next_seq = 0;
    std::set<uint16_t> missing;  // asked again, not yet come
    Clock::time_point next_consent;
    bool stalling = false;
};

bool Receive(int fd, int ms, Bytes* out) {
    pollfd p{fd, POLLIN, 0};
    if (poll(&p, 1, ms) != 1) return false;
    out->resize(2048);
    const ssize_t n = recv(fd, out->data(), out->size(), 0);
    out->resize(n > 0 ? static_cast<size_t>(n) : 0);
    return n > 0;
}

bool Connect(Viewer& v, const sockaddr_in& udp) {
    v.fd = socket(AF_INET, SOCK_DGRAM | SOCK_NONBLOCK, 0);
    setsockopt(v.fd, SOL_SOCKET, SO_RCVBUF, &kReceiveBuffer, sizeof kReceiveBuffer);
    if (v.fd < 0 || connect(v.fd, reinterpret_cast<const sockaddr*>(&udp), sizeof udp) != 0)
        return false;
    const Bytes check = webrtc::test::BindingRequest(v.ufrag + ":viewer", v.pwd);
    Bytes d;
    bool answered = false;
    for (int attempt = 0; attempt < 5 && !answered; ++attempt) {
        send(v.fd, check.data(), check.size(), 0);
        while (!answered && Receive(v.fd, 500, &d))
            answered = d.size() >= 20 && d[0] == 0x01 && d[1] == 0x01;
    }
    if (!answered) return false;
    webrtc::test::Datagrams to_server = v.dtls->Step({});
    for (int round = 0; round < 20 && !v.dtls->connected(); ++round) {
        for (const Bytes& out : to_server) send(v.fd, out.data(), out.size(), 0);
        // The server's flight, record by record, until the client answers it: media follows
        // the handshake at once, so waiting for a quiet socket would wait for ever.
        to_server.clear();
        bool heard = false;
        for (int ms = 500; to_server.empty() && !v.dtls->connected() && Receive(v.fd, ms, &d);
             ms = 50) {
            if (d[0] < 20 || d[0] > 63) continue;  // not DTLS (RFC 7983 §7)
            heard = true;
            to_server = v.dtls->Step({d});
        }
        if (!heard) to_server = v.dtls->OnTimeout();
    }
    for (const Bytes& out : to_server) send(v.fd, out.data(), out.size(), 0);
    return v.dtls->connected() && v.dtls->KeySrtp();
}

// A generic NACK (RFC 4585 §6.2.1) for `count` packets from `first`, 17 to an entry.
void Nack(Viewer& v, uint32_t media_ssrc, uint16_t first, int count) {
    Bytes nack = {0x81, 205, 0, 0, 0, 0, 0, 1, 0, 0, 0, 0};
    for (int i = 0; i < 4; ++i) nack[8 + i] = static_cast<uint8_t>(media_ssrc >> (24 - 8 * i));
    for (int done = 0; done < count;) {
        const uint16_t pid = static_cast<uint16_t>(first + done);
        uint16_t mask = 0;
        for (int bit = 0; bit < 16 && done + 1 + bit < count; ++bit) mask |= 1u << bit;
        nack.insert(nack.end(), {static_cast<uint8_t>(pid >> 8), static_cast<uint8_t>(pid),
                                 static_cast<uint8_t>(mask >> 8), static_cast<uint8_t>(mask)});
        done += 17;
    }
    webrtc::test::Put16(nack, 2, static_cast<uint16_t>(nack.size() / 4 - 1));
    if (v.dtls->ProtectRtcp(&nack)) send(v.fd, nack.data(), nack.size(), 0);
}

void OnDatagram(Viewer& v, Bytes& d, bool counted, int second) {
    if (d.size() < 12 || d[0] < 128 || d[0] > 191) return;  // STUN answers, DTLS
    if (d[1] >= 192 && d[1] <= 223) return;                 // RTCP
    if (!v.dtls->UnprotectRtp(&d)) {
        if (counted) ++v.refused;
        return;
    }
    const int type = d[1] & 0x7f;
    if (type == v.opus_type) {
        if (counted) ++v.audio;
        return;
    }
    const uint16_t seq = static_cast<uint16_t>(d[2] << 8 | d[3]);
    if (!v.have_seq) {
        v.have_seq = true;
        v.next_seq = seq;
    }
    const int16_t ahead = static_cast<int16_t>(seq - v.next_seq);
    if (ahead >= 0) {
        if (ahead > 0) {
            if (counted) v.lost += ahead;
            if (ahead <= kNackLargestGap) {
                for (int i = 0; i < ahead; ++i)
                    v.missing.insert(static_cast<uint16_t>(v.next_seq + i));
                const uint32_t ssrc =
                    static_cast<uint32_t>(d[8] << 24 | d[9] << 16 | d[10] << 8 | d[11]);
                Nack(v, ssrc, v.next_seq, ahead);
            }
        }
        v.next_seq = static_cast<uint16_t>(seq + 1);
    } else if (v.missing.erase(seq) != 0) {
        if (counted) ++v.resent;
    }
    if (!counted) return;
    ++v.video;
    // A picture sent again came late to be shown; the rate is of pictures in their time.
    if (ahead >= 0 && (d[1] & 0x80) != 0) ++v.pictures[static_cast<size_t>(second)];
}

double Fps(const Viewer& v, int from, int len) {
    long n = 0;
    for (int s = from; s < from + len && s < static_cast<int>(v.pictures.size()); ++s)
        n += v.pictures[s];
    return len > 0 ? static_cast<double>(n) / len : 0;
}

}  // namespace

int main(int argc, char** argv) {
    if (argc != 5 && argc != 7) {
        fprintf(stderr, "usage: %s HOST HTTP_PORT N SECONDS [--stall K:FROM:LEN]\n", argv[0]);
        return 2;
    }
    sockaddr_in http{};
    http.sin_family = AF_INET;
    http.sin_port = htons(static_cast<uint16_t>(std::atoi(argv[2])));
    if (inet_pton(AF_INET, argv[1], &http.sin_addr) != 1) {
        fprintf(stderr, "webrtc_viewers: HOST must be an IPv4 address: %s\n", argv[1]);
        return 2;
    }
    const int n = std::atoi(argv[3]), seconds = std::atoi(argv[4]);
    int stalled = -1, stall_from = 0, stall_len = 0;
    if (argc == 7 && (strcmp(argv[5], "--stall") != 0 ||
                      sscanf(argv[6], "%d:%d:%d", &stalled, &stall_from, &stall_len) != 3)) {
        fprintf(stderr, "webrtc_viewers: --stall K:FROM:LEN, not %s %s\n", argv[5], argv[6]);
        return 2;
    }
    if (n <= 0 || seconds <= 0 || stalled >= n || stall_from + stall_len > seconds) {
        fprintf(stderr, "webrtc_viewers: N and SECONDS must be positive, the stall inside them\n");
        return 2;
    }
    std::ifstream file(ORVEX_SOURCE_DIR "/tests/webrtc/chromium-156-offer.sdp");
    std::stringstream text;
    text << file.rdbuf();
    const std::string offer = text.str();
    const std::string theirs = Attribute(offer, "fingerprint");
    if (theirs.empty()) {
        fprintf(stderr, "webrtc_viewers: no offer at " ORVEX_SOURCE_DIR "/tests/webrtc\n");
        return 1;
    }

    std::vector<Viewer> viewers(static_cast<size_t>(n));
    int failed = 0;
    for (int i = 0; i < n; ++i) {
        Viewer& v = viewers[static_cast<size_t>(i)];
        v.dtls = std::make_unique<webrtc::test::DtlsTestClient>(
            "SRTP_AEAD_AES_128_GCM:SRTP_AES128_CM_SHA1_80");
        std::string mine = offer;
        mine.replace(mine.find(theirs), theirs.size(),
                     "sha-256 " + webrtc::test::Sha256Text(SSL_get_certificate(v.dtls->ssl())));
        const HttpReply reply = Http(http, "POST", "/whep", mine);
        if (reply.status != 201) {
            fprintf(stderr, "webrtc_viewers: viewer %d: offer answered %d: %.200s\n", i,
                    reply.status, reply.body.c_str());
            ++failed;
            continue;
        }
        v.location = reply.location;
        v.ufrag = Attribute(reply.body, "ice-ufrag");
        v.pwd = Attribute(reply.body, "ice-pwd");
        const std::string candidate = Attribute(reply.body, "candidate");
        const size_t typ = candidate.find(" typ host");
        const size_t space = candidate.rfind(' ', typ - 1);
        const std::string opus = "opus/48000";
        const size_t rtpmap = reply.body.find(opus);
        if (rtpmap != std::string::npos) {
            const size_t colon = reply.body.rfind("a=rtpmap:", rtpmap);
            v.opus_type = std::atoi(reply.body.c_str() + colon + 9);
        }
        sockaddr_in udp = http;
        udp.sin_port = htons(static_cast<uint16_t>(
            typ == std::string::npos ? 0 : std::atoi(candidate.c_str() + space + 1)));
        if (!Connect(v, udp)) {
            fprintf(stderr, "webrtc_viewers: viewer %d: no STUN answer or DTLS handshake\n", i);
            ++failed;
            continue;
        }
        v.pictures.assign(static_cast<size_t>(seconds), 0);
    }

    printf("connected=%d\n", n - failed);
    fflush(stdout);
    // Counting starts kSettleMs after every viewer has its first picture (each waits for a key
    // picture), or after kJoinMs whatever came; a line says when, for whoever samples the
    // server beside this.
    const Clock::time_point start = Clock::now();
    Clock::time_point t0 = Clock::time_point::max(), end = t0;
    std::vector<pollfd> fds;
    std::vector<size_t> owner;
    Bytes d;
    d.reserve(2048);
    for (Clock::time_point now = start; now < end; now = Clock::now()) {
        if (t0 == Clock::time_point::max()) {
            const bool all = std::all_of(viewers.begin(), viewers.end(), [](const Viewer& v) {
                return v.pictures.empty() || v.have_seq;
            });
            if (all || now - start > std::chrono::milliseconds(kJoinMs)) {
                t0 = now + std::chrono::milliseconds(kSettleMs);
                end = t0 + std::chrono::seconds(seconds);
                printf("counting_in_ms=%d\n", kSettleMs);
                fflush(stdout);
            }
        }
        const bool counted = now >= t0;
        const int second =
            counted ? static_cast<int>(
                          std::chrono::duration_cast<std::chrono::seconds>(now - t0).count())
                    : 0;
        fds.clear();
        owner.clear();
        for (size_t i = 0; i < viewers.size(); ++i) {
            Viewer& v = viewers[i];
            if (v.pictures.empty()) continue;
            const bool stalling = static_cast<int>(i) == stalled && counted &&
                                  second >= stall_from && second < stall_from + stall_len;
            // While stalled the socket keeps the smallest buffer the kernel allows, so what
            // comes meanwhile is dropped rather than read late, as on a link that went away.
            if (stalling != v.stalling) {
                v.stalling = stalling;
                const int bytes = stalling ? 0 : kReceiveBuffer;
                setsockopt(v.fd, SOL_SOCKET, SO_RCVBUF, &bytes, sizeof bytes);
            }
            if (stalling) continue;
            if (now >= v.next_consent) {
                const Bytes check = webrtc::test::BindingRequest(v.ufrag + ":viewer", v.pwd);
                send(v.fd, check.data(), check.size(), 0);
                v.next_consent = now + std::chrono::milliseconds(kConsentMs);
            }
            fds.push_back({v.fd, POLLIN, 0});
            owner.push_back(i);
        }
        if (poll(fds.data(), fds.size(), 20) <= 0) continue;
        for (size_t k = 0; k < fds.size(); ++k) {
            if (!(fds[k].revents & POLLIN)) continue;
            Viewer& v = viewers[owner[k]];
            for (int burst = 0; burst < 64; ++burst) {
                d.resize(2048);
                const ssize_t got = recv(v.fd, d.data(), d.size(), 0);
                if (got <= 0) break;
                d.resize(static_cast<size_t>(got));
                OnDatagram(v, d, counted, second);
            }
        }
    }

    std::vector<double> fps;
    double min_others_in_stall = 1e9;
    for (size_t i = 0; i < viewers.size(); ++i) {
        Viewer& v = viewers[i];
        if (!v.location.empty()) Http(http, "DELETE", v.location, "");
        if (v.pictures.empty()) continue;
        const double f = Fps(v, 0, seconds);
        printf("viewer=%zu fps=%.1f video_packets=%ld audio_packets=%ld lost=%ld resent=%ld", i, f,
               v.video, v.audio, v.lost, v.resent);
        if (v.refused) printf(" refused=%ld", v.refused);
        if (static_cast<int>(i) == stalled) {
            const int after = stall_from + stall_len;
            printf(" stalled=%d..%ds before_fps=%.1f after_fps=%.1f last3_fps=%.1f", stall_from,
                   after, Fps(v, 0, stall_from), Fps(v, after, seconds - after),
                   Fps(v, std::max(after, seconds - 3), seconds - std::max(after, seconds - 3)));
        } else {
            fps.push_back(f);
            if (stalled >= 0)
                min_others_in_stall = std::min(min_others_in_stall, Fps(v, stall_from, stall_len));
        }
        printf("\n");
        close(v.fd);
    }
    std::sort(fps.begin(), fps.end());
    printf("viewers=%d failed=%d min_fps=%.1f median_fps=%.1f", n, failed,
           fps.empty() ? 0.0 : fps.front(), fps.empty() ? 0.0 : fps[fps.size() / 2]);
    if (stalled >= 0 && !fps.empty()) printf(" others_min_fps_in_stall=%.1f", min_others_in_stall);
    printf("\n");
    return failed == 0 ? 0 : 1;
}
