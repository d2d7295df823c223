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

class NullBinder final : public BinderPort {
public:
    int initWithDriver(const char*) override { return -1; }
    const void* defaultServiceManager() override { return nullptr; }
    int addService(const char*, std::shared_ptr<BinderService>) override { return -1; }
    void startThreadPool() override {}
    int transact(const char*, uint32_t, const ParcelWriter&) override { return -1; }
};

class NullCamera final : public CameraPort {
public:
    std::shared_ptr<platform::Camera> connect(int, const std::string&, int, int) override {
        return nullptr;
    }
};

class NullRecorders final : public MediaRecorderPort {
public:
    std::shared_ptr<MediaRecorder> create(const std::string&) override { return nullptr; }
};

class NullTvManager final : public TvManagerPort {
public:
    std::shared_ptr<TvManagerClient> connect() override { return nullptr; }
};

class NullPxAudioOut final : public PxAudioOutPort {
public:
    int Init(unsigned short) override { return -1; }
    int GetHandle(int, int*) override { return -1; }
    int Open(int, int, int*) override { return -1; }
    int SetAttr(int, int, int*) override { return -1; }
    int Close(int) override { return -1; }
    int DeInit() override { return -1; }
};

class NullAudioRecords final : public AudioRecordPort {
public:
    std::shared_ptr<AudioRecord> create(const std::string&) override { return nullptr; }
    int getMinFrameCount(size_t*, unsigned, int, unsigned) override { return -1; }
    bool setFlingerParameters(int, const std::string&) override { return false; }
};

class NullAacLibrary final : public AacLibraryPort {
public:
    const char* name() override { return "none"; }
    void* open() override { return nullptr; }
    void* symbol(void*, const char*) override { return nullptr; }
    void close(void*) override {}
};

class NullPublish final : public PublishPort {
public:
    std::unique_ptr<PublishSession> Open(const PublishTarget&, std::string* error) override {
        if (error != nullptr) *error = "publishing is not available on this platform";
        return nullptr;
    }
};

NullLog g_null_log;
NullProperties g_null_properties;
NullPipManager g_null_pip;
NullAudioManager g_null_audio;
NullBinder g_null_binder;
NullCamera g_null_camera;
NullRecorders g_null_recorders;
NullTvManager g_null_tv;
NullPxAudioOut g_null_px;
NullAudioRecords g_null_records;
NullAacLibrary g_null_aac;
NullPublish g_null_publish;

std::atomic<LogPort*> g_log{&g_null_log};
std::atomic<PropertyPort*> g_properties{&g_null_properties};
std::atomic<PipManagerPort*> g_pip{&g_null_pip};
std::atomic<AudioManagerPort*> g_audio{&g_null_audio};
std::atomic<BinderPort*> g_binder{&g_null_binder};
std::atomic<CameraPort*> g_camera{&g_null_camera};
std::atomic<MediaRecorderPort*> g_recorders{&g_null_recorders};
std::atomic<TvManagerPort*> g_tv{&g_null_tv};
std::atomic<PxAudioOutPort*> g_px{&g_null_px};
std::atomic<AudioRecordPort*> g_records{&g_null_records};
std::atomic<AacLibraryPort*> g_aac{&g_null_aac};
std::atomic<PublishPort*> g_publish{&g_null_publish};

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
    Set<BinderPort>(g_binder, ports.binder, g_null_binder);
    Set<CameraPort>(g_camera, ports.camera, g_null_camera);
    Set<MediaRecorderPort>(g_recorders, ports.media_recorder, g_null_recorders);
    Set<TvManagerPort>(g_tv, ports.tv_manager, g_null_tv);
    Set<PxAudioOutPort>(g_px, ports.px_audio_out, g_null_px);
    Set<AudioRecordPort>(g_records, ports.audio_record, g_null_records);
    Set<AacLibraryPort>(g_aac, ports.aac_library, g_null_aac);
    Set<PublishPort>(g_publish, ports.publish, g_null_publish);
}

Ports Installed() {
    Ports p;
    p.log = g_log.load(std::memory_order_acquire);
    p.properties = g_properties.load(std::memory_order_acquire);
    p.pip_manager = g_pip.load(std::memory_order_acquire);
    p.audio_manager = g_audio.load(std::memory_order_acquire);
    p.binder = g_binder.load(std::memory_order_acquire);
    p.camera = g_camera.load(std::memory_order_acquire);
    p.media_recorder = g_recorders.load(std::memory_order_acquire);
    p.tv_manager = g_tv.load(std::memory_order_acquire);
    p.px_audio_out = g_px.load(std::memory_order_acquire);
    p.audio_record = g_records.load(std::memory_order_acquire);
    p.aac_library = g_aac.load(std::memory_order_acquire);
    p.publish = g_publish.load(std::memory_order_acquire);
    return p;
}

LogPort& Log() { return *g_log.load(std::memory_order_acquire); }
PropertyPort& Properties() { return *g_properties.load(std::memory_order_acquire); }
PipManagerPort& PipManager() { return *g_pip.load(std::memory_order_acquire); }
AudioManagerPort& AudioManager() { return *g_audio.load(std::memory_order_acquire); }
BinderPort& Binder() { return *g_binder.load(std::memory_order_acquire); }
CameraPort& Cameras() { return *g_camera.load(std::memory_order_acquire); }
MediaRecorderPort& MediaRecorders() { return *g_recorders.load(std::memory_order_acquire); }
TvManagerPort& TvManager() { return *g_tv.load(std::memory_order_acquire); }
PxAudioOutPort& PxAudioOut() { return *g_px.load(std::memory_order_acquire); }
AudioRecordPort& AudioRecords() { return *g_records.load(std::memory_order_acquire); }
AacLibraryPort& AacLibrary() { return *g_aac.load(std::memory_order_acquire); }
PublishPort& Publish() { return *g_publish.load(std::memory_order_acquire); }

}  // namespace platform
