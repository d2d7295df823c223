#include "webrtc/WebRtcSdp.h"

#include <cctype>
#include <memory>

namespace webrtc {
namespace {

constexpr size_t kMaxOffer = 64 * 1024;
// Browsers offer a handful; a bound keeps the work and the answer small whatever comes.
constexpr size_t kMaxMedia = 32;
constexpr int kPayloadTypes = 128;  // 7 bits in the RTP header
constexpr char kPlayoutDelayUri[] = "http://www.webrtc.org/experiments/rtp-hdrext/playout-delay";
constexpr char kMidUri[] = "urn:ietf:params:rtp-hdrext:sdes:mid";
// RFC 6184 §8.1: without profile-level-id, Baseline at level 1.0.
constexpr char kDefaultProfileLevelId[] = "420010";

bool EqualNoCase(std::string_view a, std::string_view b) {
    if (a.size() != b.size()) return false;
    for (size_t i = 0; i < a.size(); ++i) {
        if (tolower(static_cast<unsigned char>(a[i])) != tolower(static_cast<unsigned char>(b[i])))
            return false;
    }
    return true;
}

bool StartsWith(std::string_view s, std::string_view prefix) {
    return s.substr(0, prefix.size()) == prefix;
}

std::string_view Trim(std::string_view s) {
    while (!s.empty() && (s.front() == ' ' || s.front() == '\t')) s.remove_prefix(1);
    while (!s.empty() && (s.back() == ' ' || s.back() == '\t')) s.remove_suffix(1);
    return s;
}

// The text before the first `sep` (all of `s` without one); `s` keeps what follows it.
std::string_view Cut(std::string_view* s, char sep) {
    const size_t at = s->find(sep);
    const std::string_view head = s->substr(0, at);
    s->remove_prefix(at == std::string_view::npos ? s->size() : at + 1);
    return head;
}

// A decimal number of at most 5 digits, -1 when `s` is anything else.
int Number(std::string_view s) {
    if (s.empty() || s.size() > 5) return -1;
    int v = 0;
    for (char c : s) {
        if (c < '0' || c > '9') return -1;
        v = v * 10 + (c - '0');
    }
    return v;
}

int HexDigit(char c) {
    if (c >= '0' && c <= '9') return c - '0';
    if (c >= 'a' && c <= 'f') return c - 'a' + 10;
    if (c >= 'A' && c <= 'F') return c - 'A' + 10;
    return -1;
}

// The value of `name` in an fmtp parameter list ("a=1;b=2", blanks allowed); empty if absent.
std::string_view FmtpParameter(std::string_view fmtp, std::string_view name) {
    while (!fmtp.empty()) {
        std::string_view value = Trim(Cut(&fmtp, ';'));
        const std::string_view key = Trim(Cut(&value, '='));
        if (EqualNoCase(key, name)) return Trim(value);
    }
    return {};
}

struct PayloadType {
    std::string_view encoding;  // of a=rtpmap, "H264", "opus", "rtx", ...
    std::string_view clock;     // "90000", "48000/2"
    std::string_view fmtp;
    bool nack = false, pli = false, fir = false;
};

// One m= section while its lines are read: formats are chosen when it ends, since a=fmtp and
// a=rtcp-fb may come before the a=rtpmap they qualify (Firefox orders them so).
struct Section {
    WebRtcOffer::Media* media = nullptr;
    bool port_zero = false;
    bool rtcp_mux = false;
    PayloadType types[kPayloadTypes];
    PayloadType any;  // a=rtcp-fb:* (RFC 4585 §4.2)
};

void NoteFeedback(std::string_view value, PayloadType* pt) {
    const std::string_view kind = Trim(Cut(&value, ' '));
    const std::string_view param = Trim(value);
    if (kind == "nack" && param.empty()) pt->nack = true;
    if (kind == "nack" && param == "pli") pt->pli = true;
    if (kind == "ccm" && param == "fir") pt->fir = true;
}

// "a=<name>:<pt> <rest>" for the per-type attributes; null when the type is no number we keep.
PayloadType* TypeOf(Section* s, std::string_view* value) {
    const std::string_view pt = Cut(value, ' ');
    if (pt == "*") return &s->any;
    const int n = Number(pt);
    return n >= 0 && n < kPayloadTypes ? &s->types[n] : nullptr;
}

// How well an offered mode-1 H.264 type suits a stream of `profile_idc`/`constraints`; 0 (never
// chosen) when its profile-level-id is not the 6 hex digits of RFC 6184 §8.1.
int H264Score(std::string_view profile_level_id, int profile_idc, int constraints) {
    if (profile_level_id.size() != 6) return 0;
    int bytes[3];
    for (int i = 0; i < 3; ++i) {
        const int hi = HexDigit(profile_level_id[2 * i]),
                  lo = HexDigit(profile_level_id[2 * i + 1]);
        if (hi < 0 || lo < 0) return 0;
        bytes[i] = hi << 4 | lo;
    }
    // constraint_set0..5 (the low two bits are reserved); the stream must meet every one the
    // decoder asks for.
    const int asked = bytes[1] & 0xfc, met = constraints & 0xfc;
    if (bytes[0] == profile_idc && (asked & ~met) == 0) return asked == met ? 4 : 3;
    if (bytes[0] == 0x42 && (bytes[1] & 0x40)) return 2;  // constrained baseline
    return 1;
}

void ChooseVideo(Section* s, int profile_idc, int constraints) {
    WebRtcOffer::Media* m = s->media;
    std::string_view formats = m->formats;
    int best = 0;
    while (!formats.empty()) {
        const int n = Number(Cut(&formats, ' '));
        if (n < 0 || n >= kPayloadTypes) continue;
        const PayloadType& pt = s->types[n];
        if (!EqualNoCase(pt.encoding, "H264") || pt.clock != "90000") continue;
        if (FmtpParameter(pt.fmtp, "packetization-mode") != "1") continue;
        std::string_view plid = FmtpParameter(pt.fmtp, "profile-level-id");
        if (plid.empty()) plid = kDefaultProfileLevelId;
        const int score = H264Score(plid, profile_idc, constraints);
        if (score > best) {
            best = score;
            m->payload_type = n;
            m->h264_profile_level_id = std::string(plid);
        }
    }
}

void ChooseAudio(Section* s) {
    WebRtcOffer::Media* m = s->media;
    std::string_view formats = m->formats;
    while (!formats.empty() && m->payload_type < 0) {
        const int n = Number(Cut(&formats, ' '));
        if (n < 0 || n >= kPayloadTypes) continue;
        if (EqualNoCase(s->types[n].encoding, "opus") && s->types[n].clock == "48000/2") {
            m->payload_type = n;
        }
    }
}

// What the acceptance needs of a section beyond its Media: whether it may carry anything.
struct Usable {
    bool port_zero;
    bool rtcp_mux;
};

void FinishSection(Section* s, int profile_idc, int constraints, std::vector<Usable>* usable) {
    WebRtcOffer::Media* m = s->media;
    if (m == nullptr) return;
    usable->push_back({s->port_zero, s->rtcp_mux});
    if (m->kind == "video") ChooseVideo(s, profile_idc, constraints);
    if (m->kind == "audio") ChooseAudio(s);
    if (m->payload_type < 0) return;
    const PayloadType& pt = s->types[m->payload_type];
    m->nack = pt.nack || s->any.nack;
    m->pli = pt.pli || s->any.pli;
    m->fir = pt.fir || s->any.fir;
    const std::string chosen = std::to_string(m->payload_type);
    std::string_view formats = m->formats;
    while (!formats.empty() && m->rtx_payload_type < 0) {
        const int n = Number(Cut(&formats, ' '));
        if (n < 0 || n >= kPayloadTypes) continue;
        if (EqualNoCase(s->types[n].encoding, "rtx") &&
            FmtpParameter(s->types[n].fmtp, "apt") == chosen) {
            m->rtx_payload_type = n;
        }
    }
}

bool ReadFingerprint(std::string_view value, WebRtcOffer* out) {
    const std::string_view algorithm = Trim(Cut(&value, ' '));
    if (!EqualNoCase(algorithm, "sha-256") || !out->fingerprint.empty()) return true;
    value = Trim(value);
    std::vector<uint8_t> bytes;
    while (!value.empty()) {
        const std::string_view pair = Cut(&value, ':');
        if (pair.size() != 2 || HexDigit(pair[0]) < 0 || HexDigit(pair[1]) < 0) return false;
        bytes.push_back(uint8_t(HexDigit(pair[0]) << 4 | HexDigit(pair[1])));
    }
    if (bytes.size() != 32) return false;
    out->fingerprint_algorithm = "sha-256";
    out->fingerprint = std::move(bytes);
    return true;
}

bool IsDirection(std::string_view a) {
    return a == "sendrecv" || a == "recvonly" || a == "sendonly" || a == "inactive";
}

bool Receives(const WebRtcOffer::Media& m) {
    return m.direction == "recvonly" || m.direction == "sendrecv";
}

bool Fail(std::string* why, const char* text) {
    if (why != nullptr) *why = text;
    return false;
}

}  // namespace

bool ReadWebRtcOffer(std::string_view sdp, int profile_idc, int constraints, WebRtcOffer* out,
                     std::string* why) {
    *out = WebRtcOffer();
    if (sdp.size() > kMaxOffer) return Fail(why, "The offer is larger than 64 KiB.");
    if (!StartsWith(sdp, "v=0\r\n") && !StartsWith(sdp, "v=0\n")) {
        return Fail(why, "The offer is not SDP.");
    }
    for (char c : sdp) {
        // Offered values reach the answer and the log: no line may break or hide in them.
        if ((static_cast<unsigned char>(c) < 0x20 && c != '\r' && c != '\n' && c != '\t') ||
            c == 0x7f) {
            return Fail(why, "The offer holds control characters.");
        }
    }
    // The per-type tables make a section large: one on the heap, reused for every m= line.
    auto section = std::make_unique<Section>();
    out->media.reserve(8);
    std::vector<Usable> usable;
    usable.reserve(8);
    bool bad_fingerprint = false;
    std::string_view rest = sdp;
    while (!rest.empty()) {
        std::string_view line = Cut(&rest, '\n');
        if (!line.empty() && line.back() == '\r') line.remove_suffix(1);
        if (line.find('\r') != std::string_view::npos) return Fail(why, "The offer is not SDP.");
        if (StartsWith(line, "m=")) {
            FinishSection(section.get(), profile_idc, constraints, &usable);
            if (out->media.size() == kMaxMedia) {
                return Fail(why, "The offer has more than 32 media sections.");
            }
            *section = Section();
            out->media.emplace_back();
            WebRtcOffer::Media* m = &out->media.back();
            section->media = m;
            std::string_view v = line.substr(2);
            m->kind = std::string(Cut(&v, ' '));
            std::string_view port = Cut(&v, ' ');
            section->port_zero = Number(Cut(&port, '/')) == 0;  // "9" or "9/2"
            m->protocol = std::string(Cut(&v, ' '));
            m->formats = std::string(Trim(v));
            m->direction = "sendrecv";  // RFC 4566 §6: the default
            continue;
        }
        if (!StartsWith(line, "a=")) continue;
        std::string_view value = line.substr(2);
        const std::string_view name = Cut(&value, ':');
        if (name == "ice-ufrag" && out->ice_ufrag.empty()) {
            out->ice_ufrag = std::string(Trim(value));
        } else if (name == "ice-pwd" && out->ice_pwd.empty()) {
            out->ice_pwd = std::string(Trim(value));
        } else if (name == "fingerprint") {
            if (!ReadFingerprint(value, out)) bad_fingerprint = true;
        } else if (name == "setup" && out->setup.empty()) {
            out->setup = std::string(Trim(value));
        } else if (name == "group") {
            if (Cut(&value, ' ') == "BUNDLE") out->bundle = true;
        } else if (section->media == nullptr) {
            continue;  // the rest are media-level attributes
        } else if (name == "mid") {
            section->media->mid = std::string(Trim(value));
        } else if (IsDirection(name)) {
            section->media->direction = std::string(name);
        } else if (name == "rtcp-mux") {
            section->rtcp_mux = true;
        } else if (name == "rtcp-rsize") {
            section->media->rtcp_rsize = true;
        } else if (name == "rtpmap") {
            if (PayloadType* pt = TypeOf(section.get(), &value)) {
                std::string_view map = Trim(value);
                pt->encoding = Cut(&map, '/');
                pt->clock = map;
            }
        } else if (name == "fmtp") {
            if (PayloadType* pt = TypeOf(section.get(), &value)) pt->fmtp = Trim(value);
        } else if (name == "rtcp-fb") {
            if (PayloadType* pt = TypeOf(section.get(), &value)) NoteFeedback(value, pt);
        } else if (name == "extmap") {
            std::string_view id = Cut(&value, ' ');
            const int n = Number(Cut(&id, '/'));  // "5" or "5/recvonly"
            const std::string_view uri = Cut(&value, ' ');
            // Ids above 14 need the two-byte form (RFC 8285 §4.3), which we do not write.
            if (n < 1 || n > 14) continue;
            if (uri == kPlayoutDelayUri) section->media->playout_delay_extension = n;
            if (uri == kMidUri) section->media->mid_extension = n;
        }
    }
    FinishSection(section.get(), profile_idc, constraints, &usable);

    if (out->ice_ufrag.empty() || out->ice_pwd.empty()) {
        return Fail(why, "The offer has no ice-ufrag and ice-pwd.");
    }
    if (bad_fingerprint || out->fingerprint.empty()) {
        return Fail(why, "The offer has no sha-256 fingerprint.");
    }
    // We answer a=setup:passive; an offer that is passive itself leaves nobody to start DTLS.
    if (out->setup == "passive") return Fail(why, "The offer's DTLS role is passive, as ours.");

    bool video = false, audio = false;
    const char* video_problem = "The offer has no video in H.264 with packetization-mode=1.";
    out->rtcp_mux = true;
    for (size_t i = 0; i < out->media.size(); ++i) {
        WebRtcOffer::Media& m = out->media[i];
        if (m.payload_type < 0 || usable[i].port_zero) continue;
        bool* taken = m.kind == "video" ? &video : &audio;
        if (*taken) continue;
        if (!Receives(m)) {
            if (m.kind == "video") {
                video_problem =
                    "The offer's H.264 video does not receive (neither recvonly nor sendrecv).";
            }
            continue;
        }
        // The mid names the section in the BUNDLE group and in every RTP packet (RFC 8843).
        if (m.mid.empty() || m.mid.find_first_of(" \t") != std::string::npos) {
            if (m.kind == "video") video_problem = "The offer's H.264 video has no usable a=mid.";
            continue;
        }
        m.accepted = *taken = true;
        out->rtcp_mux = out->rtcp_mux && usable[i].rtcp_mux;
    }
    if (!video) return Fail(why, video_problem);
    // One port carries everything: RTCP must come with RTP (RFC 5761).
    if (!out->rtcp_mux)
        return Fail(why, "The offer does not multiplex RTCP with RTP (a=rtcp-mux).");
    return true;
}

std::string WriteWebRtcAnswer(const WebRtcOffer& offer, const WebRtcAnswerParams& p) {
    std::string s;
    s.reserve(1024 + 512 * offer.media.size());
    s += "v=0\r\no=- " + std::to_string(p.session_id) + " 1 IN IP4 0.0.0.0\r\ns=-\r\nt=0 0\r\n";
    s += "a=ice-lite\r\n";
    if (offer.bundle) {  // an answer may only keep a group that was offered (RFC 8843 §7.3)
        std::string bundle = "a=group:BUNDLE";
        for (const WebRtcOffer::Media& m : offer.media) {
            if (m.accepted) bundle += " " + m.mid;
        }
        s += bundle + "\r\n";
    }
    const std::string candidate = "a=candidate:1 1 udp 2130706431 " + p.address + " " +
                                  std::to_string(p.port) + " typ host\r\n";
    for (const WebRtcOffer::Media& m : offer.media) {
        if (!m.accepted) {
            // RFC 3264 §6: a refused stream keeps its line with port 0.
            s += "m=" + m.kind + " 0 " + m.protocol;
            if (!m.formats.empty()) s += " " + m.formats;
            s += "\r\nc=IN IP4 0.0.0.0\r\n";
            if (!m.mid.empty()) s += "a=mid:" + m.mid + "\r\n";
            s += "a=inactive\r\n";
            continue;
        }
        const bool video = m.kind == "video";
        const std::string pt = std::to_string(m.payload_type);
        const std::string rtx = std::to_string(m.rtx_payload_type);
        const uint32_t ssrc = video ? p.video_ssrc : p.audio_ssrc;
        s += "m=" + m.kind + " 9 " + m.protocol + " " + pt;
        if (video && m.rtx_payload_type >= 0) s += " " + rtx;
        s += "\r\nc=IN IP4 0.0.0.0\r\n";
        s += "a=ice-ufrag:" + p.ice_ufrag + "\r\na=ice-pwd:" + p.ice_pwd + "\r\n";
        s += "a=fingerprint:sha-256 " + p.fingerprint_sha256 + "\r\n";
        s += "a=setup:passive\r\n";
        s += "a=mid:" + m.mid + "\r\n";
        if (m.playout_delay_extension > 0) {
            s += "a=extmap:" + std::to_string(m.playout_delay_extension) + " " + kPlayoutDelayUri +
                 "\r\n";
        }
        if (m.mid_extension > 0) {
            s += "a=extmap:" + std::to_string(m.mid_extension) + " " + kMidUri + "\r\n";
        }
        s += "a=sendonly\r\n";
        s += "a=msid:" + p.stream_id + " " + m.kind + "\r\n";
        s += "a=rtcp-mux\r\n";
        if (m.rtcp_rsize) s += "a=rtcp-rsize\r\n";
        if (video) {
            s += "a=rtpmap:" + pt + " H264/90000\r\n";
        } else {
            s += "a=rtpmap:" + pt + " opus/48000/2\r\n";
        }
        if (m.nack) s += "a=rtcp-fb:" + pt + " nack\r\n";
        if (m.pli) s += "a=rtcp-fb:" + pt + " nack pli\r\n";
        if (m.fir) s += "a=rtcp-fb:" + pt + " ccm fir\r\n";
        if (video) {
            s += "a=fmtp:" + pt +
                 " level-asymmetry-allowed=1;packetization-mode=1;profile-level-id=" +
                 p.h264_profile_level_id + "\r\n";
        } else {
            // The stream's sound is stereo; a browser decodes Opus as mono unless told.
            s += "a=fmtp:" + pt + " minptime=10;stereo=1;sprop-stereo=1\r\n";
        }
        const bool with_rtx = video && m.rtx_payload_type >= 0;
        if (with_rtx)
            s += "a=rtpmap:" + rtx + " rtx/90000\r\na=fmtp:" + rtx + " apt=" + pt + "\r\n";
        if (with_rtx && p.rtx_ssrc != 0) {
            s += "a=ssrc-group:FID " + std::to_string(ssrc) + " " + std::to_string(p.rtx_ssrc) +
                 "\r\n";
        }
        s += "a=ssrc:" + std::to_string(ssrc) + " cname:" + p.cname + "\r\n";
        if (with_rtx && p.rtx_ssrc != 0) {
            s += "a=ssrc:" + std::to_string(p.rtx_ssrc) + " cname:" + p.cname + "\r\n";
        }
        s += candidate + "a=end-of-candidates\r\n";
    }
    return s;
}

}  // namespace webrtc
