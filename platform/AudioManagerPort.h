#pragma once

#include <memory>

// Port to the vendor's audio manager client (Android: AudioManager).
// Thread contract: called from the service's threads, one call at a time per client.

namespace platform {

class AudioManagerClient {
public:
    virtual ~AudioManagerClient() = default;
    // Selects whose sound the capture path carries: source 0 main picture, 1 sub window.
    virtual int setAudioCaptureSource(int path, int source) = 0;
    virtual void disconnect() = 0;
};

class AudioManagerPort {
public:
    virtual ~AudioManagerPort() = default;
    // A connected client, or null when the manager cannot be reached.
    virtual std::shared_ptr<AudioManagerClient> connect() = 0;
};

}  // namespace platform
