#include "platform/host/HostManagers.h"

#include <cstdio>

#include "platform/Ports.h"
#include "sync/thread_mutex.h"

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

class HostTvClient final : public TvManagerClient {
public:
    // HDMI 1: what a television shows most of the time.
    int getCurrentMainInputSource() override {
        Note("TvManager::getCurrentMainInputSource");
        return 23;
    }
    void disconnect() override { Note("TvManager::disconnect"); }
};

}  // namespace

std::shared_ptr<TvManagerClient> HostTvManager::connect() {
    Note("TvManager::connect");
    return std::make_shared<HostTvClient>();
}

int HostPxAudioOut::Init(unsigned short first_field) {
    Note("PX_AOUT_Init(%d)", first_field);
    return 0;
}
int HostPxAudioOut::GetHandle(int path, int* handle) {
    Note("PX_AOUT_GetHandle(%d)", path);
    if (handle != nullptr) *handle = path;
    return 0;
}
int HostPxAudioOut::Open(int path, int param, int* handle) {
    Note("PX_AOUT_Open(%d, %d)", path, param);
    if (handle != nullptr) *handle = path;
    return 0;
}
int HostPxAudioOut::SetAttr(int handle, int attr, int* value) {
    Note("PX_AOUT_SetAttr(%d, %d)", handle, attr);
    (void)value;
    return 0;
}
int HostPxAudioOut::Close(int handle) {
    Note("PX_AOUT_Close(%d)", handle);
    return 0;
}
int HostPxAudioOut::DeInit() {
    Note("PX_AOUT_DeInit");
    return 0;
}

class HostPipClient final : public PipManagerClient {
public:
    explicit HostPipClient(HostPipManager& owner) : owner_(owner) {}
    int setListener(std::shared_ptr<PipManagerListener> listener) override {
        Note("PipManager::setListener");
        thread_mutex::Scoped hold(owner_.mutex_);
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
    thread_mutex::Scoped hold(mutex_);
    return listener_;
}

std::shared_ptr<AudioManagerClient> HostAudioManager::connect() {
    Note("AudioManager::connect");
    return std::make_shared<HostAudioClient>();
}

}  // namespace host
}  // namespace platform
