#pragma once

#include <atomic>

#include <map>
#include <memory>
#include <string>

#include "platform/AudioPorts.h"
#include "platform/BinderPort.h"
#include "platform/CapturePorts.h"
#include "platform/fake/CallJournal.h"
#include "sync/thread_mutex.h"

namespace platform {
namespace fake {

// Results the capture fakes give, by call name ("Camera::connect", "MediaRecorder::prepare",
// "PX_AOUT_Init", ...): 0 (or success) unless a test sets another. A failing connect/create
// gives null. Thread contract: any thread.
class FakeResults {
public:
    void Set(const std::string& call, int result);
    int Get(const std::string& call);
    void Clear();

private:
    thread_mutex mutex_;
    std::map<std::string, int> results_ ORVEX_GUARDED_BY(mutex_);
};

// Camera, recorder, TV manager and PX audio output that record every call with its arguments.
class FakeCameraPort final : public CameraPort {
public:
    FakeCameraPort(CallJournal& journal, FakeResults& results)
        : journal_(journal), results_(results) {}
    std::shared_ptr<Camera> connect(int camera_id, const std::string& package, int uid,
                                    int pid) override;
    // What getParameters gives before any setParameters.
    void set_initial_parameters(const std::string& p) { initial_ = p; }

private:
    CallJournal& journal_;
    FakeResults& results_;
    std::string initial_ = "preview-size=1920x1080";
};

class FakeMediaRecorderPort final : public MediaRecorderPort {
public:
    FakeMediaRecorderPort(CallJournal& journal, FakeResults& results)
        : journal_(journal), results_(results) {}
    std::shared_ptr<MediaRecorder> create(const std::string& package) override;
    // Counted, not journaled: the call sequences the tests compare stay those of the television.
    bool RequestKeyFrame() override {
        key_frame_requests.fetch_add(1);
        return true;
    }
    std::atomic<int> key_frame_requests{0};

private:
    CallJournal& journal_;
    FakeResults& results_;
};

class FakeTvManager final : public TvManagerPort {
public:
    FakeTvManager(CallJournal& journal, FakeResults& results)
        : journal_(journal), results_(results) {}
    std::shared_ptr<TvManagerClient> connect() override;

private:
    CallJournal& journal_;
    FakeResults& results_;
};

class FakePxAudioOut final : public PxAudioOutPort {
public:
    FakePxAudioOut(CallJournal& journal, FakeResults& results)
        : journal_(journal), results_(results) {}
    int Init(unsigned short first_field) override;
    int GetHandle(int path, int* handle) override;
    int Open(int path, int param, int* handle) override;
    int SetAttr(int handle, int attr, int* value) override;
    int Close(int handle) override;
    int DeInit() override;

private:
    int Call(const std::string& text, const std::string& name);
    CallJournal& journal_;
    FakeResults& results_;
};

// An audio record whose reads give silence at once (no pacing), and a library port that
// opens nothing unless a test names a real library.
class FakeAudioRecordPort final : public AudioRecordPort {
public:
    FakeAudioRecordPort(CallJournal& journal, FakeResults& results)
        : journal_(journal), results_(results) {}
    std::shared_ptr<AudioRecord> create(const std::string& package) override;
    int getMinFrameCount(size_t* frame_count, unsigned sample_rate, int format,
                         unsigned channel_mask) override;
    bool setFlingerParameters(int io, const std::string& key_values) override;

private:
    CallJournal& journal_;
    FakeResults& results_;
};

class FakeAacLibrary final : public AacLibraryPort {
public:
    explicit FakeAacLibrary(CallJournal& journal) : journal_(journal) {}
    const char* name() override { return library_.c_str(); }
    void* open() override;
    void* symbol(void* library, const char* symbol) override;
    void close(void* library) override;
    // A real library to load, "" for none; a symbol name to refuse.
    void set_library(const std::string& path) { library_ = path; }
    void refuse_symbol(const std::string& symbol) { refused_ = symbol; }

private:
    CallJournal& journal_;
    std::string library_;
    std::string refused_;
};

// A binder that records service registrations and client transactions.
class FakeBinder final : public BinderPort {
public:
    explicit FakeBinder(CallJournal& journal) : journal_(journal) {}
    int initWithDriver(const char* driver) override;
    const void* defaultServiceManager() override { return this; }
    int addService(const char* name, std::shared_ptr<BinderService> service) override;
    void startThreadPool() override;
    int transact(const char* service, uint32_t code, const ParcelWriter& data) override;
    // The service registered under `name`, to drive transactions into it.
    std::shared_ptr<BinderService> service(const std::string& name);

private:
    CallJournal& journal_;
    thread_mutex mutex_;
    std::map<std::string, std::shared_ptr<BinderService>> services_ ORVEX_GUARDED_BY(mutex_);
};

}  // namespace fake
}  // namespace platform
