#pragma once

#include <sys/socket.h>

#include <functional>
#include <string>

// Playback by WebRTC beside the fMP4 stream, offered on the web viewer's HTTP server by WHEP:
// the viewer POSTs its SDP offer to /whep and gets the answer and a session address; DELETE on
// that address ends the session. The web viewer judges who may watch and counts the session
// among its viewers; the endpoint does the rest.
// Thread contract: any thread (the HTTP server's connection threads).
class WhepEndpoint {
public:
    virtual ~WhepEndpoint() = default;

    struct Reply {
        unsigned status = 500;
        std::string body;      // the SDP answer (201), or one sentence why not
        std::string location;  // 201: where the session is, for DELETE
    };
    struct OfferRequest {
        std::string sdp;
        std::string query;          // the page's query: the capture choice, as for the stream
        const sockaddr* local;      // where the viewer reached the server (the candidate's address)
        std::string peer;           // the viewer's address, for the log
        std::function<void()> end;  // called once when a session answered 201 ends
    };
    virtual Reply Offer(OfferRequest request) = 0;
    // False when no such session is open.
    virtual bool End(const std::string& id) = 0;
};
