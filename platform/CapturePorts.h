#pragma once

#include <memory>
#include <string>

// Ports to the platform's video capture path (Android: Camera, MediaRecorder, the vendor's
// TvManager and the PX audio-output library). The television exposes its picture as a camera;
// the media recorder encodes it as H.264 and hands every frame to the service "orvex.rtp".
// Thread contract: called from the thread that runs capture start and stop.

namespace platform {

// The vendor's camera keys for traveling (TV picture) capture. They must match the
// vendor SDK's CameraParameters names.
constexpr const char* kKeyTravelingRes = "traveling-res";
constexpr const char* kKeyTravelingMode = "traveling-mode";
constexpr const char* kKeyTravelingFramerate = "traveling-framerate";
constexpr const char* kKeyTravelingMagicKey = "traveling-magic-key";
constexpr const char* kKeyMainInputSource = "main-input-source";
constexpr const char* kKeySubInputSource = "sub-input-source";

class Camera {
public:
    virtual ~Camera() = default;
    // The camera's parameters flattened ("key=value;key=value").
    virtual std::string getParameters() = 0;
    virtual int setParameters(const std::string& flattened) = 0;
    virtual int unlock() = 0;
    virtual int lock() = 0;
    // Whether the camera's own process still holds it (no unlock since the last lock): a
    // recorder cannot record from such a camera. False where the platform cannot tell; its
    // recorder then judges for itself.
    virtual bool locked() { return false; }
};

class CameraPort {
public:
    virtual ~CameraPort() = default;
    // Camera::connect(id, package, uid, pid): null when the camera cannot be had.
    virtual std::shared_ptr<Camera> connect(int camera_id, const std::string& package, int uid,
                                            int pid) = 0;
};

class MediaRecorder {
public:
    virtual ~MediaRecorder() = default;
    // Hands over the camera (its remote interface and recording proxy). 0 on success.
    virtual int setCamera(Camera& camera) = 0;
    virtual int setVideoSource(int source) = 0;
    virtual int setOutputFormat(int format) = 0;
    virtual int setVideoEncoder(int encoder) = 0;
    virtual int setVideoSize(int width, int height) = 0;
    virtual int setVideoFrameRate(int fps) = 0;
    virtual int setParameters(const std::string& params) = 0;
    virtual int prepare() = 0;
    virtual int start() = 0;
    virtual int stop() = 0;
    virtual int release() = 0;
};

class MediaRecorderPort {
public:
    virtual ~MediaRecorderPort() = default;
    // MediaRecorder(String16(package)): null when it cannot be created.
    virtual std::shared_ptr<MediaRecorder> create(const std::string& package) = 0;
    // Asks the recorder that is recording for a key frame as soon as it can, so that a viewer
    // who just joined need not wait for the next one. False where the platform's recorder
    // cannot be asked (the television's keeps its own interval).
    virtual bool RequestKeyFrame() { return false; }
};

class TvManagerClient {
public:
    virtual ~TvManagerClient() = default;
    virtual int getCurrentMainInputSource() = 0;
    virtual void disconnect() = 0;
};

class TvManagerPort {
public:
    virtual ~TvManagerPort() = default;
    virtual std::shared_ptr<TvManagerClient> connect() = 0;
};

// The PX flavour's audio-output library (PX_AOUT_*). Each call returns 0 on success.
class PxAudioOutPort {
public:
    virtual ~PxAudioOutPort() = default;
    virtual int Init(unsigned short first_field) = 0;
    virtual int GetHandle(int path, int* handle) = 0;
    virtual int Open(int path, int param, int* handle) = 0;
    virtual int SetAttr(int handle, int attr, int* value) = 0;
    virtual int Close(int handle) = 0;
    virtual int DeInit() = 0;
};

}  // namespace platform
