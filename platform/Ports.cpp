#include "platform/Ports.h"

#include <atomic>
#include <cstring>

namespace platform {
namespace {

class NullLog final : public LogPort {
public:
    void Write(int, int, const char*, const char*) override {}
};

class NullProperties final : public PropertyPort {
public:
    int Get(const char*, char* value, const char* default_value) override {
        const char* text = default_value != nullptr ? default_value : "";
        size_t n = strnlen(text, kPropertyValueMax - 1);
        memcpy(value, text, n);
        value[n] = '\0';
        return static_cast<int>(n);
    }
};

class NullPipManager final : public PipManagerPort {
public:
    std::shared_ptr<PipManagerClient> connect() override { return nullptr; }
};

class NullAudioManager final : public AudioManagerPort {
public:
    std::shared_ptr<AudioManagerClient> connect() override { return nullptr; }
};

NullLog g_null_log;
NullProperties g_null_properties;
NullPipManager g_null_pip;
NullAudioManager g_null_audio;

std::atomic<LogPort*> g_log{&g_null_log};
std::atomic<PropertyPort*> g_properties{&g_null_properties};
std::atomic<PipManagerPort*> g_pip{&g_null_pip};
std::atomic<AudioManagerPort*> g_audio{&g_null_audio};

template <typename T, typename Null>
void Set(std::atomic<T*>& slot, T* port, Null& fallback) {
    slot.store(port != nullptr ? port : &fallback, std::memory_order_release);
}

}  // namespace

void Install(const Ports& ports) {
    Set<LogPort>(g_log, ports.log, g_null_log);
    Set<PropertyPort>(g_properties, ports.properties, g_null_properties);
    Set<PipManagerPort>(g_pip, ports.pip_manager, g_null_pip);
    Set<AudioManagerPort>(g_audio, ports.audio_manager, g_null_audio);
}

Ports Installed() {
    Ports p;
    p.log = g_log.load(std::memory_order_acquire);
    p.properties = g_properties.load(std::memory_order_acquire);
    p.pip_manager = g_pip.load(std::memory_order_acquire);
    p.audio_manager = g_audio.load(std::memory_order_acquire);
    return p;
}

LogPort& Log() { return *g_log.load(std::memory_order_acquire); }
PropertyPort& Properties() { return *g_properties.load(std::memory_order_acquire); }
PipManagerPort& PipManager() { return *g_pip.load(std::memory_order_acquire); }
AudioManagerPort& AudioManager() { return *g_audio.load(std::memory_order_acquire); }

}  // namespace platform
