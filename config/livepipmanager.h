#pragma once

#include <atomic>
#include <memory>

#include "platform/PipManagerPort.h"

// Client side of the television's picture-in-picture manager.
// Thread contract: openPipManager, closePipManager and PipManagerClientHeld are called by the
// service's threads (the RTSP listener's capture start and stop); PipListener::eventCallback
// runs on a platform thread and only stores the two flags below.

// 1 asks the RTSP listener loop to stop the capture; cleared when the listener is registered.
extern std::atomic<unsigned> g_pip_stop_flag;
// 1 when the capture follows the main picture (the request's specialcase=followmain); a fast
// quit clears it.
extern std::atomic<unsigned> g_follow_main_flag;

// Connects anew; 0 when that gave a client, -1 (and no client held) when it did not.
int openPipManager();
// Disconnects and drops the held client, if any.
void closePipManager();
// The client held since the last successful openPipManager, or null.
std::shared_ptr<platform::PipManagerClient> PipManagerClientHeld();

class PipListener : public platform::PipManagerListener {
public:
    void notify(int msg, int ext1, int ext2) override;
    void eventCallback(int event_type) override;
};
