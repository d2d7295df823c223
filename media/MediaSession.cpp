#include "media/MediaSession.h"

MediaSession::MediaSession(const char* name) : m_name(name != nullptr ? name : "") {}

MediaStream* MediaSession::FindMediaStream(const char* name) {
    if (name == nullptr) return nullptr;
    for (const auto& s : m_streams) {
        if (s->GetName() == name) return s.get();
    }
    return nullptr;
}

MediaStream* MediaSession::GetMediaStream(unsigned index) {
    return index < m_streams.size() ? m_streams[index].get() : nullptr;
}

int MediaSession::GetMediaStreamCount() { return static_cast<int>(m_streams.size()); }

bool MediaSession::AddMediaStream(std::unique_ptr<MediaStream> stream) {
    if (stream == nullptr) return false;
    if (FindMediaStream(stream->GetName().c_str()) != nullptr) return false;
    m_streams.push_back(std::move(stream));
    return true;
}

std::string MediaSession::GenerateMediaSdp(const char*, const char* address, int with_control) {
    // No "o=" and no bandwidth line: clients of this service have never needed them.
    std::string sdp = "v=0\r\n";
    sdp += "s=" + m_name + "\r\n";
    sdp += std::string("c=IN IP4 ") + (address != nullptr ? address : "") + "\r\n";
    sdp += "t=0 0\r\n";
    if (with_control != 0) sdp += "a=control:*\r\n";
    for (size_t i = 0; i < m_streams.size(); ++i) {
        sdp += m_streams[i]->GenerateMediaSdp(96 + static_cast<unsigned>(i), with_control);
    }
    return sdp;
}

std::string MediaSession::GetName() { return m_name; }
