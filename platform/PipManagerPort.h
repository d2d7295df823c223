#pragma once

#include <memory>

// Port to the vendor's picture-in-picture manager (Android: PipManager, PipManagerListener).
// Thread contract: Connect and the client's calls come from the service's threads; the
// listener is called back on a platform thread.

namespace platform {

// The vendor's event types delivered to PipManagerListener::eventCallback.
constexpr int kEvTravelingCallbackUnsupport = 1;
constexpr int kEvTravelingCallbackTvosFastQuit = 3;

class PipManagerListener {
public:
    virtual ~PipManagerListener() = default;
    virtual void notify(int msg, int ext1, int ext2) = 0;
    virtual void eventCallback(int event_type) = 0;
};

class PipManagerClient {
public:
    virtual ~PipManagerClient() = default;
    // 0 on success, the vendor's error code otherwise.
    virtual int setListener(std::shared_ptr<PipManagerListener> listener) = 0;
    virtual void disconnect() = 0;
};

class PipManagerPort {
public:
    virtual ~PipManagerPort() = default;
    // A connected client, or null when the manager cannot be reached.
    virtual std::shared_ptr<PipManagerClient> connect() = 0;
};

}  // namespace platform
