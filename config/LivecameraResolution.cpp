#include "config/LivecameraResolution.h"

#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <memory>

#include "base/OrvexLog.h"
#include "config/DumpSwitches.h"
#include "config/Settings.h"
#include "config/livepipmanager.h"
#include "platform/Ports.h"
#include "sync/TLock.h"

namespace {

constexpr const char* kTag = "orvex:::livecamera";
constexpr const char* kVersion = "1.6.1.android";

CaptureState g_state;
TLock g_size_lock;
unsigned g_locked_width ORVEX_GUARDED_BY(g_size_lock) = 0;
unsigned g_locked_height ORVEX_GUARDED_BY(g_size_lock) = 0;

}  // namespace

CaptureState& capture_state() { return g_state; }

void get_platform_info() {
    snprintf(g_state.board, sizeof g_state.board, "%s",
             config::Reread(config::Property::kBoard).text.c_str());
    OrvexLog(kTag, "******the platform is %s******", g_state.board);
}

void get_video_resolution(unsigned* width, unsigned* height) {
    OrvexLog(kTag, "get_video_resolution");
    TLock::Scoped hold(g_size_lock);
    if (width != nullptr) *width = g_locked_width;
    if (height != nullptr) *height = g_locked_height;
}

int set_video_resolution_support_more(unsigned width, unsigned height, unsigned cameraId,
                                      unsigned travelingMode, unsigned subInputType,
                                      unsigned dumpVideo, unsigned dumpAudio, unsigned followMain,
                                      unsigned frameRate) {
    OrvexLog(kTag, "**********Orvex version::%s.**********", kVersion);
    get_platform_info();
    // The television's debug switches are set while it runs: read at each capture choice.
    g_state.log_switch = config::Reread(config::Property::kLog).number != 0;
    g_state.dump_to_sd = config::Reread(config::Property::kDumpToSd).number != 0;
    g_state.camera_id = cameraId;
    g_state.traveling_mode = travelingMode;
    if (dumpVideo == 1) set_write_file_video();
    if (dumpAudio == 1) {
        set_write_pcm_file();
        set_write_aac_file();
    }
    {
        TLock::Scoped hold(g_size_lock);
        g_locked_width = width;
        g_locked_height = height;
    }
    g_state.width = width;
    g_state.height = height;
    g_state.sub_input_type = subInputType;
    g_follow_main_flag.store(followMain, std::memory_order_relaxed);
    g_state.frame_rate = frameRate;

    if (g_state.flavour.Get() != kFlavourSa) return 0;
    if (openPipManager() != 0) return 0;
    OrvexLog(kTag, "[PipListener]mPipManager_client->openPipManager2 ");
    g_pip_stop_flag.store(0, std::memory_order_relaxed);
    std::shared_ptr<platform::PipManagerClient> client = PipManagerClientHeld();
    int result = client ? client->setListener(std::make_shared<PipListener>()) : -1;
    if (result != 0) OrvexLog(kTag, "[PipListener]mPipManager_client->setListener failed");
    return result;
}

namespace {

// The camera driver's own size numbers, not in size order.
constexpr struct {
    unsigned width, height;
    int code;
} kSizes[] = {
    {640, 480, 3}, {720, 576, 0}, {320, 240, 1},  {480, 320, 5},  {1280, 720, 12},
    {720, 480, 2}, {720, 400, 9}, {320, 176, 11}, {640, 368, 10}, {1920, 1080, 13},
};

}  // namespace

int ResolutionCode(unsigned width, unsigned height, const char* board) {
    for (const auto& s : kSizes) {
        if (s.width != width || s.height != height) continue;
        if (s.code == 13 && board != nullptr && strncmp(board, "tarvo", 5) == 0) return -1;
        return s.code;
    }
    return -1;
}

std::string AcceptedSizesText(const char* board) {
    std::string text;
    for (const auto& s : kSizes) {
        if (ResolutionCode(s.width, s.height, board) < 0) continue;
        if (!text.empty()) text += ", ";
        text += std::to_string(s.width) + "x" + std::to_string(s.height);
    }
    return text;
}

int CheckCaptureResolution() {
    int code = ResolutionCode(g_state.width, g_state.height, g_state.board);
    if (code >= 0) return code;
    if (g_state.width == 1920 && g_state.height == 1080) {
        OrvexLog(kTag, "\n orvex not support resolution width=%d,height=%d on chip of %s,\n",
                 static_cast<int>(g_state.width), static_cast<int>(g_state.height), g_state.board);
    } else {
        OrvexLog(kTag, "\n orvex not support resolution width=%d,height=%d,\n",
                 static_cast<int>(g_state.width), static_cast<int>(g_state.height));
    }
    return -1;
}
