#pragma once

#include <string>
#include <vector>

// The media servers of kv.orvex.publish: space-separated URLs, each rtmp://host[:port]/app/key
// (FLV) or srt://host:port[?options] (MPEG-TS).
// Thread contract: pure functions, any thread.

struct PublishUrl {
    std::string url;        // as given
    std::string scheme;     // "rtmp" or "srt", lower case
    std::string host;       // name or address, IPv6 without its brackets
    int port = 0;           // 0: the scheme's default (RTMP 1935)
    std::string container;  // "flv" or "mpegts"
};

// The property's words; runs of blanks separate them.
std::vector<std::string> SplitPublishList(const std::string& value);

// False with `*why` (for the log) when `text` is no URL to publish to.
bool ParsePublishUrl(const std::string& text, PublishUrl* out, std::string* why);
