#include "capture/Livecamera.h"

#include <cstdio>
#include <memory>

#include "base/OrvexLog.h"
#include "capture/CameraParameters.h"
#include "config/DumpSwitches.h"
#include "config/GlobalConfig.h"
#include "config/LivecameraResolution.h"
#include "config/livepipmanager.h"
#include "platform/Ports.h"

namespace {

constexpr const char* kTag = "orvex:::livecamera";
// The camera driver accepts traveling parameters only with this value present.
constexpr const char* kTravelingMagic = "qtkvr27c04";
constexpr int kPxAudioPath = 4;
constexpr int kPxAttrCaptureSource = 5;

std::shared_ptr<platform::Camera> g_camera;
std::shared_ptr<platform::MediaRecorder> g_recorder;
std::shared_ptr<platform::AudioManagerClient> g_audio_manager;
int g_audio_out_handle = -1;

// A start failure: logged, and the start ends with 1.
int Fail(const char* text) {
    OrvexLog(kTag, "%s", text);
    return 1;
}

// Whose sound the capture carries: 0 the main picture, 1 the sub window.
void SelectAudioCaptureSource(int source) {
    if (capture_state().flavour.Get() == kFlavourPx) {
        platform::PxAudioOut().SetAttr(g_audio_out_handle, kPxAttrCaptureSource, &source);
        return;
    }
    if (openAudioManager() == 0) {
        g_audio_manager->setAudioCaptureSource(0, source);
        closeAudioManager();
    }
}

int OpenPxAudioOut() {
    if (platform::PxAudioOut().Init(8) != 0) return Fail("[ERROR]Aout init fail in orvex.");
    if (platform::PxAudioOut().GetHandle(kPxAudioPath, &g_audio_out_handle) != 0 ||
        g_audio_out_handle == -1) {
        if (platform::PxAudioOut().Open(kPxAudioPath, 0, &g_audio_out_handle) != 0) {
            return Fail("[ERROR] failed to PX_AOUT_Open(...) in orvex");
        }
    }
    return 0;
}

// The traveling keys of the HD capture paths (camera id 5 and above).
int SetTravelingParameters(CameraParameters& params, const CaptureState& s) {
    params.set(platform::kKeyTravelingMode, static_cast<int>(s.traveling_mode));
    params.set(platform::kKeyTravelingFramerate, static_cast<int>(s.frame_rate));
    params.set(platform::kKeyTravelingMagicKey, kTravelingMagic);
    int main_source = 0;  // not read on "px"
    PlatformFlavour flavour = capture_state().flavour.Get();
    if (flavour == kFlavourSa) {
        OrvexLog(kTag, "openTvManager");
        std::shared_ptr<platform::TvManagerClient> tv = platform::TvManager().connect();
        if (!tv) return Fail("can't connect tv manager");
        main_source = tv->getCurrentMainInputSource();
        OrvexLog(kTag, "closeTvManager");
        tv->disconnect();
    } else if (flavour != kFlavourPx) {
        OrvexLog(kTag, "get property kelvo.build.kelvotv failed[%d].\n", static_cast<int>(flavour));
        return 1;
    }
    if (s.traveling_mode != 4) {
        SelectAudioCaptureSource(0);
        return 0;
    }
    params.set(platform::kKeyMainInputSource, main_source);
    params.set(platform::kKeySubInputSource, static_cast<int>(s.sub_input_type));
    Global_Config::instance()->set_sub_stat(true);
    SelectAudioCaptureSource(1);
    return 0;
}

int StartRecorder(const CaptureState& s, unsigned bitrate) {
    g_recorder = platform::MediaRecorders().create("orvex");
    if (!g_recorder) return Fail("Create mediacorder object error");
    if (g_recorder->setCamera(*g_camera) != 0) return Fail("orvex mediacorder setCamera error");
    if (g_recorder->setVideoSource(1) != 0) return Fail("orvex mediacorder setVideoSource error");
    // 101: the platform's private format that hands encoded frames to the service.
    if (g_recorder->setOutputFormat(101) != 0)
        return Fail("orvex mediacorder setOutputFormat error");
    if (g_recorder->setVideoEncoder(2) != 0) return Fail("orvex mediacorder setVideoEncoder error");
    g_recorder->setVideoSize(static_cast<int>(s.width), static_cast<int>(s.height));
    g_recorder->setVideoFrameRate(static_cast<int>(s.frame_rate));
    unsigned id = s.camera_id;
    bool named = id == 3 || id == 5 || id == 6 || id == 7;
    g_recorder->setParameters(named ? "video-param-camera-id=" + std::to_string(id)
                                    : std::string());
    OrvexLog(kTag, "******videobitrate is %d******", static_cast<int>(bitrate));
    char text[100];
    snprintf(text, sizeof text, "video-param-encoding-bitrate=%u", bitrate);
    g_recorder->setParameters(text);
    int ret = g_recorder->prepare();
    if (ret != 0) {
        OrvexLog(kTag, "orvex mediacorder prepare error ret = %d ", ret);
        return 1;
    }
    if (g_recorder->start() != 0) return Fail("orvex mediacorder  start error");
    return 0;
}

}  // namespace

int openAudioManager() {
    OrvexLog(kTag, "openAudioManager");
    if (g_audio_manager) return 0;
    g_audio_manager = platform::AudioManager().connect();
    if (!g_audio_manager) {
        OrvexLog(kTag, "can't connect audio manager");
        return -1;
    }
    return 0;
}

void closeAudioManager() {
    if (!g_audio_manager) return;
    g_audio_manager->disconnect();
    g_audio_manager.reset();
}

int Start_Video_Capture() {
    const CaptureState& s = capture_state();
    OrvexLog(kTag, "Start_Video_Capture--->Cameraid = %d \n", static_cast<int>(s.camera_id));
    OrvexLog(kTag, "Start_Video_Capture--->travelingMode = %d \n",
             static_cast<int>(s.traveling_mode));
    OrvexLog(kTag, "Start_Video_Capture--->subinputtype = %d \n",
             static_cast<int>(s.sub_input_type));
    OrvexLog(kTag, "Start_Video_Capture--->g_video_fps = %d \n", static_cast<int>(s.frame_rate));
    const unsigned bitrate = s.camera_id > 4 ? 2048000 : 1024000;

    g_camera.reset();
    g_camera = platform::Cameras().connect(static_cast<int>(s.camera_id), "", -1, -1);
    if (!g_camera) {
        OrvexDebugPrint("orvex Camera::connect() fail ");
        OrvexLogPriority(platform::kLogDebug, kTag, "orvex Camera::connect() fail \n");
        return 1;
    }
    if (capture_state().flavour.Get() == kFlavourPx && OpenPxAudioOut() != 0) return 1;

    CameraParameters params(g_camera->getParameters());
    int code = CheckCaptureResolution();
    if (code < 0) return 1;
    params.set(platform::kKeyTravelingRes, code);
    if (s.camera_id >= 5) {
        if (SetTravelingParameters(params, s) != 0) return 1;
    } else if (s.camera_id == 3) {
        params.set(platform::kKeyTravelingMode, static_cast<int>(s.traveling_mode));
        SelectAudioCaptureSource(0);
    }
    g_camera->setParameters(params.flatten());
    g_camera->unlock();

    if (StartRecorder(s, bitrate) != 0) return 1;
    OrvexLog(kTag, "Start_Video_Capture end");
    return 0;
}

void Close_Video_Capture() {
    OrvexLog(kTag, "Close_Video_Capture begin");
    if (g_recorder) {
        OrvexLog(kTag, "Close_Video_Capture begin--1");
        g_recorder->stop();
        OrvexLog(kTag, "Close_Video_Capture begin--2");
        g_recorder->release();
        OrvexLog(kTag, "Close_Video_Capture begin--3");
        g_recorder.reset();
    }
    OrvexLog(kTag, "Close_Video_Capture begin--4");
    if (g_camera) {
        OrvexLog(kTag, "Close_Video_Capture begin--5");
        g_camera->lock();
        OrvexLog(kTag, "Close_Video_Capture begin--6");
        OrvexLog(kTag, "Close_Video_Capture begin--7");
        g_camera.reset();
        OrvexLog(kTag, "Close_Video_Capture begin--8");
    }
    OrvexLog(kTag, "Close_Video_Capture begin--9");
    OrvexLog(kTag, "Close_Video_Capture begin--10");
    PlatformFlavour flavour = capture_state().flavour.Get();
    if (flavour == kFlavourPx) {
        // The spelling with two blanks is the one operators search for.
        if (platform::PxAudioOut().Close(g_audio_out_handle) != 0) {
            OrvexLog(kTag, "[ERROR] failed to PX_AOUT_Close  in orvex!");
        }
        if (platform::PxAudioOut().DeInit() != 0)
            OrvexLog(kTag, "[ERROR]Aout deinit fail in orvex.");
        g_audio_out_handle = -1;
    } else if (flavour == kFlavourSa) {
        closePipManager();
    }
    reset_write_file_video();
    OrvexLog(kTag, "reset_video_parameter");
}
