#pragma once

#include <vector>

#include "media/MediaSession.h"
#include "media/TLock.h"

// The served presentations by name. Owns them.
// Thread contract: every operation may be called from any thread (one lock).
class MediaSessionList {
public:
    MediaSessionList() = default;
    virtual ~MediaSessionList();
    MediaSessionList(const MediaSessionList&) = delete;
    MediaSessionList& operator=(const MediaSessionList&) = delete;

    // Takes ownership; false for null or a name already listed.
    virtual bool AddMediaSession(MediaSession* session);
    virtual bool RemoveMediaSession(const char* name);
    // Exact name (same length too), or null.
    virtual MediaSession* FindMediaSession(const char* name);

private:
    std::vector<MediaSession*> m_sessions ORVEX_GUARDED_BY(m_lock);
    TLock m_lock;
};
