#pragma once

#include <memory>
#include <vector>

#include "media/MediaSession.h"
#include "sync/TLock.h"

// The served presentations by name. Owns them.
// Thread contract: every operation may be called from any thread (one lock).
class MediaSessionList {
public:
    MediaSessionList() = default;
    virtual ~MediaSessionList();
    MediaSessionList(const MediaSessionList&) = delete;
    MediaSessionList& operator=(const MediaSessionList&) = delete;

    // False for null or a name already listed (the refused presentation is destroyed).
    virtual bool AddMediaSession(std::unique_ptr<MediaSession> session);
    virtual bool RemoveMediaSession(const char* name);
    // Exact name (same length too), or null.
    virtual MediaSession* FindMediaSession(const char* name);

private:
    std::vector<std::unique_ptr<MediaSession>> m_sessions ORVEX_GUARDED_BY(m_lock);
    TLock m_lock;
};
