#include "media/MediaSessionList.h"

MediaSessionList::~MediaSessionList() {
    TLock::Scoped hold(m_lock);
    m_sessions.clear();
}

bool MediaSessionList::AddMediaSession(std::unique_ptr<MediaSession> session) {
    if (session == nullptr) return false;
    std::string name = session->GetName();
    TLock::Scoped hold(m_lock);
    for (const auto& s : m_sessions) {
        if (s->GetName() == name) return false;
    }
    m_sessions.push_back(std::move(session));
    return true;
}

bool MediaSessionList::RemoveMediaSession(const char* name) {
    if (name == nullptr) return false;
    TLock::Scoped hold(m_lock);
    for (auto it = m_sessions.begin(); it != m_sessions.end(); ++it) {
        if ((*it)->GetName() == name) {
            m_sessions.erase(it);
            return true;
        }
    }
    return false;
}

MediaSession* MediaSessionList::FindMediaSession(const char* name) {
    if (name == nullptr) return nullptr;
    TLock::Scoped hold(m_lock);
    for (const auto& s : m_sessions) {
        if (s->GetName() == name) return s.get();
    }
    return nullptr;
}
