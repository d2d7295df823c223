#include "platform/android/AndroidManagers.h"

#include <utility>

#include "platform/android/vendor/orvex_vendor.h"

namespace platform {
namespace android_port {
namespace {

// Forwards the vendor's callbacks to the service's listener.
class ListenerBridge final : public android::PipManagerListener {
public:
    explicit ListenerBridge(std::shared_ptr<platform::PipManagerListener> listener)
        : listener_(std::move(listener)) {}

    void notify(int msg, int ext1, int ext2) override { listener_->notify(msg, ext1, ext2); }
    void eventCallback(int eventType) override { listener_->eventCallback(eventType); }

private:
    std::shared_ptr<platform::PipManagerListener> listener_;
};

class PipClient final : public PipManagerClient {
public:
    explicit PipClient(android::sp<android::PipManager> manager) : manager_(std::move(manager)) {}

    int setListener(std::shared_ptr<platform::PipManagerListener> listener) override {
        // The bridge is kept here as well: the manager may hold it only weakly.
        bridge_ = listener != nullptr ? new ListenerBridge(std::move(listener)) : nullptr;
        return manager_->setListener(bridge_);
    }
    void disconnect() override { manager_->disconnect(); }

private:
    android::sp<android::PipManager> manager_;
    android::sp<android::PipManagerListener> bridge_;
};

class AudioClient final : public AudioManagerClient {
public:
    explicit AudioClient(android::sp<android::AudioManager> manager)
        : manager_(std::move(manager)) {}

    int setAudioCaptureSource(int path, int source) override {
        return manager_->setAudioCaptureSource(path, source);
    }
    void disconnect() override { manager_->disconnect(); }

private:
    android::sp<android::AudioManager> manager_;
};

class TvClient final : public TvManagerClient {
public:
    explicit TvClient(android::sp<android::TvManager> manager) : manager_(std::move(manager)) {}

    int getCurrentMainInputSource() override { return manager_->getCurrentMainInputSource(); }
    void disconnect() override { manager_->disconnect(); }

private:
    android::sp<android::TvManager> manager_;
};

}  // namespace

std::shared_ptr<PipManagerClient> AndroidPipManager::connect() {
    android::sp<android::PipManager> manager = android::PipManager::connect();
    if (manager == nullptr) {
        return nullptr;
    }
    return std::make_shared<PipClient>(std::move(manager));
}

std::shared_ptr<AudioManagerClient> AndroidAudioManager::connect() {
    android::sp<android::AudioManager> manager = android::AudioManager::connect();
    if (manager == nullptr) {
        return nullptr;
    }
    return std::make_shared<AudioClient>(std::move(manager));
}

std::shared_ptr<TvManagerClient> AndroidTvManager::connect() {
    android::sp<android::TvManager> manager = android::TvManager::connect();
    if (manager == nullptr) {
        return nullptr;
    }
    return std::make_shared<TvClient>(std::move(manager));
}

}  // namespace android_port
}  // namespace platform
