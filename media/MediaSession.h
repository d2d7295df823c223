#pragma once

#include <memory>
#include <string>
#include <vector>

#include "media/MediaStream.h"

// One served presentation: a name and its tracks, in order (the track index decides the SDP
// payload type, 96 + index).
// Thread contract: tracks are added once at start-up; afterwards read-only from any thread.
class MediaSession {
public:
    explicit MediaSession(const char* name);
    virtual ~MediaSession() = default;
    MediaSession(const MediaSession&) = delete;
    MediaSession& operator=(const MediaSession&) = delete;

    // Exact name match, first wins; null for a null name or none.
    virtual MediaStream* FindMediaStream(const char* name);
    virtual MediaStream* GetMediaStream(unsigned index);
    virtual int GetMediaStreamCount();
    // False for null or a name already present (the refused track is destroyed).
    virtual bool AddMediaStream(std::unique_ptr<MediaStream> stream);
    // The session description; `origin` is accepted and not emitted.
    virtual std::string GenerateMediaSdp(const char* origin, const char* address, int with_control);
    virtual std::string GetName();

private:
    std::string m_name;
    std::vector<std::unique_ptr<MediaStream>> m_streams;
};
