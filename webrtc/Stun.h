#pragma once

#include <cstddef>
#include <cstdint>
#include <string_view>

struct sockaddr;

// STUN as an ICE-lite server speaks it (RFC 5389, RFC 8445 §7.3, RFC 7675 consent checks): it
// reads the browser's Binding requests and answers each with a success response; it never
// sends a request of its own.
// Thread contract: pure functions, any thread.
namespace webrtc {

// RFC 7983 §7 demultiplexing of the one UDP port: a first byte of 0..3 is STUN (DTLS is 20..63,
// RTP and RTCP 128..191); then a whole header, the magic cookie, and a length that is a multiple
// of 4 and matches the datagram.
bool LooksLikeStun(const uint8_t* p, size_t n);

struct StunBindingRequest {
    uint8_t transaction[12];
    std::string_view username;  // "LOCALUFRAG:REMOTEUFRAG", points into the message
    bool use_candidate;
    bool has_integrity;
    bool has_fingerprint;
    uint32_t priority;
    bool ice_controlling;
    uint64_t tie_breaker;  // of ICE-CONTROLLING or ICE-CONTROLLED, 0 when neither came
};

enum class StunRead {
    kOk,
    kNotStun,            // LooksLikeStun is false
    kMalformed,          // an attribute overruns the message or has the wrong size for its type,
                         // FINGERPRINT is not last, or a comprehension-required type we do not
                         // know (RFC 5389 §7.3.1 would answer 420; a browser never sends one)
    kNotBindingRequest,  // another method or class (indications, responses)
    kBadFingerprint,     // FINGERPRINT present and its CRC does not match
};

// Fills `out` from a Binding request. MESSAGE-INTEGRITY is only located here; CheckStunIntegrity
// verifies it once the username has chosen the session (and so the password). Attributes after
// MESSAGE-INTEGRITY, other than FINGERPRINT, are ignored (RFC 5389 §15.4).
StunRead ReadStunBindingRequest(const uint8_t* p, size_t n, StunBindingRequest* out);

// The part of a USERNAME before the first ':' (the whole name when there is none): ours, since
// the browser sends "our ufrag:its ufrag" (RFC 8445 §7.2.2).
std::string_view LocalUfragOf(std::string_view username);

// Short-term credential check (RFC 5389 §10.1.2, §15.4): HMAC-SHA1 keyed with `password` over
// the message up to MESSAGE-INTEGRITY, the header's length counting through that attribute.
// False when the attribute is absent, malformed, or does not match (compared in constant time).
bool CheckStunIntegrity(const uint8_t* p, size_t n, std::string_view password);

// A Binding success response to `req`: XOR-MAPPED-ADDRESS of `from` (AF_INET or AF_INET6),
// MESSAGE-INTEGRITY keyed with our `password`, FINGERPRINT. Returns the bytes written (64 for
// IPv4, 76 for IPv6), 0 if `cap` is too small or the address family is neither.
size_t WriteStunBindingSuccess(const StunBindingRequest& req, const sockaddr* from,
                               std::string_view password, uint8_t* out, size_t cap);

}  // namespace webrtc
