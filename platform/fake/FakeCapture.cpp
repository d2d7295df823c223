#include "platform/fake/FakeCapture.h"

#include <dlfcn.h>

#include <cstring>

#include "sync/thread_mutex.h"

namespace platform {
namespace fake {
namespace {

std::string Args(std::initializer_list<int> values) {
    std::string out = "(";
    for (int v : values) {
        if (out.size() > 1) out += ", ";
        out += std::to_string(v);
    }
    return out + ")";
}

class FakeCamera final : public Camera {
public:
    FakeCamera(CallJournal& j, FakeResults& r, std::string params)
        : journal_(j), results_(r), params_(std::move(params)) {}
    std::string getParameters() override {
        journal_.Add("Camera::getParameters");
        return params_;
    }
    int setParameters(const std::string& flattened) override {
        journal_.Add("Camera::setParameters(" + flattened + ")");
        params_ = flattened;
        return results_.Get("Camera::setParameters");
    }
    int unlock() override {
        journal_.Add("Camera::unlock");
        return 0;
    }
    int lock() override {
        journal_.Add("Camera::lock");
        return 0;
    }

private:
    CallJournal& journal_;
    FakeResults& results_;
    std::string params_;
};

class FakeRecorder final : public MediaRecorder {
public:
    FakeRecorder(CallJournal& j, FakeResults& r) : journal_(j), results_(r) {}
    int setCamera(Camera&) override { return Call("setCamera", ""); }
    int setVideoSource(int s) override { return Call("setVideoSource", Args({s})); }
    int setOutputFormat(int f) override { return Call("setOutputFormat", Args({f})); }
    int setVideoEncoder(int e) override { return Call("setVideoEncoder", Args({e})); }
    int setVideoSize(int w, int h) override { return Call("setVideoSize", Args({w, h})); }
    int setVideoFrameRate(int fps) override { return Call("setVideoFrameRate", Args({fps})); }
    int setParameters(const std::string& p) override {
        return Call("setParameters", "(" + p + ")");
    }
    int prepare() override { return Call("prepare", ""); }
    int start() override { return Call("start", ""); }
    int stop() override { return Call("stop", ""); }
    int release() override { return Call("release", ""); }

private:
    int Call(const std::string& name, const std::string& args) {
        journal_.Add("MediaRecorder::" + name + args);
        return results_.Get("MediaRecorder::" + name);
    }
    CallJournal& journal_;
    FakeResults& results_;
};

class FakeTvClient final : public TvManagerClient {
public:
    FakeTvClient(CallJournal& j, int source) : journal_(j), source_(source) {}
    int getCurrentMainInputSource() override {
        journal_.Add("TvManager::getCurrentMainInputSource");
        return source_;
    }
    void disconnect() override { journal_.Add("TvManager::disconnect"); }

private:
    CallJournal& journal_;
    int source_;
};

// Silence, as fast as it is asked for.
class FakeAudioRecord final : public AudioRecord {
public:
    FakeAudioRecord(CallJournal& j, FakeResults& r) : journal_(j), results_(r) {}
    int set(int source, unsigned rate, int format, unsigned mask, size_t frames) override {
        journal_.Add("AudioRecord::set" + Args({source, static_cast<int>(rate), format,
                                                static_cast<int>(mask), static_cast<int>(frames)}));
        return results_.Get("AudioRecord::set");
    }
    int start() override {
        journal_.Add("AudioRecord::start");
        return results_.Get("AudioRecord::start");
    }
    void stop() override { journal_.Add("AudioRecord::stop"); }
    long read(void* buffer, size_t size) override {
        int r = results_.Get("AudioRecord::read");
        if (r != 0) return r;
        memset(buffer, 0, size);
        return static_cast<long>(size);
    }

private:
    CallJournal& journal_;
    FakeResults& results_;
};

}  // namespace

void FakeResults::Set(const std::string& call, int result) {
    thread_mutex::Scoped hold(mutex_);
    results_[call] = result;
}

int FakeResults::Get(const std::string& call) {
    thread_mutex::Scoped hold(mutex_);
    auto it = results_.find(call);
    return it == results_.end() ? 0 : it->second;
}

void FakeResults::Clear() {
    thread_mutex::Scoped hold(mutex_);
    results_.clear();
}

std::shared_ptr<Camera> FakeCameraPort::connect(int camera_id, const std::string& package, int uid,
                                                int pid) {
    journal_.Add("Camera::connect(" + std::to_string(camera_id) + ", \"" + package + "\", " +
                 std::to_string(uid) + ", " + std::to_string(pid) + ")");
    if (results_.Get("Camera::connect") != 0) return nullptr;
    return std::make_shared<FakeCamera>(journal_, results_, initial_);
}

std::shared_ptr<MediaRecorder> FakeMediaRecorderPort::create(const std::string& package) {
    journal_.Add("MediaRecorder(" + package + ")");
    if (results_.Get("MediaRecorder") != 0) return nullptr;
    return std::make_shared<FakeRecorder>(journal_, results_);
}

std::shared_ptr<TvManagerClient> FakeTvManager::connect() {
    journal_.Add("TvManager::connect");
    if (results_.Get("TvManager::connect") != 0) return nullptr;
    return std::make_shared<FakeTvClient>(journal_, results_.Get("TvManager::mainInputSource"));
}

int FakePxAudioOut::Call(const std::string& text, const std::string& name) {
    journal_.Add(text);
    return results_.Get(name);
}

int FakePxAudioOut::Init(unsigned short first) {
    return Call("PX_AOUT_Init" + Args({first}), "PX_AOUT_Init");
}
int FakePxAudioOut::GetHandle(int path, int* handle) {
    int r = Call("PX_AOUT_GetHandle" + Args({path}), "PX_AOUT_GetHandle");
    if (handle != nullptr) *handle = r == 0 ? results_.Get("PX_AOUT_handle") : -1;
    return r;
}
int FakePxAudioOut::Open(int path, int param, int* handle) {
    int r = Call("PX_AOUT_Open" + Args({path, param}), "PX_AOUT_Open");
    if (handle != nullptr && r == 0) *handle = 40 + path;
    return r;
}
int FakePxAudioOut::SetAttr(int handle, int attr, int* value) {
    return Call("PX_AOUT_SetAttr" + Args({handle, attr, value != nullptr ? *value : -999}),
                "PX_AOUT_SetAttr");
}
int FakePxAudioOut::Close(int handle) {
    return Call("PX_AOUT_Close" + Args({handle}), "PX_AOUT_Close");
}
int FakePxAudioOut::DeInit() { return Call("PX_AOUT_DeInit", "PX_AOUT_DeInit"); }

std::shared_ptr<AudioRecord> FakeAudioRecordPort::create(const std::string& package) {
    journal_.Add("AudioRecord(" + package + ")");
    return std::make_shared<FakeAudioRecord>(journal_, results_);
}

int FakeAudioRecordPort::getMinFrameCount(size_t* frame_count, unsigned, int, unsigned) {
    int r = results_.Get("AudioRecord::getMinFrameCount");
    if (r == 0 && frame_count != nullptr) *frame_count = 960;
    return r;
}

bool FakeAudioRecordPort::setFlingerParameters(int io, const std::string& key_values) {
    journal_.Add("AudioFlinger::setParameters(" + std::to_string(io) + ", " + key_values + ")");
    return results_.Get("AudioFlinger") == 0;
}

void* FakeAacLibrary::open() {
    journal_.Add("dlopen(" + library_ + ")");
    return library_.empty() ? nullptr : dlopen(library_.c_str(), RTLD_NOW);
}

void* FakeAacLibrary::symbol(void* library, const char* symbol) {
    if (symbol != nullptr && refused_ == symbol) return nullptr;
    return dlsym(library, symbol);
}

void FakeAacLibrary::close(void* library) {
    journal_.Add("dlclose");
    if (library != nullptr) dlclose(library);
}

int FakeBinder::initWithDriver(const char* driver) {
    journal_.Add(std::string("ProcessState::initWithDriver(") + driver + ")");
    return 0;
}

int FakeBinder::addService(const char* name, std::shared_ptr<BinderService> service) {
    journal_.Add(std::string("addService(") + name + ")");
    thread_mutex::Scoped hold(mutex_);
    services_[name] = std::move(service);
    return 0;
}

void FakeBinder::startThreadPool() { journal_.Add("startThreadPool"); }

int FakeBinder::transact(const char* service, uint32_t code, const ParcelWriter& data) {
    std::shared_ptr<BinderService> s = this->service(service);
    if (!s) return -32;
    ParcelReader reader(data.data().data(), data.data().size());
    return s->onTransact(code, reader, 0);
}

std::shared_ptr<BinderService> FakeBinder::service(const std::string& name) {
    thread_mutex::Scoped hold(mutex_);
    auto it = services_.find(name);
    return it == services_.end() ? nullptr : it->second;
}

}  // namespace fake
}  // namespace platform
