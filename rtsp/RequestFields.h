#pragma once

#include <optional>
#include <string>
#include <string_view>
#include <vector>

// Readers of the fields of one RTSP request: pure functions over its bytes, lenient and
// substring-based by design (the order of the searches decides ambiguous requests and is part
// of the behaviour). RtspResponse reads a request off its connection and asks these.
// Thread contract: none needed; no state.

// The leading integer of `text` as atoi reads it (blanks, a sign, digits, stop at anything
// else; no digits read as 0), or nothing when its digits leave the range of int.
std::optional<int> LeadingInt(std::string_view text);

// The method code (RtspMethod) of a request line: the first of OPTIONS, DESCRIBE, SETUP,
// TEARDOWN, PLAY, PAUSE, GET_PARAMETER found anywhere in it, in that order; 0 for none.
int RequestMethodOf(std::string_view request_line);

// The value of the first line containing `key` (case-insensitive), after the key, any ':' and
// blanks (a value of only blanks is kept as it is); nothing when no line contains the key.
std::optional<std::string> HeaderValueOf(const std::vector<std::string>& lines,
                                         std::string_view key);

// CSeq as a number; 0 when absent, not a number or out of range.
unsigned CSeqOf(std::string_view value);

// The URL of a request line: from "rtsp:/" (any case) to "RTSP/1.0", trailing blanks cut.
std::optional<std::string> MrlOf(std::string_view request_line);

// The URL less "rtsp:/", one more '/' and the host through the next '/'; nothing when no '/'
// follows the host.
std::optional<std::string> UrlAfterHostOf(std::string_view url);

// The presentation name: the first path element, unless "trackID=" appears anywhere after
// the host (looked for before the cut, so ".../skyvo.N/trackID=1" yields no name).
std::optional<std::string> SessionNameOf(std::string_view url);

// The stream part: what follows the first '/' after the presentation name, or the whole path
// when it has no '/' but names a track.
std::optional<std::string> StreamNameOf(std::string_view url);

// "trackID=N" in a stream part: N - 1, the track's index. Nothing when the stream part names no
// track; -1 when N is not a track number (below 1 or out of range).
std::optional<int> TrackIndexOf(std::string_view stream);

// The two numbers after `word` ("client_port=" or "interleaved=") in a Transport value, up to
// the next ';' ("8000-8001"; a single number is both). Out-of-range numbers read as 0.
struct PortPair {
    int first = 0;
    int second = 0;
};
std::optional<PortPair> PortPairOf(std::string_view transport, std::string_view word);
