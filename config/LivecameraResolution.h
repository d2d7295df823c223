#pragma once

#include <atomic>
#include <string>

#include "config/PlatformFlavour.h"

// The capture parameters a client chose, the platform facts they are checked against, and the
// table of capture sizes the television's camera accepts.
// Thread contract: written by set_video_resolution_support_more and read by the capture start,
// both on the RTSP listener's thread; get_video_resolution may be called from any thread.

struct CaptureState {
    unsigned width = 0;
    unsigned height = 0;
    unsigned camera_id = 0;       // 3 SD input, 5/6/7 the HD capture paths, 0 none
    unsigned traveling_mode = 0;  // 0 default, 1/2 whole screen with/without OSD, 4 sub, 6 main
    unsigned sub_input_type = 0;
    unsigned frame_rate = 0;
    // Read by the dump writers on the binder and audio threads.
    std::atomic<bool> log_switch{false};  // "kv.orvex.log"
    std::atomic<bool> dump_to_sd{false};  // "kv.orvex.dumptosd"
    char board[256] = "android";          // "ro.board.platform"
    PlatformFlavourCache flavour;         // shared with the capture control
};

CaptureState& capture_state();

// Stores a client's capture parameters, reads the debug switches and, on the "sa" flavour,
// registers the PIP listener. 0, or the registration's non-zero result.
int set_video_resolution_support_more(unsigned width, unsigned height, unsigned cameraId,
                                      unsigned travelingMode, unsigned subInputType,
                                      unsigned dumpVideo, unsigned dumpAudio, unsigned followMain,
                                      unsigned frameRate);
void get_video_resolution(unsigned* width, unsigned* height);
void get_platform_info();

// The camera's code ("traveling-res") for a capture size, or -1 when the size is refused;
// 1920x1080 is refused on boards whose name starts with "tarvo".
int ResolutionCode(unsigned width, unsigned height, const char* board);
// The sizes ResolutionCode accepts on `board`, as "640x480, 720x576, ...".
std::string AcceptedSizesText(const char* board);
// ResolutionCode of the stored size and board, logging the refusal.
int CheckCaptureResolution();
