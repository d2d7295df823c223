#include "platform/host/HostManagers.h"

#include <cstdio>

#include "platform/Ports.h"

namespace platform {
namespace host {
namespace {

void Note(const char* fmt, int a = 0, int b = 0) {
    char text[128];
    snprintf(text, sizeof text, fmt, a, b);
    Log().Write(kLogIdSystem, kLogDebug, "orvex:::host", text);
}

class HostAudioClient final : public AudioManagerClient {
public:
    int setAudioCaptureSource(int path, int source) override {
        Note("AudioManager::setAudioCaptureSource(%d, %d)", path, source);
        return 0;
    }
    void disconnect() override { Note("AudioManager::disconnect"); }
};

}  // namespace

class HostPipClient final : public PipManagerClient {
public:
    explicit HostPipClient(HostPipManager& owner) : owner_(owner) {}
    int setListener(std::shared_ptr<PipManagerListener> listener) override {
        Note("PipManager::setListener");
        std::lock_guard<std::mutex> hold(owner_.mutex_);
        owner_.listener_ = std::move(listener);
        return 0;
    }
    void disconnect() override { Note("PipManager::disconnect"); }

private:
    HostPipManager& owner_;
};

std::shared_ptr<PipManagerClient> HostPipManager::connect() {
    Note("PipManager::connect");
    return std::make_shared<HostPipClient>(*this);
}

std::shared_ptr<PipManagerListener> HostPipManager::listener() {
    std::lock_guard<std::mutex> hold(mutex_);
    return listener_;
}

std::shared_ptr<AudioManagerClient> HostAudioManager::connect() {
    Note("AudioManager::connect");
    return std::make_shared<HostAudioClient>();
}

}  // namespace host
}  // namespace platform
